#pragma once

#include <string>

#include "vellum/VLThumbnailTransfer.h"

namespace skein {

// The settings file, $XDG_CONFIG_HOME/skein/settings.ini:
//
//   [Thumbnails]
//   # The largest file, in bytes, that is downloaded so that its thumbnail can be drawn here
//   # when the cloud has none. A negative number: none is.
//   minFileSizeForThumbnailTransfer=1048576
//
// Read anew each time, so that a change counts at once. Any thread.
class LocalDefaults final : public VLRemoteUserDefaults {
 public:
  // What counts where the file says nothing, or no number.
  static constexpr std::int64_t kMinFileSizeForThumbnailTransfer = 1 << 20;

  explicit LocalDefaults(std::string path) : _path(std::move(path)) {}
  static std::string userPath();

  std::int64_t minFileSizeForThumbnailTransfer() override;

 private:
  const std::string _path;
};

}  // namespace skein
