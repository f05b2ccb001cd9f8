#include "linux/cli/Interruption.h"

#include <poll.h>
#include <pthread.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdint>
#include <thread>
#include <utility>

#include "base/Mutex.h"
#include "linux/cli/Output.h"
#include "linux/protocol/FileDescriptor.h"

namespace skein::cli {
namespace {

struct State {
  Mutex mutex;
  unsigned noting SKEIN_GUARDED_BY(mutex) = 0;
  int signal SKEIN_GUARDED_BY(mutex) = 0;
  std::function<void()> then SKEIN_GUARDED_BY(mutex);
  bool lineIsOpen SKEIN_GUARDED_BY(mutex) = false;
  std::string temporaryFolder SKEIN_GUARDED_BY(mutex);
  std::string temporaryFile SKEIN_GUARDED_BY(mutex);
  const FileDescriptor noted{eventfd(0, EFD_CLOEXEC)};  // readable once a signal is noted
};

// The signals' thread runs until the process has ended, and so does this.
State& state() {
  static State& only = *new State;
  return only;
}

[[noreturn]] void end(int signal) {
  State& own = state();
  MutexLock lock(own.mutex);
  if (!own.temporaryFolder.empty()) {
    unlink(own.temporaryFile.c_str());
    rmdir(own.temporaryFolder.c_str());
  }
  if (own.lineIsOpen) [[maybe_unused]]
    const ssize_t written = write(STDERR_FILENO, "\n", 1);
  _exit(128 + signal);
}

void take(int signal) {
  State& own = state();
  std::function<void()> then;
  {
    MutexLock lock(own.mutex);
    if (own.noting > 0 && own.signal == 0) {
      own.signal = signal;
      then = std::exchange(own.then, nullptr);
      [[maybe_unused]] const int failure = eventfd_write(own.noted.get(), 1);
    } else {
      then = [signal] { end(signal); };
    }
  }
  if (then) then();
}

}  // namespace

void installInterruption() {
  sigset_t signals;
  sigemptyset(&signals);
  for (const int signal : {SIGINT, SIGTERM}) {
    sigaddset(&signals, signal);
    // A script's shell has those that it starts beside itself ignore Ctrl-C.
    std::signal(signal, SIG_DFL);
  }
  struct sigaction hangup {};
  if (sigaction(SIGHUP, nullptr, &hangup) != 0 || hangup.sa_handler != SIG_IGN) {
    sigaddset(&signals, SIGHUP);
  }
  state();
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);
  std::thread([signals] {
    for (;;) {
      int signal = 0;
      if (sigwait(&signals, &signal) == 0) take(signal);
    }
  }).detach();
}

NotedInterruption::NotedInterruption() {
  MutexLock lock(state().mutex);
  ++state().noting;
}

NotedInterruption::~NotedInterruption() {
  MutexLock lock(state().mutex);
  --state().noting;
}

int interruption() {
  MutexLock lock(state().mutex);
  return state().signal;
}

NSErrorPtr interruptedError() {
  return NSError::errorWithDomain(
      NSCocoaErrorDomain, NSUserCancelledError,
      {{NSLocalizedDescriptionKey, std::string("the command was interrupted; nothing was done")}});
}

OnInterruption::OnInterruption(std::function<void()> then) {
  {
    MutexLock lock(state().mutex);
    if (state().signal == 0) std::swap(state().then, then);
  }
  if (then) then();
}

OnInterruption::~OnInterruption() {
  std::function<void()> then;
  MutexLock lock(state().mutex);
  std::swap(state().then, then);
}

bool waitForInput() {
  pollfd waited[2] = {{STDIN_FILENO, POLLIN, 0}, {state().noted.get(), POLLIN, 0}};
  while (poll(waited, 2, -1) < 0 && errno == EINTR) {
  }
  return waited[1].revents == 0;
}

void setLineIsOpen(bool isOpen) {
  MutexLock lock(state().mutex);
  state().lineIsOpen = isOpen;
}

void rememberTemporaryFile(const std::string& folder, const std::string& file) {
  MutexLock lock(state().mutex);
  state().temporaryFolder = folder;
  state().temporaryFile = file;
}

void forgetTemporaryFile() {
  MutexLock lock(state().mutex);
  state().temporaryFolder.clear();
}

}  // namespace skein::cli
