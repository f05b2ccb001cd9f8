#include "linux/cli/ServiceSession.h"

#include <pthread.h>
#include <unistd.h>

#include <csignal>
#include <thread>

#include "linux/cli/ExitCodes.h"

namespace skein::cli {

struct InterruptCancels::State {
  Mutex mutex;
  std::shared_ptr<NSProgress> progress SKEIN_GUARDED_BY(mutex);
};

InterruptCancels::InterruptCancels() : _state(std::make_shared<State>()) {
  sigset_t interrupt;
  sigemptyset(&interrupt);
  sigaddset(&interrupt, SIGINT);
  pthread_sigmask(SIG_BLOCK, &interrupt, nullptr);
  // Waits for as long as the program runs, which ends without it.
  std::thread([state = _state, interrupt] {
    for (;;) {
      int signal = 0;
      if (sigwait(&interrupt, &signal) != 0) continue;
      std::shared_ptr<NSProgress> progress;
      {
        MutexLock lock(state->mutex);
        progress.swap(state->progress);
      }
      if (!progress) _exit(kInterrupted);
      progress->cancel();
    }
  }).detach();
}

void InterruptCancels::watch(std::shared_ptr<NSProgress> progress) {
  MutexLock lock(_state->mutex);
  _state->progress.swap(progress);
}

}  // namespace skein::cli
