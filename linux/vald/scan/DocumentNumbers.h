#pragma once

#include <cstdint>

#include "linux/vald/index/FileState.h"

namespace skein::vald {

// A fresh random number for a document. Any thread.
std::uint64_t drawDocumentNumber();

// The number of a folder or alias: its inode's generation and number where both fit, else
// a digest of them. `attempt` above 0 gives others, for when that one is taken.
std::uint64_t inodeNumber(const FileKey& key, std::uint32_t attempt);

}  // namespace skein::vald
