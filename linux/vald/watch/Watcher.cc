#include "linux/vald/watch/Watcher.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <sys/inotify.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstring>
#include <fstream>

namespace skein::vald {
namespace {

constexpr std::uint32_t kEvents = IN_CREATE | IN_DELETE | IN_MOVED_FROM | IN_MOVED_TO |
                                  IN_CLOSE_WRITE | IN_MODIFY | IN_ATTRIB | IN_DELETE_SELF |
                                  IN_MOVE_SELF | IN_ONLYDIR | IN_EXCL_UNLINK;

// Beyond this, reading the folder is cheaper than asking name by name.
constexpr std::size_t kMostNames = 2000;
constexpr int kPause = 10;  // ms

// Half of what the system gives this user: other programs watch, too.
std::uint64_t systemBudget() {
  std::uint64_t most = 8192;
  std::ifstream("/proc/sys/fs/inotify/max_user_watches") >> most;
  return most / 2;
}

}  // namespace

Watcher::Watcher(std::uint64_t budget, std::function<void()> wake)
    : _wake(std::move(wake)),
      _budget(budget != 0 ? budget : systemBudget()),
      _inotify(inotify_init1(IN_NONBLOCK | IN_CLOEXEC)),
      _stop(eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC)) {
  if (!_inotify) {
    MutexLock lock(_mutex);
    _shortage = std::string("the system gave no inotify instance (") + std::strerror(errno) +
                "); raise fs.inotify.max_user_instances";
  }
  _thread = std::thread([this] { run(); });
}

Watcher::~Watcher() {
  const std::uint64_t one = 1;
  if (::write(_stop.get(), &one, sizeof one) < 0) {
    // Full means that it is set already.
  }
  _thread.join();
}

bool Watcher::watch(FolderKey folder, int descriptor) {
  MutexLock lock(_mutex);
  if (!_inotify) return false;
  if (_watchByFolder.contains(folder)) return true;
  if (_watchByFolder.size() >= _budget) {
    _shortage = "the budget of " + std::to_string(_budget) +
                " watches is spent; other folders are looked at in turn (raise "
                "fs.inotify.max_user_watches to watch them all)";
    return false;
  }
  // The descriptor's own name: the way to it may have changed since it was opened.
  const std::string path = "/proc/self/fd/" + std::to_string(descriptor);
  const int watch = inotify_add_watch(_inotify.get(), path.c_str(), kEvents);
  if (watch < 0) {
    _shortage = errno == ENOSPC
                    ? "the system's limit of watches is reached; raise fs.inotify.max_user_watches"
                    : std::string("a folder could not be watched: ") + std::strerror(errno);
    return false;
  }
  const auto other = _folderByWatch.find(watch);
  if (other != _folderByWatch.end()) _watchByFolder.erase(other->second);
  _folderByWatch[watch] = folder;
  _watchByFolder[folder] = watch;
  return true;
}

void Watcher::unwatch(FolderKey folder) {
  MutexLock lock(_mutex);
  const auto found = _watchByFolder.find(folder);
  if (found == _watchByFolder.end()) return;
  inotify_rm_watch(_inotify.get(), found->second);
  _folderByWatch.erase(found->second);
  _watchByFolder.erase(found);
}

void Watcher::clear() {
  MutexLock lock(_mutex);
  for (const auto& [watch, folder] : _folderByWatch) inotify_rm_watch(_inotify.get(), watch);
  _folderByWatch.clear();
  _watchByFolder.clear();
}

bool Watcher::isWatched(FolderKey folder) const {
  MutexLock lock(_mutex);
  return _watchByFolder.contains(folder);
}

std::optional<FolderKey> Watcher::victim(const std::function<bool(FolderKey)>& mayLose) const {
  std::vector<FolderKey> watched;
  {
    MutexLock lock(_mutex);
    for (const auto& [folder, watch] : _watchByFolder) watched.push_back(folder);
  }
  const auto found = std::find_if(watched.begin(), watched.end(), mayLose);
  if (found == watched.end()) return std::nullopt;
  return *found;
}

std::uint64_t Watcher::count() const {
  MutexLock lock(_mutex);
  return _watchByFolder.size();
}

std::string Watcher::shortage() const {
  MutexLock lock(_mutex);
  return _shortage;
}

std::optional<std::chrono::steady_clock::time_point> Watcher::dirtySince() const {
  MutexLock lock(_mutex);
  return _dirtySince;
}

DirtySet Watcher::take() {
  MutexLock lock(_mutex);
  _dirtySince.reset();
  return std::exchange(_dirty, {});
}

void Watcher::drain() {
  MutexLock lock(_mutex);
  drainLocked();
}

bool Watcher::isDirty(FolderKey folder) const {
  MutexLock lock(_mutex);
  return _dirty.overflow || _dirty.folders.contains(folder);
}

void Watcher::loseEvents(bool on) {
  {
    MutexLock lock(_mutex);
    drainLocked();
    _losing = on;
    if (!on) note(-1, IN_Q_OVERFLOW, nullptr);
  }
  _wake();
}

void Watcher::run() {
  for (;;) {
    pollfd descriptors[] = {{_stop.get(), POLLIN, 0}, {_inotify.get(), POLLIN, 0}};
    ::poll(descriptors, 2, -1);
    if (descriptors[0].revents != 0) return;
    bool wake = false;
    {
      MutexLock lock(_mutex);
      wake = drainLocked();
    }
    if (wake) _wake();
    // What follows at once is read together: the writer waits a while for it anyway.
    ::poll(descriptors, 1, kPause);
  }
}

// Whether there is now something to take that there was not before.
bool Watcher::drainLocked() {
  const bool was = _dirtySince.has_value();
  alignas(inotify_event) char buffer[64 * 1024];
  for (;;) {
    const ssize_t count = ::read(_inotify.get(), buffer, sizeof buffer);
    if (count <= 0) break;
    for (ssize_t at = 0; at < count;) {
      const auto* event = reinterpret_cast<const inotify_event*>(buffer + at);
      at += static_cast<ssize_t>(sizeof(inotify_event)) + event->len;
      if (!_losing) note(event->wd, event->mask, event->len > 0 ? event->name : nullptr);
    }
  }
  return !was && _dirtySince.has_value();
}

void Watcher::note(int watch, std::uint32_t mask, const char* name) {
  if ((mask & IN_Q_OVERFLOW) != 0) {
    ++_overflows;
    _dirty.overflow = true;
  } else {
    const auto found = _folderByWatch.find(watch);
    if (found == _folderByWatch.end()) return;
    const FolderKey folder = found->second;
    if ((mask & IN_IGNORED) != 0) {
      _watchByFolder.erase(folder);
      _folderByWatch.erase(found);
      return;
    }
    if ((mask & (IN_DELETE_SELF | IN_MOVE_SELF | IN_UNMOUNT)) != 0) {
      // Of a folder below a root its parent tells.
      _dirty.rootMoved = true;
    } else if (name != nullptr) {
      DirtyFolder& dirty = _dirty.folders[folder];
      if (!dirty.whole) dirty.names.emplace(name);
      if (dirty.names.size() > kMostNames) {
        dirty.whole = true;
        dirty.names.clear();
      }
    } else {
      _dirty.folders[folder];  // its own attributes
    }
  }
  if (!_dirtySince) _dirtySince = std::chrono::steady_clock::now();
}

}  // namespace skein::vald
