#include "linux/framework/LocalContainer.h"

#include <algorithm>
#include <cmath>
#include <filesystem>
#include <string_view>
#include <vector>

namespace skein {
namespace {

// An icon that is larger is none.
constexpr std::uintmax_t kLargestIcon = 4 << 20;

// Where the theme has nothing at all.
constexpr std::string_view kGenericIcon = R"(<?xml version="1.0" encoding="UTF-8"?>
<svg xmlns="http://www.w3.org/2000/svg" width="120" height="120" viewBox="0 0 120 120">
<path d="M12 26a6 6 0 0 1 6-6h26l10 12h48a6 6 0 0 1 6 6v58a6 6 0 0 1-6 6H18a6 6 0 0 1-6-6z"
 fill="#5b8fb9"/>
<path d="M12 44h96v52a6 6 0 0 1-6 6H18a6 6 0 0 1-6-6z" fill="#7fb0d6"/>
</svg>
)";

std::vector<std::string> genericIcons(const std::string& containerID) {
  if (containerID == VLUbiquitousDocumentsContainerID) return {"folder-documents", "folder"};
  if (containerID == VLUbiquitousDesktopContainerID) return {"user-desktop", "folder"};
  return {"application-x-executable", "folder"};
}

}  // namespace

std::optional<NSData> LocalContainer::imageOf(const std::string& icon, int side) const {
  const auto path = _icons->pathOfIcon(icon, side);
  if (!path) return std::nullopt;
  std::error_code failure;
  const std::uintmax_t size = std::filesystem::file_size(*path, failure);
  if (failure || size == 0 || size > kLargestIcon) return std::nullopt;
  return NSData::dataWithContentsOfURL(NSURL::fileURLWithPath(*path));
}

std::optional<NSData> LocalContainer::bestFittingImageDataForSize(
    NSSize size, bool& shouldTransformToAppIcon) const {
  shouldTransformToAppIcon = false;
  // A point is a pixel. Whatever was asked for, icons are between these.
  const int side = static_cast<int>(std::lround(std::clamp(size.width, 1.0, 512.0)));
  if (icon()) {
    if (auto image = imageOf(*icon(), side)) {
      shouldTransformToAppIcon = isIconUndecorated();
      return image;
    }
  }
  for (const std::string& name : genericIcons(containerID())) {
    if (auto image = imageOf(name, side)) return image;
  }
  return NSData(kGenericIcon);
}

}  // namespace skein
