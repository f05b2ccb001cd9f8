#include "linux/vald/cloud/CloudClock.h"

#include <map>
#include <thread>
#include <utility>

#include "base/Mutex.h"

namespace skein::vald {
namespace {

// Set once, waited for by one thread.
class Signal {
 public:
  void set() SKEIN_EXCLUDES(_mutex) {
    MutexLock lock(_mutex);
    _set = true;
    _condition.notifyAll();
  }
  void wait() SKEIN_EXCLUDES(_mutex) {
    MutexLock lock(_mutex);
    while (!_set) _condition.wait(_mutex);
  }

 private:
  Mutex _mutex;
  CondVar _condition;
  bool _set SKEIN_GUARDED_BY(_mutex) = false;
};

}  // namespace

bool CloudClock::wait(Duration delay, Cancellation& cancellation) {
  // Shared: the timer or a canceller may still hold it when this wait is over.
  const auto signal = std::make_shared<Signal>();
  cancellation.setHandler([signal] { signal->set(); });
  callAfter(delay, [signal] { signal->set(); });
  signal->wait();
  cancellation.setHandler(nullptr);
  return !cancellation.isCancelled();
}

struct SystemCloudClock::State {
  using TimePoint = std::chrono::steady_clock::time_point;

  void run() SKEIN_EXCLUDES(mutex) {
    for (;;) {
      Task task;
      {
        MutexLock lock(mutex);
        for (;;) {
          if (stopping) return;
          if (timers.empty()) {
            condition.wait(mutex);
          } else if (const auto due = timers.begin()->first;
                     due > std::chrono::steady_clock::now()) {
            condition.waitUntil(mutex, due);
          } else {
            break;
          }
        }
        task = std::move(timers.begin()->second);
        timers.erase(timers.begin());
      }
      task();
    }
  }

  Mutex mutex;
  CondVar condition;
  bool stopping SKEIN_GUARDED_BY(mutex) = false;
  std::multimap<TimePoint, Task> timers SKEIN_GUARDED_BY(mutex);
  std::thread thread;
};

SystemCloudClock::SystemCloudClock() : _state(std::make_unique<State>()) {
  _state->thread = std::thread([state = _state.get()] { state->run(); });
}

SystemCloudClock::~SystemCloudClock() {
  {
    MutexLock lock(_state->mutex);
    _state->stopping = true;
    _state->condition.notifyAll();
  }
  _state->thread.join();
}

CloudClock::Duration SystemCloudClock::now() {
  return std::chrono::steady_clock::now().time_since_epoch();
}

NSDate SystemCloudClock::date() {
  return std::chrono::time_point_cast<std::chrono::nanoseconds>(std::chrono::system_clock::now());
}

void SystemCloudClock::callAfter(Duration delay, Task task) {
  const auto due = std::chrono::steady_clock::now() + delay;
  MutexLock lock(_state->mutex);
  _state->timers.emplace(due, std::move(task));
  _state->condition.notifyAll();
}

}  // namespace skein::vald
