#pragma once

#include <functional>
#include <memory>
#include <utility>

#include "linux/host/FileProviderHost.h"
#include "linux/host/Timers.h"
#include "linux/protocol/LocalDaemon.h"

namespace skein {

// Makes a proxy of vald whose lost messages go to the handler.
using DaemonProxies =
    std::function<std::shared_ptr<LocalDaemon>(std::function<void(NSErrorPtr)> errorHandler)>;

// News of the working set: what vald pushes about the whole drive, the app containers with
// it, taken as a hint alone. While the link to vald is broken it is made anew, with pauses.
// Any thread.
class WorkingSetWatch final : public WorkingSetNews {
 public:
  WorkingSetWatch(DaemonProxies daemon, std::shared_ptr<Timers> timers)
      : _daemon(std::move(daemon)), _timers(std::move(timers)) {}

  std::shared_ptr<void> begin(std::function<void()> handler) override;

 private:
  class Link;

  const DaemonProxies _daemon;
  const std::shared_ptr<Timers> _timers;
};

}  // namespace skein
