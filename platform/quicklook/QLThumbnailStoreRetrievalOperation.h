#pragma once

#include <optional>
#include <string>

namespace skein {

// Whether the system can draw a content type's thumbnail by itself. Optional at run time:
// where the system has no such service, the answer is NO. Any thread.
class QLThumbnailStoreRetrievalOperation {
 public:
  virtual ~QLThumbnailStoreRetrievalOperation() = default;
  // canMostRecentClientsGenerateThumbnailsForUTI: NO for nil.
  virtual bool canMostRecentClientsGenerateThumbnailsForUTI(
      const std::optional<std::string>& typeIdentifier) = 0;
};

}  // namespace skein
