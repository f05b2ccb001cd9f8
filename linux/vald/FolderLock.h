#pragma once

#include <chrono>
#include <string>

#include "linux/protocol/FileDescriptor.h"
#include "platform/foundation/NSError.h"

namespace skein::vald {

// A folder that one process alone may serve, whatever it is called and wherever its state is
// kept. The kernel lets go of it with the process.
class FolderLock {
 public:
  // Waits until `patience` is over for who holds it, which may be ending. An error names that
  // process. Null when the folder is this process's, where the file system knows no locks, and
  // where another user's process has it: whoever may read a folder can lock it, and keeps nobody
  // else out.
  NSErrorPtr take(const std::string& folder, std::chrono::milliseconds patience);

 private:
  FileDescriptor _folder;
};

}  // namespace skein::vald
