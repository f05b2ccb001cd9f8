// Where work runs. Programs use ThreadPool; tests step a manual one.
#pragma once

#include "base/UniqueFunction.h"

namespace skein {

class Executor {
 public:
  virtual ~Executor() = default;

  // Runs `task` later, on a thread of the executor's, never inside this call. Tasks
  // of one executor may run at once and in any order. Any thread.
  virtual void post(Task task) = 0;

  // Bracket a wait of the calling thread for work that needs this executor, so that
  // a pool can add a spare thread meanwhile. Use ScopedWait.
  virtual void beginWait() = 0;
  virtual void endWait() = 0;
};

class ScopedWait {
 public:
  explicit ScopedWait(Executor& executor) : _executor(executor) { _executor.beginWait(); }
  ~ScopedWait() { _executor.endWait(); }
  ScopedWait(const ScopedWait&) = delete;
  ScopedWait& operator=(const ScopedWait&) = delete;

 private:
  Executor& _executor;
};

}  // namespace skein
