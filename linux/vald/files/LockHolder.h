#pragma once

#include <sys/stat.h>
#include <sys/types.h>

namespace skein::vald {

// The process that holds a lock of the file or folder, by the system's own list; 0 when unknown,
// as for locks that belong to no one process.
pid_t lockHolderOf(const struct stat& file);

}  // namespace skein::vald
