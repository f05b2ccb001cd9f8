#include "linux/vald/ApplicationsWatcher.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <sys/inotify.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdint>
#include <filesystem>
#include <system_error>
#include <utility>

namespace skein::vald {
namespace {

namespace fs = std::filesystem;

constexpr std::uint32_t kEntries = IN_CREATE | IN_CLOSE_WRITE | IN_MOVED_FROM | IN_MOVED_TO |
                                   IN_DELETE | IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR;
// For a folder that only stands above one that is missing.
constexpr std::uint32_t kArrivals =
    IN_CREATE | IN_MOVED_TO | IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR;
constexpr int kLongestRun = 20;  // quiet times
// Desktop entries lie in a folder or just below; what is deeper or more is no such place.
constexpr std::size_t kMostFolders = 1000;
constexpr int kDeepest = 8;
constexpr std::size_t kMostEntries = 100'000;

void drain(int watches) {
  std::array<char, 16384> buffer{};
  while (read(watches, buffer.data(), buffer.size()) > 0) {
  }
}

// Whether a watch on `path` stands.
bool watch(int watches, const fs::path& path, std::uint32_t events) {
  return inotify_add_watch(watches, path.c_str(), events) >= 0;
}

void watchTree(int watches, const std::string& folder) {
  std::error_code failure;
  fs::recursive_directory_iterator entry(folder, fs::directory_options::skip_permission_denied,
                                         failure);
  std::size_t watched = 0;
  std::size_t seen = 0;
  for (; !failure && entry != fs::recursive_directory_iterator(); entry.increment(failure)) {
    if (++seen > kMostEntries || watched >= kMostFolders) return;
    if (entry.depth() >= kDeepest) entry.disable_recursion_pending();
    std::error_code unknown;
    if (!entry->is_directory(unknown)) continue;
    ++watched;
    watch(watches, entry->path(), kEntries);
  }
}

}  // namespace

ApplicationsWatcher::ApplicationsWatcher(std::vector<std::string> folders,
                                         std::chrono::milliseconds quiet,
                                         std::function<void()> onChange, Log& log)
    : _folders(std::move(folders)),
      _quiet(quiet),
      _onChange(std::move(onChange)),
      _log(log),
      _stop(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)),
      _thread([this] { run(); }) {}

ApplicationsWatcher::~ApplicationsWatcher() {
  const std::uint64_t one = 1;
  while (write(_stop.get(), &one, sizeof one) < 0 && errno == EINTR) {
  }
  _thread.join();
}

// The watches are made anew after every change: what came and went among the folders is
// thereby followed, and since the change is told after that, nothing falls in between.
void ApplicationsWatcher::run() {
  for (;;) {
    const FileDescriptor watches = watchAll();
    _onChange();
    if (!waitForChange(watches.get()) || !waitForQuiet(watches.get())) return;
  }
}

FileDescriptor ApplicationsWatcher::watchAll() {
  FileDescriptor watches(inotify_init1(IN_CLOEXEC | IN_NONBLOCK));
  int failure = errno;
  bool any = false;
  for (const std::string& folder : _folders) {
    if (!watches) break;
    if (watch(watches.get(), folder, kEntries)) {
      watchTree(watches.get(), folder);
      any = true;
      continue;
    }
    failure = errno;
    for (fs::path above = fs::path(folder).parent_path(); !above.empty();
         above = above.parent_path()) {
      if (watch(watches.get(), above, kArrivals)) {
        any = true;
        // It may have come since it was missed.
        if (watch(watches.get(), folder, kEntries)) watchTree(watches.get(), folder);
        break;
      }
      if (above == above.root_path()) break;
    }
  }
  if (!any && !_folders.empty()) {
    VL_ERROR(_log,
             "[ERROR] can't watch the installed apps, new ones show after a restart of vald: %@",
             std::generic_category().message(failure));
  }
  return watches;
}

bool ApplicationsWatcher::waitForChange(int watches) const {
  std::array<pollfd, 2> waits{{{_stop.get(), POLLIN, 0}, {watches, POLLIN, 0}}};
  while (poll(waits.data(), waits.size(), -1) < 0 && errno == EINTR) {
  }
  return (waits[0].revents & POLLIN) == 0;
}

bool ApplicationsWatcher::waitForQuiet(int watches) const {
  for (int round = 0; round < kLongestRun; ++round) {
    drain(watches);
    std::array<pollfd, 2> waits{{{_stop.get(), POLLIN, 0}, {watches, POLLIN, 0}}};
    const int ready = poll(waits.data(), waits.size(), static_cast<int>(_quiet.count()));
    if ((waits[0].revents & POLLIN) != 0) return false;
    if (ready == 0) break;
  }
  return true;
}

}  // namespace skein::vald
