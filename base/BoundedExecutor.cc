#include "base/BoundedExecutor.h"

#include <algorithm>
#include <deque>
#include <utility>

#include "base/Mutex.h"

namespace skein {

// Held by each task under way, which may outlive the executor.
struct BoundedExecutor::State : std::enable_shared_from_this<State> {
  State(std::shared_ptr<Executor> runner, std::size_t mostRunning)
      : executor(std::move(runner)), most(std::max<std::size_t>(mostRunning, 1)) {}

  // Runs one task on `executor`, then posts the one that waited longest.
  void start(Task task) {
    executor->post([self = shared_from_this(), task = std::move(task)]() mutable {
      task();
      task = nullptr;  // what it holds goes before its place does
      self->taskEnded();
    });
  }
  void taskEnded() SKEIN_EXCLUDES(mutex) {
    Task next;
    {
      MutexLock lock(mutex);
      if (tasks.empty()) {
        --running;
        return;
      }
      next = std::move(tasks.front());
      tasks.pop_front();
    }
    start(std::move(next));
  }

  const std::shared_ptr<Executor> executor;
  const std::size_t most;
  Mutex mutex;
  std::size_t running SKEIN_GUARDED_BY(mutex) = 0;
  std::deque<Task> tasks SKEIN_GUARDED_BY(mutex);
};

BoundedExecutor::BoundedExecutor(std::shared_ptr<Executor> executor, std::size_t most)
    : _state(std::make_shared<State>(std::move(executor), most)) {}

BoundedExecutor::~BoundedExecutor() = default;

void BoundedExecutor::post(Task task) {
  {
    MutexLock lock(_state->mutex);
    if (_state->running == _state->most) {
      _state->tasks.push_back(std::move(task));
      return;
    }
    ++_state->running;
  }
  _state->start(std::move(task));
}

void BoundedExecutor::beginWait() { _state->executor->beginWait(); }
void BoundedExecutor::endWait() { _state->executor->endWait(); }

}  // namespace skein
