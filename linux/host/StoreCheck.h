#pragma once

#include <cstdint>
#include <deque>
#include <memory>
#include <string>
#include <vector>

#include "base/SerialQueue.h"
#include "linux/host/FileProviderHost.h"
#include "linux/host/WorkingSetWatch.h"
#include "linux/protocol/HostService.h"

namespace skein {

// Compares what is on disk with vald's index (vald does that), then with what the extension
// enumerates of each folder (done here), and has vald verify that what is evicted, in the trash
// too, can come back. Each next() does one of these pieces.
//
// The disk may be changing: a folder that differs is looked at again, with pauses, and only
// what still differs is told. Any thread.
class StoreCheck final : public HostCheck {
 public:
  // `quick`: contents are not read, only looked for.
  StoreCheck(std::shared_ptr<FileProviderHost> host, DaemonProxies daemon, bool quick);
  ~StoreCheck() override;

  void next(Reply<HostCheckStep, NSErrorPtr> reply) override;

 private:
  class Work;
  const std::shared_ptr<Work> _work;
};

}  // namespace skein
