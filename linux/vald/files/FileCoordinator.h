#pragma once

#include <chrono>
#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include "base/Mutex.h"
#include "linux/protocol/FileDescriptor.h"
#include "linux/vald/files/DirectoryHandle.h"
#include "platform/foundation/NSError.h"

namespace skein::vald {

// Lets operations on overlapping paths follow each other: a path in use keeps everything
// at it, above it and below it from others, in the order in which they asked. Any thread.
class FileCoordinator {
 public:
  // Gives the paths back when it goes. Must not outlive the coordinator.
  class Claim {
   public:
    Claim() = default;
    Claim(Claim&& other) noexcept;
    Claim& operator=(Claim&& other) noexcept;
    ~Claim() { release(); }
    void release();

   private:
    friend class FileCoordinator;
    FileCoordinator* _coordinator = nullptr;
    std::uint64_t _ticket = 0;
  };

  // Waits until nobody who asked before uses a path that overlaps one of `paths`
  // (absolute). NSFileLockingError, naming the path, at the deadline. Ask for all paths of
  // an operation at once: a holder that asks again may wait for itself.
  NSErrorPtr claim(std::vector<std::string> paths, std::chrono::steady_clock::time_point deadline,
                   Claim& claim);

 private:
  // Nil: nobody is before `ticket`; else a path that somebody before it uses.
  const std::string* blocker(std::uint64_t ticket) const SKEIN_REQUIRES(_mutex);

  Mutex _mutex;
  CondVar _released;
  std::uint64_t _lastTicket SKEIN_GUARDED_BY(_mutex) = 0;
  // Holders and waiters, in the order of their asking.
  std::map<std::uint64_t, std::vector<std::string>> _claims SKEIN_GUARDED_BY(_mutex);
};

// An advisory lock on a document that other programs can honour, and that honours theirs:
// flock(), exclusive, and an open-file-description read lock, which keeps away whoever
// locks the file for writing with fcntl(). Goes with the object.
//
// A folder is locked by itself, not with what is in it. Links, devices, files that may not
// be opened, and file systems without locks have none: the operation goes on.
class DocumentLock {
 public:
  // Tries until the deadline. NSFileLockingError names the holder's process where the
  // system tells it, else says that another program has it.
  NSErrorPtr acquire(const DirectoryHandle& folder, const std::string& name,
                     const std::string& path, std::chrono::steady_clock::time_point deadline);

 private:
  FileDescriptor _file;
};

}  // namespace skein::vald
