#pragma once

#include <deque>
#include <memory>

#include "base/SerialQueue.h"
#include "linux/framework/RequestProgress.h"
#include "linux/host/Listing.h"
#include "linux/protocol/HostFiles.h"

namespace skein {

// A transfer as whoever asked for it follows it: looks at its progress while somebody waits
// for a step. It has no deadline: an import or a download takes as long as it takes. Any
// thread; steps are told on the executor.
class Transfer final : public std::enable_shared_from_this<Transfer> {
 public:
  explicit Transfer(const HostTools& tools);

  // Where it is told how far it is; until then nobody knows.
  void follow(std::shared_ptr<RequestProgress> progress);

  void next(Reply<HostTransferStep, NSErrorPtr> reply);
  // The transfer has ended; the first time counts.
  void finish(HostItem item, NSErrorPtr error);

 private:
  void look() SKEIN_REQUIRES(_queue);
  void lookLater() SKEIN_REQUIRES(_queue);
  void answer(HostTransferStep step, NSErrorPtr error) SKEIN_REQUIRES(_queue);
  HostTransferStep measured() const SKEIN_REQUIRES(_queue);

  const std::shared_ptr<Timers> _timers;
  SerialQueue _queue;
  std::shared_ptr<RequestProgress> _progress SKEIN_GUARDED_BY(_queue);
  std::deque<Reply<HostTransferStep, NSErrorPtr>> _waiting SKEIN_GUARDED_BY(_queue);
  HostTransferStep _told SKEIN_GUARDED_BY(_queue);  // the last step
  NSErrorPtr _error SKEIN_GUARDED_BY(_queue);
  bool _timed SKEIN_GUARDED_BY(_queue) = false;
};

// The stream over it: runs `letGo` when whoever follows it cancels it, and when it lets go.
// Whoever still waits for a step then hears what `letGo` leads to.
std::shared_ptr<HostTransfer> streamOf(std::shared_ptr<Transfer> transfer, Task letGo);

}  // namespace skein
