#include "platform/dispatch/DispatchGroup.h"

#include <utility>

#include "base/Fault.h"

namespace skein {

void DispatchGroup::enter() {
  MutexLock lock(_mutex);
  ++_underWay;
}

void DispatchGroup::leave() {
  std::vector<Notification> due;
  {
    MutexLock lock(_mutex);
    if (_underWay == 0) {
      lock.unlock();
      reportFault("a group was left more often than entered");
      return;
    }
    if (--_underWay == 0) due.swap(_notifications);
  }
  for (Notification& notification : due) notification.queue->async(std::move(notification.task));
}

void DispatchGroup::notify(std::shared_ptr<SerialQueue> queue, Task task) {
  {
    MutexLock lock(_mutex);
    if (_underWay > 0) {
      _notifications.push_back({std::move(queue), std::move(task)});
      return;
    }
  }
  queue->async(std::move(task));
}

}  // namespace skein
