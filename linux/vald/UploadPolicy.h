#pragma once

#include <cstdint>
#include <string>

#include "linux/protocol/LocalCloud.h"

namespace skein::vald {

// How much of a drive is uploaded without anybody asking. Each upload is a copy on the same
// machine, which takes as much room again unless the file system shares blocks; so by
// default a drive over a large folder is uploaded up to a bound.
struct UploadPolicy {
  static constexpr std::uint64_t kDefaultLimit = std::uint64_t{1} << 30;

  LocalCloudStatus::Uploads uploads = LocalCloudStatus::Uploads::Bounded;
  std::uint64_t limit = kDefaultLimit;  // bytes in the cloud

  // SKEIN_UPLOADS: "off", "unlimited", or a number of MiB. Anything else is the default.
  static UploadPolicy parse(const std::string& text);
  static UploadPolicy fromEnvironment();
  // Whether SKEIN_UPLOADS says anything.
  static bool isSet();
};

}  // namespace skein::vald
