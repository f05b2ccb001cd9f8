#pragma once

#include <string>
#include <vector>

namespace skein::thumbnailer {

// From now on this thread, and those that it starts, can open files below these folders
// alone, and those for reading. For good; the process must have given up new privileges.
// Folders that do not exist are left out. False where the kernel cannot do that (Landlock).
bool confineFilesTo(const std::vector<std::string>& folders);

}  // namespace skein::thumbnailer
