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
  int length = 0;
  if (std::sscanf(text.c_str(), "1 %16" SCNx64 " %" SCNu64 " %" SCNu32 "%n", &hint.document,
                  &hint.inode, &hint.generation, &length) != 3 ||
      static_cast<std::size_t>(length) != text.size() || hint.document == 0) {
    return std::nullopt;
  }
  return hint;
}

}  // namespace skein::vald
