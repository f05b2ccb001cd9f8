#include "linux/vald/thumbnails/PngText.h"

#include <array>
#include <cstdint>

namespace skein::vald {
namespace {

using namespace std::string_view_literals;

// A PNG file is a signature and chunks: length, four letters, data, checksum. The first
// chunk is the head, of a fixed length.
constexpr std::string_view kSignature = "\x89PNG\r\n\x1a\n"sv;
constexpr std::size_t kAroundData = 12;
constexpr std::size_t kHeadData = 13;
constexpr std::size_t kBehindHead = kSignature.size() + kAroundData + kHeadData;

std::string bigEndian(std::uint32_t number) {
  std::string bytes;
  for (int shift = 24; shift >= 0; shift -= 8) bytes += static_cast<char>(number >> shift);
  return bytes;
}

std::uint32_t numberAt(std::string_view bytes) {
  std::uint32_t number = 0;
  for (std::size_t at = 0; at < 4; ++at) {
    number = number << 8 | static_cast<unsigned char>(bytes[at]);
  }
  return number;
}

std::uint32_t checksum(std::string_view bytes) {
  std::uint32_t crc = 0xffffffff;
  for (const char byte : bytes) {
    crc ^= static_cast<unsigned char>(byte);
    for (int bit = 0; bit < 8; ++bit) crc = crc >> 1 ^ ((crc & 1) != 0 ? 0xedb88320 : 0);
  }
  return ~crc;
}

std::string textChunk(const std::string& keyword, const std::string& value) {
  const std::string data = keyword + '\0' + value;
  const std::string named = "tEXt" + data;
  return bigEndian(static_cast<std::uint32_t>(data.size())) + named + bigEndian(checksum(named));
}

bool startsAsPng(std::string_view bytes) {
  return bytes.starts_with(kSignature) && bytes.size() >= kBehindHead &&
         numberAt(bytes.substr(kSignature.size())) == kHeadData &&
         bytes.substr(kSignature.size() + 4, 4) == "IHDR";
}

}  // namespace

std::string pngWithTexts(std::string_view png, const PngTexts& texts) {
  if (!startsAsPng(png)) return {};
  std::string result(png.substr(0, kBehindHead));
  for (const auto& [keyword, value] : texts) result += textChunk(keyword, value);
  result += png.substr(kBehindHead);
  return result;
}

std::optional<std::string> pngText(std::string_view head, std::string_view keyword) {
  if (!startsAsPng(head)) return std::nullopt;
  std::string_view rest = head.substr(kBehindHead);
  while (rest.size() >= kAroundData) {
    const std::size_t length = numberAt(rest);
    const std::string_view name = rest.substr(4, 4);
    if (name == "IDAT" || length > rest.size() - kAroundData) return std::nullopt;
    const std::string_view data = rest.substr(8, length);
    if (name == "tEXt" && data.size() > keyword.size() && data.starts_with(keyword) &&
        data[keyword.size()] == '\0') {
      return std::string(data.substr(keyword.size() + 1));
    }
    rest.remove_prefix(kAroundData + length);
  }
  return std::nullopt;
}

}  // namespace skein::vald
