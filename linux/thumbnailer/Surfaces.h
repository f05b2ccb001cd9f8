// What the decoders share that draw a page.
#pragma once

#include <cstdint>

#include "linux/thumbnailer/Decoders.h"

namespace skein::thumbnailer {

// A size within `side` by `side` with the given proportions; each at least 1.
struct FittedSize {
  int width = 1;
  int height = 1;
};
FittedSize fittedSize(double width, double height, std::uint32_t side);

// White paper to draw on; no pointer when there is no memory for it.
struct Paper {
  explicit Paper(FittedSize size);

  SurfacePtr surface;
  ContextPtr context;
};

// The paper's pixels when all that was drawn on it succeeded.
Decoded pixelsOf(const Paper& paper);

}  // namespace skein::thumbnailer
