// Annotated locks. Every field that one of these guards says so with
// SKEIN_GUARDED_BY; docs/architecture.md writes down the order they are taken in.
#pragma once

#include <chrono>
#include <condition_variable>
#include <mutex>

#include "base/ThreadAnnotations.h"

namespace skein {

// Its holder must not take it again; where it is held while calling out, that is said there.
class SKEIN_CAPABILITY("mutex") Mutex {
 public:
  void lock() SKEIN_ACQUIRE() { _mutex.lock(); }
  void unlock() SKEIN_RELEASE() { _mutex.unlock(); }
  bool try_lock() SKEIN_TRY_ACQUIRE(true) { return _mutex.try_lock(); }

 private:
  std::mutex _mutex;
};

// An object's own recursive lock. It may be held while an observer is called, so
// the observer must not wait for another thread that wants it.
class SKEIN_CAPABILITY("monitor") Monitor {
 public:
  void lock() SKEIN_ACQUIRE() { _mutex.lock(); }
  void unlock() SKEIN_RELEASE() { _mutex.unlock(); }

 private:
  std::recursive_mutex _mutex;
};

// Holds a Mutex or a Monitor for a scope; unlock() leaves it early.
template <class Lock>
class SKEIN_SCOPED_CAPABILITY ScopedLock {
 public:
  explicit ScopedLock(Lock& lock) SKEIN_ACQUIRE(lock) : _lock(&lock) { lock.lock(); }
  ~ScopedLock() SKEIN_RELEASE() {
    if (_lock != nullptr) _lock->unlock();
  }
  ScopedLock(const ScopedLock&) = delete;
  ScopedLock& operator=(const ScopedLock&) = delete;

  void unlock() SKEIN_RELEASE() {
    _lock->unlock();
    _lock = nullptr;
  }

 private:
  Lock* _lock;
};

using MutexLock = ScopedLock<Mutex>;
using MonitorLock = ScopedLock<Monitor>;

// Waits on a Mutex that the caller holds. Spurious wake-ups happen: wait in a loop.
class CondVar {
 public:
  void wait(Mutex& mutex) SKEIN_REQUIRES(mutex) { _condition.wait(mutex); }
  // False when the deadline passed first.
  bool waitUntil(Mutex& mutex, std::chrono::steady_clock::time_point deadline)
      SKEIN_REQUIRES(mutex) {
    return _condition.wait_until(mutex, deadline) == std::cv_status::no_timeout;
  }
  void notifyOne() { _condition.notify_one(); }
  void notifyAll() { _condition.notify_all(); }

 private:
  std::condition_variable_any _condition;
};

}  // namespace skein
