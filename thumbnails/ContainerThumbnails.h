#pragma once

#include <string>

#include "platform/fileprovider/NSFileProviderExtension.h"
#include "platform/foundation/NSSize.h"
#include "support/Environment.h"

namespace skein {

// The content type of an icon that the browser shows as an app's, without a folder around it.
inline constexpr char kUndecoratedContainerType[] =
    "com.tessel.fileprovider.vl-undecorated-container";

// The principal class's thumbnails of containers' documents folders: the app's icon, from this
// machine. On the calling thread; any thread.
class ContainerThumbnails {
 public:
  // `log` outlives the object.
  explicit ContainerThumbnails(Log& log) : _log(log) {}

  // _properSizeForContainerThumbnail:
  // Icons are square and at most 120 points: both sides are cut to that, then the smaller one
  // counts. Never larger than what was asked for.
  NSSize _properSizeForContainerThumbnail(NSSize size) const;

  // _fetchThumbnailForContainerID:representedByItemWithIdentifer:size:knownContainers:perThumbnailCompletionHandler:
  // Answers before it returns; the handler may be empty. `size` is proper already. Errors:
  // no-such-item for the item identifier when the table has no such container; the
  // framework's invalid-parameter error, translated, when it has no image.
  void _fetchThumbnailForContainerID(
      const std::string& containerID,
      const NSFileProviderItemIdentifier& representedByItemWithIdentifer, NSSize size,
      const VLContainersByID& knownContainers,
      const NSFileProviderExtension::ThumbnailWithTypeHandler& perThumbnailCompletionHandler) const;

 private:
  Log& _log;
};

}  // namespace skein
