#include "linux/vald/UploadPolicy.h"

#include <charconv>
#include <cstdlib>

namespace skein::vald {

UploadPolicy UploadPolicy::parse(const std::string& text) {
  using Uploads = LocalCloudStatus::Uploads;
  if (text == "off") return {Uploads::Off, 0};
  if (text == "unlimited") return {Uploads::Unlimited, 0};
  std::uint64_t mebibytes = 0;
  const char* end = text.data() + text.size();
  const auto [read, failure] = std::from_chars(text.data(), end, mebibytes);
  if (text.empty() || read != end || failure != std::errc() || mebibytes > (UINT64_MAX >> 20)) {
    return {};
  }
  return {Uploads::Bounded, mebibytes << 20};
}

UploadPolicy UploadPolicy::fromEnvironment() {
  const char* text = std::getenv("SKEIN_UPLOADS");
  return parse(text != nullptr ? text : "");
}

bool UploadPolicy::isSet() {
  const char* text = std::getenv("SKEIN_UPLOADS");
  return text != nullptr && *text != '\0';
}

}  // namespace skein::vald
