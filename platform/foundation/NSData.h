// Bytes. Immutable, compared by value; where the platform passes nil, an
// std::optional<NSData> does. A copy shares the bytes, whichever thread it goes to.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <memory>
#include <optional>
#include <span>
#include <string_view>
#include <utility>

#include "platform/foundation/NSURL.h"

namespace skein {

class NSData {
 public:
  NSData() = default;
  explicit NSData(std::span<const std::uint8_t> bytes) : NSData(bytes.data(), bytes.size()) {}
  explicit NSData(std::string_view text) : NSData(text.data(), text.size()) {}
  NSData(const NSData&) = default;
  NSData& operator=(const NSData&) = default;
  NSData(NSData&& other) noexcept
      : _bytes(std::move(other._bytes)), _length(std::exchange(other._length, 0)) {}
  NSData& operator=(NSData&& other) noexcept {
    _bytes = std::move(other._bytes);
    _length = std::exchange(other._length, 0);
    return *this;
  }

  // dataWithContentsOfURL: the whole file, in one piece; nil when it cannot be read, and
  // for a null URL. Blocks.
  static std::optional<NSData> dataWithContentsOfURL(const NSURLPtr& url);

  std::size_t length() const { return _length; }
  // Null when there are none.
  const std::uint8_t* bytes() const { return _bytes.get(); }
  std::span<const std::uint8_t> span() const { return {bytes(), _length}; }
  std::string_view view() const { return {reinterpret_cast<const char*>(bytes()), _length}; }

  // Copies the first `length` bytes to `buffer`; what the data lacks reads as zero.
  void getBytes(void* buffer, std::size_t length) const {
    const std::size_t present = length < _length ? length : _length;
    std::memset(buffer, 0, length);
    if (present > 0) std::memcpy(buffer, bytes(), present);
  }

  bool isEqualToData(const NSData& other) const { return view() == other.view(); }
  friend bool operator==(const NSData& a, const NSData& b) { return a.isEqualToData(b); }

 private:
  static std::optional<NSData> dataWithRestOfFile(int file, std::size_t expected);

  NSData(const void* bytes, std::size_t length) : _length(length) {
    if (length == 0) return;
    auto own = std::make_shared_for_overwrite<std::uint8_t[]>(length);
    std::memcpy(own.get(), bytes, length);
    _bytes = std::move(own);
  }

  std::shared_ptr<const std::uint8_t[]> _bytes;
  std::size_t _length = 0;
};

}  // namespace skein
