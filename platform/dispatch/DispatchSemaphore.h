#pragma once

#include <cstdint>

#include "base/Executor.h"
#include "base/Mutex.h"

namespace skein {

// Lets a thread wait, without a time limit, until another one has signalled. Begins at 0.
// Any thread; it must live until the signal was given.
class DispatchSemaphore {
 public:
  void signal() SKEIN_EXCLUDES(_mutex) {
    MutexLock lock(_mutex);
    ++_signals;
    _signalled.notifyOne();
  }

  // `executor` learns of the wait, so that it is not short of a thread meanwhile, unless the
  // signal was given before.
  void wait(Executor& executor) SKEIN_EXCLUDES(_mutex) {
    {
      MutexLock lock(_mutex);
      if (_signals > 0) {
        --_signals;
        return;
      }
    }
    ScopedWait scope(executor);
    MutexLock lock(_mutex);
    while (_signals == 0) _signalled.wait(_mutex);
    --_signals;
  }

 private:
  Mutex _mutex;
  CondVar _signalled;
  std::uint64_t _signals SKEIN_GUARDED_BY(_mutex) = 0;
};

}  // namespace skein
