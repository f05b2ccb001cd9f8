#include "platform/fileprovider/FPTags.h"

#include <limits>
#include <span>

namespace skein {
namespace {

constexpr std::uint8_t kFormat = 1;
constexpr std::size_t kHeadSize = 3;  // of one tag: color and length

using Bytes = std::span<const std::uint8_t>;

// Takes the tag at the head of `rest`; nil when there is no well-formed one.
std::optional<FPTag> takeTag(Bytes& rest) {
  if (rest.size() < kHeadSize) return std::nullopt;
  const std::uint8_t color = rest[0];
  if (color > static_cast<std::uint8_t>(FPTag::Color::Orange)) return std::nullopt;
  const std::size_t length = rest[1] | static_cast<std::size_t>(rest[2]) << 8;
  rest = rest.subspan(kHeadSize);
  if (length == 0 || length > rest.size()) return std::nullopt;
  const Bytes label = rest.first(length);
  rest = rest.subspan(length);
  return FPTag{std::string(label.begin(), label.end()), static_cast<FPTag::Color>(color)};
}

}  // namespace

std::vector<FPTag> FPGetTagsFromTagsData(const std::optional<NSData>& tagsData) {
  if (!tagsData || tagsData->length() == 0) return {};
  Bytes rest = tagsData->span();
  if (rest.front() != kFormat) return {};
  rest = rest.subspan(1);
  std::vector<FPTag> tags;
  while (!rest.empty()) {
    std::optional<FPTag> tag = takeTag(rest);
    if (!tag) return {};
    tags.push_back(std::move(*tag));
  }
  return tags;
}

std::optional<NSData> FPGetTagsDataFromTags(const std::vector<FPTag>& tags) {
  std::vector<std::uint8_t> bytes{kFormat};
  for (const FPTag& tag : tags) {
    const std::size_t length = tag.label.size();
    if (length == 0 || length > std::numeric_limits<std::uint16_t>::max()) return std::nullopt;
    bytes.push_back(static_cast<std::uint8_t>(tag.color));
    bytes.push_back(static_cast<std::uint8_t>(length & 0xff));
    bytes.push_back(static_cast<std::uint8_t>(length >> 8));
    bytes.insert(bytes.end(), tag.label.begin(), tag.label.end());
  }
  return NSData(bytes);
}

}  // namespace skein
