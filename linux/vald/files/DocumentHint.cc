#include "linux/vald/files/DocumentHint.h"

#include <cinttypes>
#include <cstdio>

namespace skein::vald {

std::string DocumentHint::asText() const {
  char text[64];
  std::snprintf(text, sizeof text, "1 %016" PRIx64 " %" PRIu64 " %" PRIu32, document, inode,
                generation);
  return text;
}

std::optional<DocumentHint> DocumentHint::parse(const std::string& text) {
  DocumentHint hint;
  // This reads much else too (signs, blanks, numbers cut to fit): what it made of the text must
  // be written just so.
  const int count = std::sscanf(text.c_str(), "1 %16" SCNx64 " %" SCNu64 " %" SCNu32,
                                &hint.document, &hint.inode, &hint.generation);
  if (count != 3 || hint.document == 0 || hint.asText() != text) return std::nullopt;
  return hint;
}

}  // namespace skein::vald
