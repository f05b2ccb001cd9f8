#pragma once

#include <cstdint>

#include "vellum/VLQueryItem.h"

namespace skein::vald {

using ItemKind = VLQueryItem::Kind;

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

// What the disk says of one name in a folder. Times in nanoseconds since 1970.
struct FileState {
  ItemKind kind = ItemKind::Document;
  FileKey key;
  std::uint64_t size = 0;
  std::int64_t modified = 0;
  std::int64_t changed = 0;
  // The document is not present: `key` and `changed` are its marker's, the rest is what the
  // marker says, with the two fields below, which are known when the marker was just read.
  bool isEvicted = false;
  std::uint64_t markedDocument = 0;  // the document's number; 0: nobody knows
  std::int64_t markedBirth = 0;      // when the document was made; 0: nobody knows

  // Whether the same file looks the same: its contents are never read.
  bool looksLike(const FileState& other) const {
    return kind == other.kind && size == other.size && modified == other.modified &&
           changed == other.changed && isEvicted == other.isEvicted;
  }
};

}  // namespace skein::vald
