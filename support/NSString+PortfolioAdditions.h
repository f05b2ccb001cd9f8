// Category PortfolioAdditions on NSString. Pure functions, any thread.
#pragma once

#include <string>

#include "platform/foundation/NSSize.h"

namespace skein {

// vl_stringWithSize: "{%.2f, %.2f}", the width first.
std::string vl_stringWithSize(NSSize size);

}  // namespace skein
