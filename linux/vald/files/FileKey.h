#pragma once

#include <sys/stat.h>

#include <cstdint>
#include <string>

namespace skein::vald {

// What tells one file of a file system from every other, also from one that gets the same
// inode number later. Asking for the generation costs a system call of its own, so a first
// scan leaves a document's open (0) and keeps its birth time, which tells the rest.
struct FileKey {
  std::uint64_t inode = 0;
  std::uint32_t generation = 0;  // 0: not asked for
  std::int64_t born = 0;         // nanoseconds since 1970; 0: the file system does not know

  // Whether both are the same file.
  bool names(const FileKey& other) const {
    if (inode == 0 || inode != other.inode) return false;
    if (generation != 0 && other.generation != 0) return generation == other.generation;
    return born == other.born;
  }
};

// The key of an entry of an open folder, whatever it is and without following it; an empty
// name is the open descriptor's own. 0 or an errno.
int readFileKey(int folder, const std::string& name, FileKey& key);

// The key's parts. `flags`: as for name_to_handle_at. 0 when the file system has none.
std::uint32_t fileGeneration(int folder, const char* name, int flags, std::uint64_t inode);
// In nanoseconds since 1970, the nearest that can be told.
std::int64_t nanosecondsOf(const struct statx_timestamp& time);
std::int64_t fileBirth(const struct statx& status);

}  // namespace skein::vald
