#include "platform/log/Description.h"

namespace skein {

std::string description(const NSURL& url) { return url.absoluteString(); }

std::string description(const NSData& data) {
  constexpr std::string_view kDigits = "0123456789abcdef";
  std::string text = "<";
  for (const std::uint8_t byte : data.span()) {
    text += kDigits[byte >> 4];
    text += kDigits[byte & 15];
  }
  return text + ">";
}

std::string description(const NSError& error) {
  std::string text = error.domain() + " " + std::to_string(error.code());
  if (const std::string words = error.localizedDescription(); !words.empty()) {
    text += " \"" + words + "\"";
  }
  if (const NSErrorPtr underlying = error.underlyingError()) {
    text += " {" + description(*underlying) + "}";
  }
  return text;
}

std::string description(const NSFileProviderItem& item) {
  return "<" + item.itemIdentifier() + " \"" + item.filename() + "\">";
}

}  // namespace skein
