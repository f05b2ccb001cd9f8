// What fetching thumbnails asks of the framework besides the cloud.
#pragma once

#include <cstdint>
#include <vector>

#include "base/UniqueFunction.h"
#include "platform/foundation/NSError.h"
#include "platform/foundation/NSURL.h"

namespace skein {

// sharedDefaults: the daemon's settings, as this process reads them. Any thread; may ask
// the daemon.
class VLRemoteUserDefaults {
 public:
  virtual ~VLRemoteUserDefaults() = default;
  // The largest file, in bytes, that is fetched itself where the cloud has no thumbnail of
  // it; negative: none is.
  virtual std::int64_t minFileSizeForThumbnailTransfer() = 0;
};

// VLStartDownloadForItemsWithOptions: the download is for a thumbnail; nobody waits for it.
inline constexpr std::uint64_t VLStartDownloadForThumbnail = 4;

class VLDownloads {
 public:
  virtual ~VLDownloads() = default;

  // Starts to fetch the items' contents. The completion runs once, when they are under way
  // (or are not going to be, with an error), not when they have arrived. It runs on a
  // thread that no caller of this function holds, so that a caller may wait for it.
  virtual void VLStartDownloadForItemsWithOptions(const std::vector<NSURLPtr>& items,
                                                  std::uint64_t options,
                                                  UniqueFunction<void(NSErrorPtr)> completion) = 0;
};

}  // namespace skein
