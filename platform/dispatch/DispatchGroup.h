#pragma once

#include <cstddef>
#include <memory>
#include <vector>

#include "base/Mutex.h"
#include "base/SerialQueue.h"

namespace skein {

// Counts work under way, and tells when none is left. Any thread.
class DispatchGroup {
 public:
  // One more is under way.
  void enter() SKEIN_EXCLUDES(_mutex);
  // One has ended. More of these than of the others is a fault.
  void leave() SKEIN_EXCLUDES(_mutex);
  // Runs `task` on `queue`, once, when nothing is under way; never inside this call or the
  // last leave(). The group keeps the queue until then.
  void notify(std::shared_ptr<SerialQueue> queue, Task task) SKEIN_EXCLUDES(_mutex);

 private:
  struct Notification {
    std::shared_ptr<SerialQueue> queue;
    Task task;
  };

  Mutex _mutex;
  std::size_t _underWay SKEIN_GUARDED_BY(_mutex) = 0;
  std::vector<Notification> _notifications SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein
