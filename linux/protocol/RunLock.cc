#include "linux/protocol/RunLock.h"

#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

#include <cerrno>
#include <system_error>
#include <thread>

#include "linux/protocol/UnixSocket.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

constexpr std::chrono::milliseconds kBetweenLockTries{50};
// How long one that was told to stop may go on accepting.
constexpr std::chrono::milliseconds kLastAccepted{500};

bool somebodyAccepts(const std::string& socketPath) {
  int code = 0;
  return static_cast<bool>(connectToUnixSocket(socketPath, code));
}

}  // namespace

RunLock::Outcome RunLock::take(const std::string& path, const std::string& socketPath,
                               std::chrono::milliseconds patience, NSErrorOut error) {
  const auto failed = [&](int code) {
    error.store(vl_errorWithPOSIXCode(code, "The lock file " + path + " cannot be used: " +
                                                std::generic_category().message(code) + "."));
    return Outcome::Failed;
  };
  _file = FileDescriptor(open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600));
  if (!_file) return failed(errno);
  const auto start = std::chrono::steady_clock::now();
  while (flock(_file.get(), LOCK_EX | LOCK_NB) != 0) {
    if (errno != EWOULDBLOCK && errno != EINTR) return failed(errno);
    const auto waited = std::chrono::steady_clock::now() - start;
    if (waited >= patience || (waited >= kLastAccepted && somebodyAccepts(socketPath))) {
      return Outcome::AlreadyRunning;
    }
    std::this_thread::sleep_for(kBetweenLockTries);
  }
  writeProcessID();
  return Outcome::Taken;
}

void RunLock::writeProcessID() const {
  const std::string text = std::to_string(getpid()) + '\n';
  // For people alone: the lock is what counts, so a full disk stops nothing here.
  if (ftruncate(_file.get(), 0) != 0) return;
  [[maybe_unused]] const auto written = pwrite(_file.get(), text.data(), text.size(), 0);
}

}  // namespace skein
