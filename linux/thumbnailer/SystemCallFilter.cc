#include "linux/thumbnailer/SystemCallFilter.h"

#include <fcntl.h>
#include <sched.h>
#include <seccomp.h>
#include <sys/mman.h>

#include <cerrno>
#include <memory>

namespace skein::thumbnailer {
namespace {

// All that decoding needs, by name, of every kind of processor: what one does not have is
// left out there. Nothing here makes a process or a descriptor, except those that
// come with a packet, or reaches another process, except through the descriptors at hand.
// fstatat() and statx() are not here: a filter cannot see whether they name a file.
constexpr const char* kAllowed[] = {
    "read",
    "write",
    "writev",
    "pread64",
    "lseek",
    "_llseek",
    "recvmsg",
    "sendmsg",
    "close",
    "munmap",
    "mremap",
    "madvise",
    "brk",
    "futex",
    "futex_time64",
    "getrandom",
    "clock_gettime",
    "clock_gettime64",
    "gettimeofday",
    "sched_yield",
    "getpid",
    "gettid",
    "rt_sigaction",
    "rt_sigprocmask",
    "rt_sigreturn",
    "sigreturn",
    "sigaltstack",
    "restart_syscall",
    "exit",
    "exit_group",
    "set_robust_list",
    "rseq",
    "sched_getaffinity",
    "fstat",
    "fstat64",
};
// For memory that is not to be executed.
constexpr const char* kMappingCalls[] = {"mmap", "mmap2", "mprotect"};
// cairo asks whether a font is there before it opens it.
constexpr const char* kAllowedWithFiles[] = {"getdents64", "access", "faccessat"};

#if defined(__s390__)
constexpr unsigned kCloneFlags = 1;  // the stack comes first there
#else
constexpr unsigned kCloneFlags = 0;
#endif

class Filter {
 public:
  Filter() : _filter(seccomp_init(SCMP_ACT_ERRNO(EPERM)), &seccomp_release) {
    if (!_filter) {
      _code = -ENOMEM;
      return;
    }
    // One call for all threads, and an end to who tries another processor's numbers.
    fail(seccomp_attr_set(_filter.get(), SCMP_FLTATR_CTL_TSYNC, 1));
    fail(seccomp_attr_set(_filter.get(), SCMP_FLTATR_ACT_BADARCH, SCMP_ACT_KILL_PROCESS));
  }

  template <class... Conditions>
  void add(std::uint32_t action, const char* name, Conditions... conditions) {
    const int call = seccomp_syscall_resolve_name(name);
    if (call < 0 || _code != 0) return;
    fail(seccomp_rule_add(_filter.get(), action, call, sizeof...(conditions), conditions...));
  }

  // 0 or an errno.
  int load() {
    if (_code == 0) fail(seccomp_load(_filter.get()));
    return -_code;
  }

 private:
  void fail(int code) {
    if (_code == 0) _code = code;
  }

  int _code = 0;
  const std::unique_ptr<void, decltype(&seccomp_release)> _filter;
};

// The argument has none of these bits.
scmp_arg_cmp without(unsigned argument, unsigned long long bits) {
  return {argument, SCMP_CMP_MASKED_EQ, bits, 0};
}

}  // namespace

int filterSystemCalls(bool mayOpen) {
  Filter filter;
  for (const char* name : kAllowed) filter.add(SCMP_ACT_ALLOW, name);
  for (const char* name : kMappingCalls) filter.add(SCMP_ACT_ALLOW, name, without(2, PROT_EXEC));
  // Threads, which Pango starts to look for fonts, but no processes. The newer call has its
  // flags where a filter cannot see them; the C library falls back to the older one.
  filter.add(SCMP_ACT_ERRNO(ENOSYS), "clone3");
  filter.add(SCMP_ACT_ALLOW, "clone",
             scmp_arg_cmp{kCloneFlags, SCMP_CMP_MASKED_EQ, CLONE_THREAD, CLONE_THREAD});
  if (mayOpen) {
    for (const char* name : kAllowedWithFiles) filter.add(SCMP_ACT_ALLOW, name);
    filter.add(SCMP_ACT_ALLOW, "openat",
               without(2, O_ACCMODE | O_CREAT | O_TRUNC | O_APPEND | O_PATH));
  }
  return filter.load();
}

}  // namespace skein::thumbnailer
