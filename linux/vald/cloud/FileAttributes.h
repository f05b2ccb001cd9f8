#pragma once

#include <string>

#include "linux/vald/cloud/UploadStamp.h"
#include "linux/vald/files/FileLayer.h"
#include "platform/foundation/NSError.h"

namespace skein::vald {

// Gives `to` the extended attributes of `from` (tags and access lists among them), its group,
// its times and `mode`, so that it can take the place of `from`. Attributes that the system
// gives by its own rules ("security.", "trusted.") stay out. Null, or the error with `path`.
NSErrorPtr copyFileAttributes(FileLayer& files, int from, int to, mode_t mode,
                              const std::string& path);

}  // namespace skein::vald
