#include "linux/host/Timers.h"

#include <pthread.h>

namespace skein {

SteadyTimers::SteadyTimers(std::shared_ptr<Executor> executor) : _executor(std::move(executor)) {
  _thread = std::thread([this] { run(); });
}

SteadyTimers::~SteadyTimers() {
  {
    MutexLock lock(_mutex);
    _stopping = true;
  }
  _changed.notifyAll();
  _thread.join();
}

Timers::Key SteadyTimers::after(std::chrono::milliseconds delay, Task task) {
  const Clock::time_point due = Clock::now() + delay;
  MutexLock lock(_mutex);
  const Key key = ++_lastKey;
  _times.emplace(key, due);
  const auto place = _tasks.emplace(std::pair(due, key), std::move(task)).first;
  if (place == _tasks.begin()) _changed.notifyAll();
  return key;
}

void SteadyTimers::cancel(Key key) {
  Task cancelled;  // destroyed without the lock
  MutexLock lock(_mutex);
  const auto time = _times.find(key);
  if (time == _times.end()) return;
  const auto place = _tasks.find({time->second, key});
  cancelled = std::move(place->second);
  _tasks.erase(place);
  _times.erase(time);
}

void SteadyTimers::run() {
  pthread_setname_np(pthread_self(), "timers");
  MutexLock lock(_mutex);
  while (!_stopping) {
    if (_tasks.empty()) {
      _changed.wait(_mutex);
      continue;
    }
    const auto next = _tasks.begin();
    const Clock::time_point due = next->first.first;
    if (Clock::now() < due) {
      _changed.waitUntil(_mutex, due);
      continue;
    }
    _times.erase(next->first.second);
    // Only queues it: the executor runs nothing inside post().
    _executor->post(std::move(next->second));
    _tasks.erase(next);
  }
}

}  // namespace skein
