#pragma once

#include <charconv>
#include <optional>
#include <string_view>

namespace skein {

// The whole of `text` as a decimal number; nothing when it is none, or too large.
template <class Number>
std::optional<Number> parseNumber(std::string_view text) {
  Number number{};
  const char* const end = text.data() + text.size();
  const auto [parsed, error] = std::from_chars(text.data(), end, number);
  if (error != std::errc() || parsed != end || text.empty()) return std::nullopt;
  return number;
}

}  // namespace skein
