#include "support/NSString+PortfolioAdditions.h"

#include <cstdio>

namespace skein {

std::string vl_stringWithSize(NSSize size) {
  // The largest double has 309 digits before the point.
  char text[2 * 320];
  std::snprintf(text, sizeof text, "{%.2f, %.2f}", size.width, size.height);
  return text;
}

}  // namespace skein
