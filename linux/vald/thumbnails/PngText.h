#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace skein::vald {

// Text beside the pixels of a PNG file: keywords and values, in Latin-1.
using PngTexts = std::vector<std::pair<std::string, std::string>>;

// The file with the texts put in behind its head. Empty for what is no PNG file.
std::string pngWithTexts(std::string_view png, const PngTexts& texts);

// The value of a keyword, when its text stands in front of the pixels and the head of the
// file, as far as it is given, is well formed.
std::optional<std::string> pngText(std::string_view head, std::string_view keyword);

}  // namespace skein::vald
