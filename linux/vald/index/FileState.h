#pragma once

#include <cstdint>

#include "linux/vald/files/FileKey.h"
#include "vellum/VLQueryItem.h"

namespace skein::vald {

using ItemKind = VLQueryItem::Kind;

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
