#include "base/ThreadPool.h"

#include <pthread.h>

#include <algorithm>
#include <chrono>
#include <deque>
#include <optional>
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
  State(std::size_t runningWorkers, std::string threadName, std::chrono::milliseconds patience)
      : width(std::max<std::size_t>(runningWorkers, 1)),
        name(std::move(threadName)),
        sparePatience(patience) {}

  void run() SKEIN_EXCLUDES(mutex);
  void addThreadIfNeeded() SKEIN_REQUIRES(mutex);
  // Waits for a task. Nothing when this thread is to end; it is in `ended` then.
  std::optional<Task> nextTask() SKEIN_EXCLUDES(mutex);

  const std::size_t width;
  const std::string name;
  const std::chrono::milliseconds sparePatience;
  Mutex mutex;
  CondVar workArrived;
  std::deque<Task> tasks SKEIN_GUARDED_BY(mutex);
  std::vector<std::thread> threads SKEIN_GUARDED_BY(mutex);
  std::vector<std::thread> ended SKEIN_GUARDED_BY(mutex);  // about to return, to be joined
  std::size_t idle SKEIN_GUARDED_BY(mutex) = 0;
  std::size_t waiting SKEIN_GUARDED_BY(mutex) = 0;
  bool stopping SKEIN_GUARDED_BY(mutex) = false;
};

void ThreadPool::State::addThreadIfNeeded() {
  if (idle >= tasks.size()) return;
  if (threads.size() >= std::min(width + waiting, kMostThreads)) return;
  for (std::thread& thread : ended) thread.join();
  ended.clear();
  threads.emplace_back([self = shared_from_this()] { self->run(); });
}

std::optional<Task> ThreadPool::State::nextTask() {
  MutexLock lock(mutex);
  while (tasks.empty()) {
    if (stopping) return std::nullopt;
    ++idle;
    const bool woken =
        workArrived.waitUntil(mutex, std::chrono::steady_clock::now() + sparePatience);
    --idle;
    if (woken || !tasks.empty() || stopping || threads.size() <= width + waiting) continue;
    const auto own = std::find_if(threads.begin(), threads.end(), [](const std::thread& thread) {
      return thread.get_id() == std::this_thread::get_id();
    });
    if (own == threads.end()) continue;  // the pool's end has it
    ended.push_back(std::move(*own));
    threads.erase(own);
    return std::nullopt;
  }
  Task task = std::move(tasks.front());
  tasks.pop_front();
  return task;
}

void ThreadPool::State::run() {
  pthread_setname_np(pthread_self(), name.c_str());
  while (std::optional<Task> task = nextTask()) (*task)();
}

ThreadPool::ThreadPool(std::size_t width, std::string name, std::chrono::milliseconds sparePatience)
    : _state(std::make_shared<State>(width, name.substr(0, 15), sparePatience)) {}

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
      for (std::thread& thread : _state->ended) threads.push_back(std::move(thread));
      _state->ended.clear();
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

std::size_t ThreadPool::threadCount() const {
  MutexLock lock(_state->mutex);
  return _state->threads.size();
}

}  // namespace skein
