#pragma once

#include <string>

#include "platform/foundation/NSError.h"

namespace skein::vald {

// The journal of operations and the cloud's notes name documents by absolute paths. When the
// drive's folder was renamed or moved since vald served it last, they are made to say where
// the documents are now: what a crash left is then found, and history too.
//
// Before these databases are opened, by the one vald of the drive. `store` is where the drive
// is now; where it was is noted in the state folder, and this notes `store` there. An error
// that names the file: it stands as it was, and the next start tries again.
NSErrorPtr followMovedDrive(const std::string& stateDirectory, const std::string& cloudDirectory,
                            const std::string& store);

}  // namespace skein::vald
