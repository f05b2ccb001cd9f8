#include "vellum/VLFileObjectID.h"

#include <charconv>

namespace skein {
namespace {

constexpr std::size_t kDigits = 16;
constexpr std::string_view kHexadecimal = "0123456789abcdef";

}  // namespace

std::optional<VLFileObjectID> VLFileObjectID::fileObjectIDWithString(
    const std::optional<std::string>& string) {
  if (!string || string->size() != 1 + kDigits) return std::nullopt;
  const char letter = string->front();
  if (letter != static_cast<char>(Kind::Document) && letter != static_cast<char>(Kind::Inode)) {
    return std::nullopt;
  }
  const std::string_view digits = std::string_view(*string).substr(1);
  if (digits.find_first_not_of(kHexadecimal) != std::string_view::npos) return std::nullopt;
  std::uint64_t rawID = 0;
  std::from_chars(digits.data(), digits.data() + digits.size(), rawID, 16);
  return VLFileObjectID(static_cast<Kind>(letter), rawID);
}

std::string VLFileObjectID::asString() const {
  std::string text(1 + kDigits, static_cast<char>(_kind));
  for (std::size_t i = 0; i < kDigits; ++i) {
    text[kDigits - i] = kHexadecimal[(_rawID >> (4 * i)) & 15];
  }
  return text;
}

std::string description(const VLFileObjectID& fileObjectID) { return fileObjectID.asString(); }

}  // namespace skein
