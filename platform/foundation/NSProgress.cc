#include "platform/foundation/NSProgress.h"

#include <utility>

namespace skein {

std::int64_t NSProgress::totalUnitCount() const {
  MutexLock lock(_mutex);
  return _total;
}

void NSProgress::setTotalUnitCount(std::int64_t count) {
  MutexLock lock(_mutex);
  _total = count;
}

std::int64_t NSProgress::completedUnitCount() const {
  MutexLock lock(_mutex);
  return _completed;
}

void NSProgress::setCompletedUnitCount(std::int64_t count) {
  std::function<void(std::int64_t)> handler;
  {
    MutexLock lock(_mutex);
    _completed = count;
    handler = _countHandler;
  }
  if (handler) handler(count);
}

bool NSProgress::isCancelled() const {
  MutexLock lock(_mutex);
  return _cancelled;
}

void NSProgress::setCancellable(bool cancellable) {
  MutexLock lock(_mutex);
  _cancellable = cancellable;
}

void NSProgress::setCancellationHandler(std::function<void()> handler) {
  {
    MutexLock lock(_mutex);
    if (!_cancelled) {
      _handler = std::move(handler);
      return;
    }
  }
  if (handler) handler();
}

void NSProgress::setCancellationHandlerWhileCountIsZero(std::function<void()> handler) {
  {
    MutexLock lock(_mutex);
    if (_completed != 0) return;
    if (!_cancelled) {
      _handler = std::move(handler);
      return;
    }
  }
  if (handler) handler();
}

void NSProgress::setCountHandler(std::function<void(std::int64_t)> handler) {
  MutexLock lock(_mutex);
  _countHandler.swap(handler);
}

void NSProgress::cancel() {
  std::function<void()> handler;
  {
    MutexLock lock(_mutex);
    if (!_cancellable || _cancelled) return;
    _cancelled = true;
    handler = std::exchange(_handler, nullptr);
  }
  if (handler) handler();
}

}  // namespace skein
