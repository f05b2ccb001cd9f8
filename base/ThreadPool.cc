#include "base/ThreadPool.h"

#include <pthread.h>

#include <algorithm>
#include <utility>

namespace skein {
namespace {

// A pool whose workers all wait may grow, but not without end.
constexpr std::size_t kMostThreads = 256;

}  // namespace

ThreadPool::ThreadPool(std::size_t width, std::string name)
    : _width(std::max<std::size_t>(width, 1)), _name(name.substr(0, 15)) {}

ThreadPool::~ThreadPool() {
  std::vector<std::thread> threads;
  {
    MutexLock lock(_mutex);
    _stopping = true;
    _workArrived.notifyAll();
  }
  // A task that still runs may post or wait and so add a thread: take them in turns.
  for (;;) {
    {
      MutexLock lock(_mutex);
      threads.swap(_threads);
    }
    if (threads.empty()) return;
    for (auto& thread : threads) thread.join();
    threads.clear();
  }
}

void ThreadPool::post(Task task) {
  MutexLock lock(_mutex);
  _tasks.push_back(std::move(task));
  addThreadIfNeeded();
  if (_idle > 0) _workArrived.notifyOne();
}

void ThreadPool::beginWait() {
  MutexLock lock(_mutex);
  ++_waiting;
  if (!_tasks.empty()) addThreadIfNeeded();
}

void ThreadPool::endWait() {
  MutexLock lock(_mutex);
  --_waiting;
}

void ThreadPool::addThreadIfNeeded() {
  if (_idle >= _tasks.size()) return;
  if (_threads.size() >= std::min(_width + _waiting, kMostThreads)) return;
  _threads.emplace_back([this] { run(); });
}

void ThreadPool::run() {
  pthread_setname_np(pthread_self(), _name.c_str());
  for (;;) {
    Task task;
    {
      MutexLock lock(_mutex);
      while (_tasks.empty()) {
        if (_stopping) return;
        ++_idle;
        _workArrived.wait(_mutex);
        --_idle;
      }
      task = std::move(_tasks.front());
      _tasks.pop_front();
    }
    task();
  }
}

}  // namespace skein
