#include "linux/cli/Interruption.h"

#include <unistd.h>

#include <array>
#include <atomic>
#include <climits>
#include <csignal>
#include <cstring>

namespace skein::cli {
namespace {

// What the handler reads: it may run at any moment, and may not allocate.
std::array<char, PATH_MAX> temporaryFolder;
std::array<char, PATH_MAX> temporaryFile;
std::atomic<bool> isThere{false};
static_assert(std::atomic<bool>::is_always_lock_free);

void interrupted(int signal) {
  if (isThere) {
    unlink(temporaryFile.data());
    rmdir(temporaryFolder.data());
  }
  _exit(128 + signal);
}

void copy(std::array<char, PATH_MAX>& to, const std::string& from) {
  to.fill('\0');
  std::memcpy(to.data(), from.data(), std::min(from.size(), to.size() - 1));
}

}  // namespace

void installInterruption() {
  for (const int signal : {SIGINT, SIGTERM, SIGHUP}) std::signal(signal, interrupted);
}

void rememberTemporaryFile(const std::string& folder, const std::string& file) {
  copy(temporaryFolder, folder);
  copy(temporaryFile, file);
  isThere = true;
}

void forgetTemporaryFile() { isThere = false; }

}  // namespace skein::cli
