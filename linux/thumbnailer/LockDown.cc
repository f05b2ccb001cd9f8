#include "linux/thumbnailer/LockDown.h"

#include <sched.h>
#include <sys/prctl.h>
#include <sys/resource.h>

#include <cerrno>
#include <chrono>
#include <cstring>
#include <filesystem>
#include <system_error>
#include <thread>

#include "linux/rendering/RenderMessages.h"
#include "linux/thumbnailer/FileConfinement.h"
#include "linux/thumbnailer/SystemCallFilter.h"

namespace skein::thumbnailer {
namespace {

// Pango starts two for each font that it looks for, and they end at once.
constexpr rlim_t kThreads = 64;

// Its socket, standard streams, and what comes with a request or two.
constexpr rlim_t kDescriptors = 16;

[[maybe_unused]] constexpr std::chrono::seconds kPatienceWithThreads{2};

struct Limit {
  __rlimit_resource resource;
  rlim_t value;
  const char* name;
};
// vald sets a shorter limit of time for each document.
constexpr Limit kLimits[] = {
    {RLIMIT_CPU, kWorkerSeconds, "processor time"},
    {RLIMIT_NOFILE, kDescriptors, "open files"},
    {RLIMIT_FSIZE, kMostPictureBytes, "file sizes"},
    {RLIMIT_CORE, 0, "core dumps"},
#ifndef SKEIN_SANITIZED
    {RLIMIT_AS, kAddressSpace, "memory"},
#endif
};

std::string failure(const char* what, int code) {
  return std::string("can't limit ") + what + ": " + std::strerror(code);
}

// Files are confined thread by thread. Pango's threads, which looked for fonts, end by
// themselves.
bool becomesOnlyThread() {
#ifdef SKEIN_SANITIZED
  return true;  // a sanitizer has a thread of its own, which opens nothing
#else
  const auto deadline = std::chrono::steady_clock::now() + kPatienceWithThreads;
  for (;;) {
    std::error_code failure;
    std::filesystem::directory_iterator thread("/proc/self/task", failure);
    if (!failure && ++thread == std::filesystem::directory_iterator()) return true;
    if (failure || std::chrono::steady_clock::now() > deadline) return false;
    std::this_thread::yield();
  }
#endif
}

// Threads are counted by user, and the user has others: in a name space of users of its own
// the process counts for itself. Where the system lets nobody make one, the limits of memory
// and time have to do.
void limitThreads() {
  const rlimit value{kThreads, kThreads};
  if (unshare(CLONE_NEWUSER) == 0) setrlimit(RLIMIT_NPROC, &value);
}

std::string limitResources() {
  for (const Limit& limit : kLimits) {
    const rlimit value{limit.value, limit.value};
    if (setrlimit(limit.resource, &value) != 0) return failure(limit.name, errno);
  }
  return {};
}

}  // namespace

LockDown lockDown(const std::vector<std::string>& fontFolders) {
  LockDown outcome;
  if (!becomesOnlyThread()) return {failure("threads", EBUSY)};
  limitThreads();
  outcome.problem = limitResources();
  if (!outcome.problem.empty()) return outcome;
  if (prctl(PR_SET_DUMPABLE, 0, 0, 0, 0) != 0) return {failure("debuggers", errno)};
  if (prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0) return {failure("privileges", errno)};
  outcome.hasFonts = !fontFolders.empty() && confineFilesTo(fontFolders);
  if (const int code = filterSystemCalls(outcome.hasFonts)) return {failure("system calls", code)};
  return outcome;
}

}  // namespace skein::thumbnailer
