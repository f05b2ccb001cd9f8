#pragma once

#include <memory>
#include <utility>

#include "linux/desktop/IconTheme.h"
#include "vellum/VLContainer.h"

namespace skein {

// A container with its icon: its app's, of the icon theme or a file of its own; a generic one
// where there is none, which is never shown as an app's.
class LocalContainer final : public VLContainer {
 public:
  LocalContainer(Properties properties, std::shared_ptr<const IconTheme> icons)
      : VLContainer(std::move(properties)), _icons(std::move(icons)) {}

  // A PNG's or an SVG's bytes; never nil.
  std::optional<NSData> bestFittingImageDataForSize(NSSize size,
                                                    bool& shouldTransformToAppIcon) const override;

 private:
  std::optional<NSData> imageOf(const std::string& icon, int side) const;

  const std::shared_ptr<const IconTheme> _icons;
};

}  // namespace skein
