#pragma once

#include <cstddef>

#include "platform/fileprovider/NSFileProviderItem.h"

namespace skein {

// How many bytes a page holds, roughly.
inline constexpr std::size_t kPageBytes = std::size_t{4} << 20;
// The same for an answer that has no further page. Still well below what a client reads.
inline constexpr std::size_t kAnswerBytes = std::size_t{32} << 20;

// The room in one answer that holds many values: whoever gathers them ends it at the first
// that does not fit, so that every answer can be sent, whatever is in the store.
class AnswerRoom {
 public:
  explicit AnswerRoom(std::size_t bytes = kPageBytes) : _most(bytes) {}

  // Takes the room of one value with so many bytes of text and data. False when there is not
  // that much left. The first value always fits: what is larger would never be told.
  bool take(std::size_t bytes) {
    const bool isFirst = _taken == 0;
    _taken += bytes + kBytesPerValue;
    return isFirst || _taken <= _most;
  }

 private:
  // What a value needs beside its texts.
  static constexpr std::size_t kBytesPerValue = 256;

  const std::size_t _most;
  std::size_t _taken = 0;
};

// How many bytes of text and data an item has; none for null.
inline std::size_t bytesOf(const NSFileProviderItemPtr& item) {
  if (!item) return 0;
  const auto tags = item->tagData();
  return item->filename().size() + item->typeIdentifier().value_or("").size() +
         (tags ? tags->length() : 0);
}

}  // namespace skein
