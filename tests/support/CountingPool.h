#pragma once

#include <chrono>
#include <cstddef>
#include <utility>

#include "base/Mutex.h"
#include "base/ThreadPool.h"

namespace skein {

// Real threads that can be waited for until they have nothing to do.
class CountingPool final : public Executor {
 public:
  explicit CountingPool(std::size_t width = 4) : _pool(width, "tests") {}

  void post(Task task) override SKEIN_EXCLUDES(_mutex) {
    count(+1);
    _pool.post([this, task = std::move(task)]() mutable {
      task();
      task = nullptr;
      count(-1);
    });
  }
  void beginWait() override { _pool.beginWait(); }
  void endWait() override { _pool.endWait(); }

  // False when the deadline, a minute, passed first.
  bool waitIdle() SKEIN_EXCLUDES(_mutex) {
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::minutes(1);
    MutexLock lock(_mutex);
    while (_outstanding > 0) {
      if (!_idle.waitUntil(_mutex, deadline)) return _outstanding == 0;
    }
    return true;
  }

 private:
  void count(int change) SKEIN_EXCLUDES(_mutex) {
    MutexLock lock(_mutex);
    _outstanding += change;
    if (_outstanding == 0) _idle.notifyAll();
  }

  Mutex _mutex;
  CondVar _idle;
  int _outstanding SKEIN_GUARDED_BY(_mutex) = 0;
  ThreadPool _pool;
};

}  // namespace skein
