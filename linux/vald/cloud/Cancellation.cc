#include "linux/vald/cloud/Cancellation.h"

#include <utility>

namespace skein::vald {

void Cancellation::cancel() {
  std::function<void()> handler;
  {
    MutexLock lock(_mutex);
    if (_cancelled) return;
    _cancelled = true;
    handler = std::exchange(_handler, nullptr);
  }
  if (handler) handler();
}

bool Cancellation::isCancelled() const {
  MutexLock lock(_mutex);
  return _cancelled;
}

void Cancellation::setHandler(std::function<void()> handler) {
  {
    MutexLock lock(_mutex);
    if (!_cancelled) {
      std::swap(_handler, handler);  // the old one goes when the lock is released
      return;
    }
  }
  if (handler) handler();
}

}  // namespace skein::vald
