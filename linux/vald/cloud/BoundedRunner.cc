#include "linux/vald/cloud/BoundedRunner.h"

#include <deque>
#include <utility>

#include "base/Mutex.h"

namespace skein::vald {

struct BoundedRunner::State {
  // One of the runners on the executor: takes tasks until none is left.
  void run() SKEIN_EXCLUDES(mutex) {
    for (;;) {
      Task task;
      {
        MutexLock lock(mutex);
        if (tasks.empty()) {
          --runners;
          return;
        }
        task = std::move(tasks.front());
        tasks.pop_front();
        ++running;
      }
      task();
      task = nullptr;  // what it holds goes before the destructor is let on
      MutexLock lock(mutex);
      --running;
      idle.notifyAll();
    }
  }

  std::shared_ptr<Executor> executor;
  std::size_t limit = 1;
  Mutex mutex;
  CondVar idle;
  std::deque<Task> tasks SKEIN_GUARDED_BY(mutex);
  std::size_t runners SKEIN_GUARDED_BY(mutex) = 0;
  std::size_t running SKEIN_GUARDED_BY(mutex) = 0;
};

BoundedRunner::BoundedRunner(std::shared_ptr<Executor> executor, std::size_t limit)
    : _state(std::make_shared<State>()) {
  _state->executor = std::move(executor);
  _state->limit = limit > 0 ? limit : 1;
}

BoundedRunner::~BoundedRunner() {
  std::deque<Task> dropped;
  MutexLock lock(_state->mutex);
  dropped.swap(_state->tasks);
  while (_state->running > 0) _state->idle.wait(_state->mutex);
}

void BoundedRunner::post(Task task) {
  {
    MutexLock lock(_state->mutex);
    _state->tasks.push_back(std::move(task));
    if (_state->runners == _state->limit) return;
    ++_state->runners;
  }
  _state->executor->post([state = _state] { state->run(); });
}

}  // namespace skein::vald
