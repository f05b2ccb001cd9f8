#pragma once

#include <deque>
#include <memory>
#include <vector>

#include "base/Mutex.h"
#include "linux/host/FileProviderHost.h"
#include "linux/host/WatchEvents.h"
#include "linux/protocol/HostService.h"

namespace skein {

// One consumer's place at a container's watch: gathers what happens until it is taken out.
// The watch leaves when the stream is destroyed. Any thread.
class WatchStream final : public HostWatch {
 public:
  // Replies once the watch has begun, or with the error that kept it from beginning.
  static void begin(FileProviderHost& host, const NSFileProviderItemIdentifier& container,
                    Reply<std::shared_ptr<HostWatch>, NSErrorPtr> reply);
  ~WatchStream() override;

  // Waits until there is a change. After the watch has ended: its error, each time.
  void next(Reply<std::vector<HostChange>, NSErrorPtr> reply) override;

 private:
  class Gatherer;
  WatchStream(std::shared_ptr<Gatherer> gatherer,
              std::shared_ptr<FileProviderHost::Subscription> subscription);

  const std::shared_ptr<Gatherer> _gatherer;
  const std::shared_ptr<FileProviderHost::Subscription> _subscription;
};

}  // namespace skein
