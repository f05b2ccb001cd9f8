#pragma once

#include <utility>

#include "linux/framework/SyncCall.h"
#include "platform/log/Log.h"
#include "vellum/VLThumbnailTransfer.h"

namespace skein {

// Downloads that nobody waits for, asked of vald. They are under way when vald has been
// asked; how one ends is in the log alone, when it fails. The log outlives the executor's work.
class LocalDownloads final : public VLDownloads {
 public:
  LocalDownloads(DaemonAccess access, Log& log) : _access(std::move(access)), _log(log) {}

  void VLStartDownloadForItemsWithOptions(const std::vector<NSURLPtr>& items, std::uint64_t options,
                                          UniqueFunction<void(NSErrorPtr)> completion) override;

 private:
  const DaemonAccess _access;
  Log& _log;
};

}  // namespace skein
