#pragma once

#include <functional>

#include "base/Mutex.h"

namespace skein::vald {

// Tells a piece of work that nobody wants it any more. Any thread; shared by the work and
// whoever may cancel it.
class Cancellation {
 public:
  // Runs the handler, once, on the calling thread and without the lock.
  void cancel() SKEIN_EXCLUDES(_mutex);
  bool isCancelled() const SKEIN_EXCLUDES(_mutex);

  // Replaces the handler; runs it at once, on this thread, when already cancelled. A
  // handler may still be running on another thread when this returns.
  void setHandler(std::function<void()> handler) SKEIN_EXCLUDES(_mutex);

 private:
  mutable Mutex _mutex;
  bool _cancelled SKEIN_GUARDED_BY(_mutex) = false;
  std::function<void()> _handler SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein::vald
