#pragma once

#include <string>

#include "platform/foundation/NSFileCoordinatorReadingOptions.h"

namespace skein {

// VLFileCoordinatorReadingOptionsPrettyPrint: the options' names for the log, joined by
// "|", bits without a name in hexadecimal at the end; "none" for 0. Pure; any thread.
std::string VLFileCoordinatorReadingOptionsPrettyPrint(NSFileCoordinatorReadingOptions options);

}  // namespace skein
