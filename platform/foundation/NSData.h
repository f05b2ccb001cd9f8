// Bytes. Immutable, compared by value; where the platform passes nil, an
// std::optional<NSData> does.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <optional>
#include <span>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/foundation/NSURL.h"

namespace skein {

class NSData {
 public:
  NSData() = default;
  explicit NSData(std::span<const std::uint8_t> bytes) : _bytes(bytes.begin(), bytes.end()) {}
  explicit NSData(std::string_view text) : _bytes(text.begin(), text.end()) {}

  // dataWithContentsOfURL: the whole file, in one piece; nil when it cannot be read, and
  // for a null URL. Blocks.
  static std::optional<NSData> dataWithContentsOfURL(const NSURLPtr& url);

  std::size_t length() const { return _bytes.size(); }
  const std::uint8_t* bytes() const { return _bytes.data(); }
  std::span<const std::uint8_t> span() const { return _bytes; }
  std::string_view view() const {
    return {reinterpret_cast<const char*>(_bytes.data()), _bytes.size()};
  }

  // Copies the first `length` bytes to `buffer`; what the data lacks reads as zero.
  void getBytes(void* buffer, std::size_t length) const {
    const std::size_t present = length < _bytes.size() ? length : _bytes.size();
    std::memset(buffer, 0, length);
    if (present > 0) std::memcpy(buffer, _bytes.data(), present);
  }

  bool isEqualToData(const NSData& other) const { return _bytes == other._bytes; }
  friend bool operator==(const NSData&, const NSData&) = default;

 private:
  std::vector<std::uint8_t> _bytes;
};

}  // namespace skein
