#include "linux/vald/files/FileCoordinator.h"

#include <fcntl.h>
#include <sys/file.h>

#include <algorithm>
#include <cerrno>
#include <fstream>
#include <thread>
#include <utility>

#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"
#include "linux/vald/files/LockHolder.h"

namespace skein::vald {
namespace {

bool overlap(const std::string& a, const std::string& b) {
  return isAtOrBelow(a, b) || isAtOrBelow(b, a);
}

std::string wordsForHolder(const struct stat& file) {
  const pid_t holder = lockHolderOf(file);
  if (holder == 0) return "another program";
  std::string name;
  std::ifstream("/proc/" + std::to_string(holder) + "/comm") >> name;
  const std::string number = "process " + std::to_string(holder);
  return name.empty() ? number : "\"" + printable(name) + "\" (" + number + ")";
}

// 0, or EWOULDBLOCK when somebody else has it. What cannot be locked counts as locked.
int tryLock(int file) {
  if (::flock(file, LOCK_EX | LOCK_NB) != 0 && errno == EWOULDBLOCK) return EWOULDBLOCK;
  struct flock range {};
  range.l_type = F_RDLCK;
  range.l_whence = SEEK_SET;
  if (::fcntl(file, F_OFD_SETLK, &range) != 0 && (errno == EAGAIN || errno == EACCES)) {
    ::flock(file, LOCK_UN);
    return EWOULDBLOCK;
  }
  return 0;
}

}  // namespace

FileCoordinator::Claim::Claim(Claim&& other) noexcept
    : _coordinator(std::exchange(other._coordinator, nullptr)), _ticket(other._ticket) {}

FileCoordinator::Claim& FileCoordinator::Claim::operator=(Claim&& other) noexcept {
  if (this != &other) {
    release();
    _coordinator = std::exchange(other._coordinator, nullptr);
    _ticket = other._ticket;
  }
  return *this;
}

void FileCoordinator::Claim::release() {
  FileCoordinator* coordinator = std::exchange(_coordinator, nullptr);
  if (coordinator == nullptr) return;
  MutexLock lock(coordinator->_mutex);
  coordinator->_claims.erase(_ticket);
  coordinator->_released.notifyAll();
}

const std::string* FileCoordinator::blocker(std::uint64_t ticket) const {
  const std::vector<std::string>& own = _claims.at(ticket);
  for (const auto& [other, paths] : _claims) {
    if (other >= ticket) break;
    for (const std::string& path : paths) {
      if (std::any_of(own.begin(), own.end(),
                      [&](const auto& mine) { return overlap(mine, path); }))
        return &path;
    }
  }
  return nullptr;
}

NSErrorPtr FileCoordinator::claim(std::vector<std::string> paths,
                                  std::chrono::steady_clock::time_point deadline, Claim& claim) {
  MutexLock lock(_mutex);
  const std::uint64_t ticket = ++_lastTicket;
  _claims.emplace(ticket, std::move(paths));
  bool inTime = true;
  const std::string* inUse = blocker(ticket);
  while (inUse != nullptr && inTime) {
    inTime = _released.waitUntil(_mutex, deadline);
    inUse = blocker(ticket);
  }
  if (inUse != nullptr) {
    NSErrorPtr error = fileErrorWithWords(
        NSFileLockingError, EBUSY,
        "another operation is still using \"" + printable(*inUse) + "\"; try again", *inUse);
    _claims.erase(ticket);
    _released.notifyAll();
    return error;
  }
  lock.unlock();
  Claim granted;
  granted._coordinator = this;
  granted._ticket = ticket;
  claim = std::move(granted);
  return nullptr;
}

NSErrorPtr DocumentLock::acquire(const DirectoryHandle& folder, const std::string& name,
                                 const std::string& path,
                                 std::chrono::steady_clock::time_point deadline) {
  struct stat status {};
  if (folder.status(name, status) != 0) return nullptr;
  if (!S_ISREG(status.st_mode) && !S_ISDIR(status.st_mode)) return nullptr;
  std::chrono::milliseconds pause{1};
  while (true) {
    FileDescriptor file;
    const int opened = folder.openFile(name, file);
    // EWOULDBLOCK: somebody has a lease on it and was just told to give it up.
    if (opened != 0 && opened != EWOULDBLOCK) return nullptr;
    if (opened == 0 && tryLock(file.get()) == 0) {
      _file = std::move(file);
      return nullptr;
    }
    const auto now = std::chrono::steady_clock::now();
    if (now >= deadline) break;
    std::this_thread::sleep_for(std::min<std::chrono::nanoseconds>(pause, deadline - now));
    pause = std::min(pause * 2, std::chrono::milliseconds(50));
  }
  return fileErrorWithWords(NSFileLockingError, EWOULDBLOCK,
                            "\"" + printable(path) + "\" is locked by " + wordsForHolder(status) +
                                "; close it there and try again",
                            path);
}

}  // namespace skein::vald
