#pragma once

#include <optional>
#include <string>

#include "linux/vald/cloud/CloudPlaces.h"

namespace skein::vald {

// A document that cannot come back.
struct LostDocument {
  std::string path;  // absolute, the document's own
  std::string why;
};

// Looks whether what the marker at `markerPath` stands for can come back: whether it is
// believed, and its contents are there and, unless it is to be quick, are what their hash says.
// Nil when it can, and for a file that is no marker of this user's or went meanwhile. Stops
// with nil when `observer` does. Any thread; blocks.
std::optional<LostDocument> checkMarker(const CloudPlaces& places, const std::string& markerPath,
                                        bool quick, StreamObserver& observer);

}  // namespace skein::vald
