// Fetching thumbnails, on a host that offers none of it: operations fail with
// NSFeatureUnsupportedError, nothing can be rendered, and nothing is downloaded.
#pragma once

#include "platform/cloudkit/CloudKit.h"
#include "platform/quicklook/QLThumbnails.h"
#include "vellum/VLThumbnailTransfer.h"

namespace skein {

class UnsupportedCloud final : public CKContainers {
 public:
  std::shared_ptr<CKContainer> containerWithIdentifier(const std::string& identifier) override;
};

class UnsupportedThumbnailTransfer final : public QLThumbnails,
                                           public VLRemoteUserDefaults,
                                           public VLDownloads {
 public:
  bool canMostRecentClientsGenerateThumbnailsForUTI(
      const std::optional<std::string>& typeIdentifier) override;
  std::int64_t minFileSizeForThumbnailTransfer() override;
  void VLStartDownloadForItemsWithOptions(const std::vector<NSURLPtr>& items, std::uint64_t options,
                                          UniqueFunction<void(NSErrorPtr)> completion) override;
};

}  // namespace skein
