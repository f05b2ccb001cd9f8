#include "platform/log/Description.h"

#include <cstdio>

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

std::string description(NSDate date) {
  using std::chrono::days;
  using std::chrono::floor;
  const auto seconds = floor<std::chrono::seconds>(date);
  const std::chrono::year_month_day day(floor<days>(seconds));
  const std::chrono::hh_mm_ss time(seconds - floor<days>(seconds));
  char text[64];
  std::snprintf(text, sizeof text, "%04d-%02u-%02u %02d:%02d:%02d +0000",
                static_cast<int>(day.year()), static_cast<unsigned>(day.month()),
                static_cast<unsigned>(day.day()), static_cast<int>(time.hours().count()),
                static_cast<int>(time.minutes().count()), static_cast<int>(time.seconds().count()));
  return text;
}

std::string description(std::int64_t number) { return std::to_string(number); }

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
