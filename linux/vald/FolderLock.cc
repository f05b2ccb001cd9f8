#include "linux/vald/FolderLock.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <thread>

#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/LockHolder.h"
#include "vellum/VLErrors.h"

namespace skein::vald {
namespace {

constexpr std::chrono::milliseconds kBetweenTries{50};

bool isOwnProcess(pid_t process) {
  struct stat status {};
  return stat(("/proc/" + std::to_string(process)).c_str(), &status) == 0 &&
         status.st_uid == geteuid();
}

}  // namespace

NSErrorPtr FolderLock::take(const std::string& folder, std::chrono::milliseconds patience) {
  _folder = FileDescriptor(open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  struct stat status {};
  if (!_folder || fstat(_folder.get(), &status) != 0) {
    return fileError(errno, "can't open the folder", folder);
  }
  const auto deadline = std::chrono::steady_clock::now() + patience;
  while (flock(_folder.get(), LOCK_EX | LOCK_NB) != 0) {
    if (errno == EINTR) continue;
    if (errno != EWOULDBLOCK) return nullptr;
    const pid_t holder = lockHolderOf(status);
    if (holder != 0 && !isOwnProcess(holder)) return nullptr;
    if (std::chrono::steady_clock::now() >= deadline) {
      const std::string number = std::to_string(holder);
      return vl_errorWithPOSIXCode(
          EBUSY,
          "The folder " + printable(folder) + " is locked" +
              (holder == 0 ? "; end the vald that serves it"
                           : " by process " + number + "; end that first, with kill " + number) +
              ".");
    }
    std::this_thread::sleep_for(kBetweenTries);
  }
  return nullptr;
}

}  // namespace skein::vald
