#pragma once

#include <chrono>
#include <cstdint>
#include <map>
#include <memory>
#include <thread>
#include <unordered_map>
#include <utility>

#include "base/Executor.h"
#include "base/Mutex.h"

namespace skein {

// Work for later. Any thread, with any lock held.
class Timers {
 public:
  using Key = std::uint64_t;

  virtual ~Timers() = default;

  // Posts `task` to the executor once `delay` has passed.
  virtual Key after(std::chrono::milliseconds delay, Task task) = 0;

  // A task whose time has come may still run; one that has not is destroyed.
  virtual void cancel(Key key) = 0;
};

// One thread that sleeps until the next task is due.
class SteadyTimers final : public Timers {
 public:
  explicit SteadyTimers(std::shared_ptr<Executor> executor);
  // Tasks that are not due are destroyed unrun.
  ~SteadyTimers() override;

  Key after(std::chrono::milliseconds delay, Task task) override SKEIN_EXCLUDES(_mutex);
  void cancel(Key key) override SKEIN_EXCLUDES(_mutex);

 private:
  using Clock = std::chrono::steady_clock;

  void run() SKEIN_EXCLUDES(_mutex);

  const std::shared_ptr<Executor> _executor;
  Mutex _mutex;
  CondVar _changed;
  std::map<std::pair<Clock::time_point, Key>, Task> _tasks SKEIN_GUARDED_BY(_mutex);
  std::unordered_map<Key, Clock::time_point> _times SKEIN_GUARDED_BY(_mutex);
  Key _lastKey SKEIN_GUARDED_BY(_mutex) = 0;
  bool _stopping SKEIN_GUARDED_BY(_mutex) = false;
  std::thread _thread;
};

}  // namespace skein
