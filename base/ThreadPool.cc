#include "base/ThreadPool.h"

#include <pthread.h>

#include <algorithm>
#include <deque>
#include <thread>
#include <utility>
#include <vector>

#include "base/Mutex.h"

namespace skein {
namespace {

// A pool whose workers all wait may grow, but not without end.
constexpr std::size_t kMostThreads = 256;

}  // namespace

// Held by the pool and by each worker, so that a worker may outlive the pool.
struct ThreadPool::State : std::enable_shared_from_this<State> {
  State(std::size_t runningWorkers, std::string threadName)
      : width(std::max<std::size_t>(runningWorkers, 1)), name(std::move(threadName)) {}

  void run() SKEIN_EXCLUDES(mutex);
  void addThreadIfNeeded() SKEIN_REQUIRES(mutex);

  const std::size_t width;
  const std::string name;
  Mutex mutex;
  CondVar workArrived;
  std::deque<Task> tasks SKEIN_GUARDED_BY(mutex);
  std::vector<std::thread> threads SKEIN_GUARDED_BY(mutex);
  std::size_t idle SKEIN_GUARDED_BY(mutex) = 0;
  std::size_t waiting SKEIN_GUARDED_BY(mutex) = 0;
  bool stopping SKEIN_GUARDED_BY(mutex) = false;
};

void ThreadPool::State::addThreadIfNeeded() {
  if (idle >= tasks.size()) return;
  if (threads.size() >= std::min(width + waiting, kMostThreads)) return;
  threads.emplace_back([self = shared_from_this()] { self->run(); });
}

void ThreadPool::State::run() {
  pthread_setname_np(pthread_self(), name.c_str());
  for (;;) {
    Task task;
    {
      MutexLock lock(mutex);
      while (tasks.empty()) {
        if (stopping) return;
        ++idle;
        workArrived.wait(mutex);
        --idle;
      }
      task = std::move(tasks.front());
      tasks.pop_front();
    }
    task();
  }
}

ThreadPool::ThreadPool(std::size_t width, std::string name)
    : _state(std::make_shared<State>(width, name.substr(0, 15))) {}

ThreadPool::~ThreadPool() {
  {
    MutexLock lock(_state->mutex);
    _state->stopping = true;
    _state->workArrived.notifyAll();
  }
  // A task that still runs may wait and so add a thread: take them in turns.
  for (std::vector<std::thread> threads;; threads.clear()) {
    {
      MutexLock lock(_state->mutex);
      threads.swap(_state->threads);
    }
    if (threads.empty()) return;
    for (std::thread& thread : threads) {
      if (thread.get_id() == std::this_thread::get_id()) {
        thread.detach();
      } else {
        thread.join();
      }
    }
  }
}

void ThreadPool::post(Task task) {
  MutexLock lock(_state->mutex);
  _state->tasks.push_back(std::move(task));
  _state->addThreadIfNeeded();
  if (_state->idle > 0) _state->workArrived.notifyOne();
}

void ThreadPool::beginWait() {
  MutexLock lock(_state->mutex);
  ++_state->waiting;
  if (!_state->tasks.empty()) _state->addThreadIfNeeded();
}

void ThreadPool::endWait() {
  MutexLock lock(_state->mutex);
  --_state->waiting;
}

}  // namespace skein
