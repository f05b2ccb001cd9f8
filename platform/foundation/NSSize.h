#pragma once

namespace skein {

// A size in points.
struct NSSize {
  double width = 0;
  double height = 0;

  friend bool operator==(const NSSize&, const NSSize&) = default;
};

}  // namespace skein
