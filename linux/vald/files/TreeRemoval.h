#pragma once

#include <functional>
#include <string>

#include "linux/vald/files/DirectoryHandle.h"
#include "linux/vald/files/FileLayer.h"
#include "platform/foundation/NSError.h"

namespace skein::vald {

// Null when a file or tree can be removed whole; else the first thing in the way: a folder
// that may not be written, or another volume mounted inside. Looked for before anything is
// touched, so that no tree is left half removed. `goesOn` is asked before each folder; false
// cancels.
NSErrorPtr obstacleToRemoval(const DirectoryHandle& folder, const std::string& name,
                             const std::string& path, const std::function<bool()>& goesOn);

// Deletes a file or tree. 0, also when there is none, or the first errno; it goes on past
// what cannot be deleted, so that as little as possible stays. Never leaves the volume.
int removeTree(FileLayer& files, const DirectoryHandle& folder, const std::string& name);

}  // namespace skein::vald
