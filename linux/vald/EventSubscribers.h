#pragma once

#include <memory>
#include <optional>
#include <vector>

#include "base/Mutex.h"
#include "base/SerialQueue.h"
#include "linux/protocol/LocalDaemon.h"

namespace skein::vald {

// Who hears of account and container changes. Subscribers are held weakly and called one
// after the other, from the executor and under no lock, in the order of the events.
// Any thread. Outlives what it posted.
class EventSubscribers {
 public:
  explicit EventSubscribers(std::shared_ptr<Executor> executor);

  // False when there are too many already.
  bool add(const std::shared_ptr<LocalDaemonEvents>& events) SKEIN_EXCLUDES(_mutex);

  void accountDidChange(std::optional<LocalAccount> account) SKEIN_EXCLUDES(_mutex);
  void containerListDidChange() SKEIN_EXCLUDES(_mutex);

 private:
  using Subscribers = std::vector<std::shared_ptr<LocalDaemonEvents>>;
  Subscribers living() SKEIN_EXCLUDES(_mutex);

  SerialQueue _queue;
  Mutex _mutex;
  std::vector<std::weak_ptr<LocalDaemonEvents>> _subscribers SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein::vald
