#include "linux/thumbnailer/SystemCallFilter.h"

#include <fcntl.h>
#include <linux/audit.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <sched.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstddef>
#include <vector>

namespace skein::thumbnailer {

#if defined(__x86_64__)

namespace {

// All that decoding needs. Nothing here makes a descriptor, except those that come with a
// packet, or reaches another process, except through the descriptors at hand.
constexpr std::array kAllowed{
    SYS_read,
    SYS_write,
    SYS_writev,
    SYS_pread64,
    SYS_lseek,
    SYS_recvmsg,
    SYS_sendmsg,
    SYS_close,
    SYS_munmap,
    SYS_mremap,
    SYS_madvise,
    SYS_brk,
    SYS_futex,
    SYS_getrandom,
    SYS_clock_gettime,
    SYS_gettimeofday,
    SYS_sched_yield,
    SYS_sched_getaffinity,
    SYS_getpid,
    SYS_gettid,
    SYS_rt_sigaction,
    SYS_rt_sigprocmask,
    SYS_rt_sigreturn,
    SYS_sigaltstack,
    SYS_restart_syscall,
    SYS_exit,
    SYS_exit_group,
    SYS_set_robust_list,
    SYS_rseq,
};
// Allowed for memory that is not to be executed.
constexpr std::array kMappingCalls{SYS_mmap, SYS_mprotect};

class Program {
 public:
  void load(std::size_t offset) { add(BPF_LD | BPF_W | BPF_ABS, static_cast<unsigned>(offset)); }
  // Goes on when the value loaded is `value`, else skips `count` steps.
  void unlessEqualSkip(unsigned value, unsigned char count) {
    add(BPF_JMP | BPF_JEQ | BPF_K, value, 0, count);
  }
  void ifEqualSkip(unsigned value, unsigned char count) {
    add(BPF_JMP | BPF_JEQ | BPF_K, value, count, 0);
  }
  void ifAnyBitSkip(unsigned bits, unsigned char count) {
    add(BPF_JMP | BPF_JSET | BPF_K, bits, count, 0);
  }
  void answer(unsigned verdict) { add(BPF_RET | BPF_K, verdict); }

  sock_fprog asProgram() { return {static_cast<unsigned short>(_steps.size()), _steps.data()}; }

 private:
  void add(unsigned code, unsigned value, unsigned char yes = 0, unsigned char no = 0) {
    _steps.push_back({static_cast<unsigned short>(code), yes, no, value});
  }

  std::vector<sock_filter> _steps;
};

// The lower half, in a machine that puts it first.
std::size_t argument(std::size_t index) {
  return offsetof(seccomp_data, args) + index * sizeof(__u64);
}

Program makeProgram(bool mayOpen) {
  constexpr unsigned denied = SECCOMP_RET_ERRNO | EPERM;
  Program program;
  program.load(offsetof(seccomp_data, arch));
  program.ifEqualSkip(AUDIT_ARCH_X86_64, 1);
  program.answer(SECCOMP_RET_KILL_PROCESS);
  // The processor's other set of numbers (x32) has a bit that none of these has.
  program.load(offsetof(seccomp_data, nr));
  for (const long call : kAllowed) {
    program.unlessEqualSkip(static_cast<unsigned>(call), 1);
    program.answer(SECCOMP_RET_ALLOW);
  }
  // Threads, which Pango starts to look for fonts, but no processes. The newer call has its
  // flags where a filter cannot see them; the C library falls back to the older one.
  program.unlessEqualSkip(SYS_clone3, 1);
  program.answer(SECCOMP_RET_ERRNO | ENOSYS);
  program.unlessEqualSkip(SYS_clone, 4);
  program.load(argument(0));
  program.ifAnyBitSkip(CLONE_THREAD, 1);
  program.answer(denied);
  program.answer(SECCOMP_RET_ALLOW);
  for (const long call : kMappingCalls) {
    program.unlessEqualSkip(static_cast<unsigned>(call), 4);
    program.load(argument(2));
    program.ifAnyBitSkip(PROT_EXEC, 1);
    program.answer(SECCOMP_RET_ALLOW);
    program.answer(denied);
  }
  if (mayOpen) {
    program.unlessEqualSkip(SYS_openat, 4);
    program.load(argument(2));
    program.ifAnyBitSkip(O_ACCMODE | O_CREAT | O_TRUNC | O_APPEND | O_PATH, 1);
    program.answer(SECCOMP_RET_ALLOW);
    program.answer(denied);
    // cairo asks whether a font is there before it opens it.
    for (const long call : {SYS_getdents64, SYS_access}) {
      program.unlessEqualSkip(static_cast<unsigned>(call), 1);
      program.answer(SECCOMP_RET_ALLOW);
    }
    // As fstat() is called.
    program.unlessEqualSkip(SYS_newfstatat, 3);
    program.load(argument(3));
    program.unlessEqualSkip(AT_EMPTY_PATH, 1);
    program.answer(SECCOMP_RET_ALLOW);
  }
  program.answer(denied);
  return program;
}

}  // namespace

bool canFilterSystemCalls() { return true; }

int filterSystemCalls(bool mayOpen) {
  Program program = makeProgram(mayOpen);
  const sock_fprog steps = program.asProgram();
  const long result =
      syscall(SYS_seccomp, SECCOMP_SET_MODE_FILTER, SECCOMP_FILTER_FLAG_TSYNC, &steps);
  if (result > 0) return EBUSY;  // a thread that has a filter of its own already
  return result == 0 ? 0 : errno;
}

#else

bool canFilterSystemCalls() { return false; }
int filterSystemCalls(bool mayOpen) { return ENOSYS; }

#endif

}  // namespace skein::thumbnailer
