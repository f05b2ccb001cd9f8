#include "linux/cli/Interruption.h"

#include <unistd.h>

#include <algorithm>
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
std::atomic<bool> lineIsOpen{false};
static_assert(std::atomic<bool>::is_always_lock_free);

void interrupted(int signal) {
  if (isThere) {
    unlink(temporaryFile.data());
    rmdir(temporaryFolder.data());
  }
  if (lineIsOpen) [[maybe_unused]]
    const ssize_t written = write(STDERR_FILENO, "\n", 1);
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

void setLineIsOpen(bool isOpen) { lineIsOpen = isOpen; }

void rememberTemporaryFile(const std::string& folder, const std::string& file) {
  copy(temporaryFolder, folder);
  copy(temporaryFile, file);
  isThere = true;
}

void forgetTemporaryFile() { isThere = false; }

}  // namespace skein::cli
