// An item's tags as the host passes them on: bytes that only the two functions here know.
//
//   format (1 byte): 1
//   per tag:         color (1), length of the label (2, low byte first), label
//
// The whole data is well formed or it is nothing: another format, a color that there is
// not, an empty label or a missing byte makes it data without tags.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "platform/foundation/NSData.h"

namespace skein {

// A tag that a person gave an item.
struct FPTag {
  enum class Color : std::uint8_t { None, Gray, Green, Purple, Blue, Yellow, Red, Orange };

  // The tag's name, as bytes; never empty.
  std::string label;
  Color color = Color::None;

  friend bool operator==(const FPTag&, const FPTag&) = default;
};

// FPGetTagsFromTagsData: the tags in the data's order. None for nil, for empty data and
// for data that is not well formed. Pure; any thread.
std::vector<FPTag> FPGetTagsFromTagsData(const std::optional<NSData>& tagsData);

// The data of `tags`, which FPGetTagsFromTagsData gives back. nil when a tag cannot be
// written: its label is empty or longer than 65,535 bytes.
std::optional<NSData> FPGetTagsDataFromTags(const std::vector<FPTag>& tags);

}  // namespace skein
