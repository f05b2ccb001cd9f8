#pragma once

#include <array>
#include <compare>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

namespace skein::vald {

// What contents are addressed by: their SHA-256. A value; any thread.
class ContentHash {
 public:
  using Bytes = std::array<std::uint8_t, 32>;

  ContentHash() = default;
  explicit ContentHash(const Bytes& bytes) : _bytes(bytes) {}
  // Exactly 64 lower-case hexadecimal digits; nil for anything else.
  static std::optional<ContentHash> parse(std::string_view text);

  std::string asString() const;
  const Bytes& bytes() const { return _bytes; }

  friend auto operator<=>(const ContentHash&, const ContentHash&) = default;

 private:
  Bytes _bytes{};
};

// The keyed hash of a short text (HMAC with SHA-256): only who has the key can make it. Any thread.
ContentHash keyedHash(std::string_view key, std::string_view text);

// Hashes a stream. One thread at a time.
class ContentHasher {
 public:
  ContentHasher();
  ~ContentHasher();
  ContentHasher(const ContentHasher&) = delete;
  ContentHasher& operator=(const ContentHasher&) = delete;

  void update(const void* data, std::size_t size);
  // Ends the stream: no update after this.
  ContentHash finish();

 private:
  struct Context;
  std::unique_ptr<Context> _context;
};

}  // namespace skein::vald
