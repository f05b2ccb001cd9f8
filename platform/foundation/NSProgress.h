#pragma once

#include <cstdint>
#include <functional>
#include <memory>

#include "base/Mutex.h"

namespace skein {

// How far a request is, and the way to cancel it. Any thread.
class NSProgress {
 public:
  static std::shared_ptr<NSProgress> progressWithTotalUnitCount(std::int64_t count) {
    return std::make_shared<NSProgress>(count);
  }
  explicit NSProgress(std::int64_t totalUnitCount) : _total(totalUnitCount) {}

  // 0 while nobody knows.
  std::int64_t totalUnitCount() const SKEIN_EXCLUDES(_mutex);
  void setTotalUnitCount(std::int64_t count) SKEIN_EXCLUDES(_mutex);
  std::int64_t completedUnitCount() const SKEIN_EXCLUDES(_mutex);
  void setCompletedUnitCount(std::int64_t count) SKEIN_EXCLUDES(_mutex);
  bool isCancelled() const SKEIN_EXCLUDES(_mutex);

  // YES at first. While NO, cancel() does nothing.
  void setCancellable(bool cancellable) SKEIN_EXCLUDES(_mutex);

  // Replaces the handler; runs it at once, on this thread, when already cancelled.
  void setCancellationHandler(std::function<void()> handler) SKEIN_EXCLUDES(_mutex);
  // The same while nothing is completed; else it does nothing. In one step: whoever counts
  // the first unit and then sets a handler of its own keeps that one.
  void setCancellationHandlerWhileCountIsZero(std::function<void()> handler) SKEIN_EXCLUDES(_mutex);

  // Runs with the completed count when that is set, on the setter's thread and without the
  // lock. One for each progress: the transport's, which tells a client process.
  void setCountHandler(std::function<void(std::int64_t)> handler) SKEIN_EXCLUDES(_mutex);

  // Runs the handler, once, on the calling thread and without the lock.
  void cancel() SKEIN_EXCLUDES(_mutex);

 private:
  mutable Mutex _mutex;
  std::int64_t _total SKEIN_GUARDED_BY(_mutex);
  std::int64_t _completed SKEIN_GUARDED_BY(_mutex) = 0;
  bool _cancellable SKEIN_GUARDED_BY(_mutex) = true;
  bool _cancelled SKEIN_GUARDED_BY(_mutex) = false;
  std::function<void()> _handler SKEIN_GUARDED_BY(_mutex);
  std::function<void(std::int64_t)> _countHandler SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein
