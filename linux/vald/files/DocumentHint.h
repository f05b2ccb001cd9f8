// What tells a document's number beside the index: an attribute of its file, written when
// the document first gets something that must survive the index's loss. Attributes travel
// with copies, so the hint names its own file: as long as that is there, another file with the
// same hint is a copy.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

namespace skein::vald {

inline constexpr char kHintAttribute[] = "user.skein.document";

struct DocumentHint {
  std::uint64_t document = 0;
  // The file's, as in its FileKey.
  std::uint64_t inode = 0;
  std::uint32_t generation = 0;  // 0: the file system tells none

  std::string asText() const;
  // Nil for what asText() does not write, and for document 0.
  static std::optional<DocumentHint> parse(const std::string& text);
};

}  // namespace skein::vald
