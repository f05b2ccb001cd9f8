#pragma once

#include <sys/stat.h>

#include <functional>
#include <string>
#include <vector>

#include "linux/vald/cloud/Cancellation.h"
#include "linux/vald/cloud/EvictionMarker.h"
#include "linux/vald/files/StoreRoots.h"

namespace skein::vald {

// What a walk does about a folder or a file that cannot be read.
enum class Unreadable : std::uint8_t { Stops, IsSkipped };

// Calls `each` with every entry below the roots, those in the trash and in hidden folders
// included. No symbolic link is followed. What comes or goes meanwhile may or may not be seen.
// An error: of `each`, the cancellation, or of what could not be read; then not all was seen. Any
// thread; blocks.
using EachEntry =
    std::function<NSErrorPtr(const std::string& folderPath, const DirectoryHandle& folder,
                             const std::string& name, const struct stat& status)>;
NSErrorPtr walkEntries(const StoreRoots& roots, Unreadable unreadable,
                       const Cancellation& cancellation, const EachEntry& each);

// The same with every marker of this user's, and the path of the document that it stands for;
// also with those that are not believed when somebody asks for their contents. Looks through
// `otherFolders`, absolute paths, as well, where they are there and this user's. Stops at what
// cannot be read.
using EachMarker =
    std::function<NSErrorPtr(const std::string& documentPath, const EvictionMarker& marker)>;
NSErrorPtr walkMarkers(const StoreRoots& roots, const std::vector<std::string>& otherFolders,
                       const Cancellation& cancellation, const EachMarker& each);

}  // namespace skein::vald
