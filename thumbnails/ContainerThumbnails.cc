#include "thumbnails/ContainerThumbnails.h"

#include <algorithm>
#include <utility>

#include "platform/fileprovider/NSFileProviderError.h"
#include "support/NSError+VLFPAdditions.h"
#include "support/NSString+PortfolioAdditions.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

constexpr double kMostSide = 120.0;

}  // namespace

NSSize ContainerThumbnails::_properSizeForContainerThumbnail(NSSize size) const {
  auto [width, height] = size;
  if (width > kMostSide) {
    VL_DEBUG(_log, "[DEBUG] width (%.2f) is greater than max width (%.2f)", width, kMostSide);
    width = kMostSide;
  }
  if (height > kMostSide) {
    VL_DEBUG(_log, "[DEBUG] height (%.2f) is greater than max height (%.2f)", height, kMostSide);
    height = kMostSide;
  }
  if (width > height || height > width) {
    VL_DEBUG(_log,
             "[DEBUG] width (%.2f) and height (%.2f) should be equal for container's thumbnail",
             width, height);
    width = height = std::min(width, height);
  }
  return {width, height};
}

void ContainerThumbnails::_fetchThumbnailForContainerID(
    const std::string& containerID,
    const NSFileProviderItemIdentifier& representedByItemWithIdentifer, NSSize size,
    const VLContainersByID& knownContainers,
    const NSFileProviderExtension::ThumbnailWithTypeHandler& perThumbnailCompletionHandler) const {
  const auto answer = [&](std::optional<NSData> data, std::optional<std::string> type,
                          NSErrorPtr error) {
    if (!perThumbnailCompletionHandler) return;
    perThumbnailCompletionHandler(representedByItemWithIdentifer, std::move(data), std::move(type),
                                  std::move(error));
  };

  const auto found = knownContainers.find(containerID);
  if (found == knownContainers.end() || !found->second) {
    VL_ERROR(_log, "[ERROR] can't find container with ID %@", containerID);
    answer(std::nullopt, std::nullopt,
           fileProviderErrorForNonExistentItemWithIdentifier(representedByItemWithIdentifer));
    return;
  }
  bool isAppIcon = false;
  std::optional<NSData> image = found->second->bestFittingImageDataForSize(size, isAppIcon);
  if (!image) {
    const std::string sizeText = vl_stringWithSize(size);
    VL_ERROR(_log, "[ERROR] can't find image with size %@ for %@", sizeText, containerID);
    answer(std::nullopt, std::nullopt,
           vl_fileProviderError(vlc_errorInvalidParameter("size", sizeText)));
    return;
  }
  std::optional<std::string> type;
  if (isAppIcon) type = kUndecoratedContainerType;
  answer(std::move(image), std::move(type), nullptr);
}

}  // namespace skein
