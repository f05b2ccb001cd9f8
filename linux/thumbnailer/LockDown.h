#pragma once

#include <string>
#include <vector>

namespace skein::thumbnailer {

struct LockDown {
  std::string problem;    // empty, or what could not be done: then nothing may be decoded
  bool hasFonts = false;  // fonts can still be opened; only where the kernel has Landlock
};

// Takes from this process, for good, what decoding does not need: a time of the processor
// and memory without end, more descriptors, core dumps, new privileges, debuggers, all files
// but those below `fontFolders`, and all system calls but a few. Before it has more threads
// than this one.
LockDown lockDown(const std::vector<std::string>& fontFolders);

// What a worker's address space may grow to. Sanitizers reserve far more than that for
// themselves; builds with them limit each allocation instead (see main.cc).
inline constexpr unsigned long kAddressSpace = 1UL << 30;

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
#define SKEIN_SANITIZED 1
#elif defined(__has_feature)
#if __has_feature(address_sanitizer) || __has_feature(thread_sanitizer)
#define SKEIN_SANITIZED 1
#endif
#endif

}  // namespace skein::thumbnailer
