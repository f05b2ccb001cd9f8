#pragma once

#include <string>
#include <vector>

#include "platform/foundation/NSError.h"

namespace skein::vald {

// Null when `path` may name an item below one of `roots` (absolute folders): it is
// absolute, has no empty, "." or ".." component and no NUL, lies in a root, and no folder
// on the way from there is a symbolic link. Otherwise NSCocoaErrorDomain 4 with the reason.
// Whether the item itself exists, or is a link, is not asked. Looks at the disk.
NSErrorPtr checkDrivePath(const std::string& path, const std::vector<std::string>& roots);

// NSCocoaErrorDomain 4: no such file, with `reason` as its description.
NSErrorPtr noSuchFile(const std::string& reason);

}  // namespace skein::vald
