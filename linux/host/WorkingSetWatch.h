#pragma once

#include <functional>
#include <memory>

#include "base/Mutex.h"
#include "linux/host/FileProviderHost.h"
#include "linux/host/Timers.h"
#include "linux/protocol/LocalDaemon.h"

namespace skein {

// Makes a proxy of vald whose lost messages go to the handler.
using DaemonProxies =
    std::function<std::shared_ptr<LocalDaemon>(std::function<void(NSErrorPtr)> errorHandler)>;

// News of the working set: what vald pushes about the whole drive, taken as a hint alone.
// While the link to vald is broken it is made anew, with pauses. Any thread.
class WorkingSetWatch final : public WorkingSetNews {
 public:
  WorkingSetWatch(DaemonProxies daemon, std::shared_ptr<Timers> timers);
  ~WorkingSetWatch() override;

  void start(std::function<void()> handler) override SKEIN_EXCLUDES(_mutex);
  void stop() override SKEIN_EXCLUDES(_mutex);

 private:
  class Link;

  const DaemonProxies _daemon;
  const std::shared_ptr<Timers> _timers;
  Mutex _mutex;
  std::shared_ptr<Link> _link SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein
