#include "linux/vald/cloud/EvictionMarker.h"

#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <charconv>
#include <string_view>

#include "linux/vald/cloud/CloudErrors.h"
#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"

namespace skein::vald {
namespace {

constexpr std::string_view kFirstLine = "skein-marker 1";
constexpr std::string_view kSuffix = ".skein";
constexpr std::size_t kLongestPlainName = 240;
constexpr std::size_t kLargestMarker = 4096;

// Bytes that would end a line or a word, and "%" itself, as "%" and two digits.
std::string escaped(std::string_view text) {
  static constexpr char kDigits[] = "0123456789abcdef";
  std::string result;
  for (const char c : text) {
    const auto byte = static_cast<unsigned char>(c);
    if (byte > 0x20 && byte != 0x7f && c != '%') {
      result += c;
    } else {
      result += '%';
      result += kDigits[byte >> 4];
      result += kDigits[byte & 15];
    }
  }
  return result;
}

std::optional<std::string> unescaped(std::string_view text) {
  std::string result;
  for (std::size_t at = 0; at < text.size(); ++at) {
    if (text[at] != '%') {
      result += text[at];
      continue;
    }
    unsigned byte = 0;
    if (at + 2 >= text.size()) return std::nullopt;
    const char* end = text.data() + at + 3;
    if (std::from_chars(text.data() + at + 1, end, byte, 16).ptr != end) return std::nullopt;
    result += static_cast<char>(byte);
    at += 2;
  }
  return result;
}

template <class T>
std::optional<T> number(std::string_view text, int base = 10) {
  T value{};
  const auto [end, failure] = std::from_chars(text.data(), text.data() + text.size(), value, base);
  if (failure != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return value;
}

std::optional<NSDate> date(std::string_view text) {
  const auto nanoseconds = number<std::int64_t>(text);
  if (!nanoseconds) return std::nullopt;
  return NSDate(std::chrono::nanoseconds(*nanoseconds));
}

// Takes one field; false when its value cannot be.
bool take(EvictionMarker& marker, std::string_view key, std::string_view value, unsigned& seen) {
  if (key == "document") {
    const auto document = VLFileObjectID::fileObjectIDWithString(std::string(value));
    if (!document || document->isFolderOrAliasID()) return false;
    marker.document = *document;
    seen |= 1;
  } else if (key == "hash") {
    const auto hash = ContentHash::parse(value);
    if (!hash) return false;
    marker.contents.hash = *hash;
    seen |= 2;
  } else if (key == "size") {
    const auto size = number<std::uint64_t>(value);
    if (!size) return false;
    marker.contents.size = *size;
    seen |= 4;
  } else if (key == "modified") {
    const auto modified = date(value);
    if (!modified) return false;
    marker.modified = *modified;
    seen |= 8;
  } else if (key == "mode") {
    const auto mode = number<mode_t>(value, 8);
    if (!mode) return false;
    marker.mode = *mode & 0777;
    seen |= 16;
  } else if (key == "created") {
    marker.created = date(value);
    return marker.created.has_value();
  } else if (key == "type") {
    marker.type = unescaped(value);
    return marker.type.has_value();
  } else if (key == "name") {
    marker.name = unescaped(value);
    return marker.name.has_value() && refusalOfName(*marker.name, false) == nullptr;
  } else if (key == "seal") {
    marker.seal = ContentHash::parse(value);
    return marker.seal.has_value();
  }
  return true;
}

}  // namespace

std::string EvictionMarker::asText(
    const std::function<ContentHash(std::string_view)>& makeSeal) const {
  const auto nanoseconds = [](NSDate when) {
    return std::to_string(when.time_since_epoch().count());
  };
  std::array<char, 16> octal{};
  std::to_chars(octal.data(), octal.data() + octal.size() - 1, mode & 0777, 8);
  std::string text(kFirstLine);
  text += "\ndocument " + document.asString() + "\nhash " + contents.hash.asString() + "\nsize " +
          std::to_string(contents.size) + "\nmodified " + nanoseconds(modified);
  if (created) text += "\ncreated " + nanoseconds(*created);
  text += std::string("\nmode ") + octal.data();
  if (type) text += "\ntype " + escaped(*type);
  if (name) text += "\nname " + escaped(*name);
  text += "\n";
  if (makeSeal) text += "seal " + makeSeal(text).asString() + "\n";
  return text + "end\n";
}

std::optional<EvictionMarker> EvictionMarker::parse(const std::string& text) {
  constexpr unsigned kAllSeen = 31;
  EvictionMarker marker;
  unsigned seen = 0;
  std::string_view left = text;
  bool first = true;
  while (!left.empty()) {
    const std::size_t end = left.find('\n');
    if (end == std::string_view::npos) return std::nullopt;
    const std::string_view line = left.substr(0, end);
    left.remove_prefix(end + 1);
    if (first && line != kFirstLine) return std::nullopt;
    if (line == "end")
      return seen == kAllSeen && left.empty() ? std::optional(marker) : std::nullopt;
    const std::size_t space = line.find(' ');
    if (marker.seal) return std::nullopt;  // nothing is said that it does not vouch for
    if (line.starts_with("seal ")) marker.sealed = text.substr(0, line.data() - text.data());
    if (!first && space != std::string_view::npos &&
        !take(marker, line.substr(0, space), line.substr(space + 1), seen)) {
      return std::nullopt;
    }
    first = false;
  }
  return std::nullopt;
}

MarkerNames::MarkerNames(const std::string& name) {
  std::string stem = name;
  if (name.size() > kLongestPlainName) {
    shortened = true;
    std::size_t cut = kLongestMarkerBeginning;
    // Not within a character: such a byte continues one.
    while (cut > 0 && (static_cast<unsigned char>(name[cut]) & 0xc0) == 0x80) --cut;
    ContentHasher hasher;
    hasher.update(name.data(), name.size());
    stem = name.substr(0, cut) + "~" + hasher.finish().asString().substr(0, 16);
  }
  stem.insert(0, ".");
  marker = stem + std::string(kSuffix);
  part = stem + std::string(kPartSuffix);
  fresh = stem + std::string(kFreshSuffix);
  aside = stem + std::string(kAsideSuffix);
}

bool mayBeMarkerName(const std::string& name) {
  return name.size() > 1 + kSuffix.size() && name[0] == '.' && name.ends_with(kSuffix) &&
         refusalOfName(documentNameOfMarker(name), false) == nullptr;
}

std::string nameOfDocument(const EvictionMarker& marker, const std::string& markerName) {
  if (marker.name && MarkerNames(*marker.name).marker == markerName) return *marker.name;
  return documentNameOfMarker(markerName);
}

std::string documentNameOfMarker(const std::string& markerName) {
  return markerName.substr(1, markerName.size() - 1 - kSuffix.size());
}

std::optional<EvictionMarker> readMarkerText(int file, int* unread) {
  struct stat status {};
  if (fstat(file, &status) != 0 || !S_ISREG(status.st_mode) || status.st_uid != geteuid()) {
    return std::nullopt;
  }
  std::string text(kLargestMarker + 1, '\0');
  ssize_t size = 0;
  do {
    size = pread(file, text.data(), text.size(), 0);
  } while (size < 0 && errno == EINTR);
  if (size < 0 && unread != nullptr) *unread = errno;
  if (size < 0 || static_cast<std::size_t>(size) > kLargestMarker) return std::nullopt;
  text.resize(static_cast<std::size_t>(size));
  return EvictionMarker::parse(text);
}

bool isDamagedMarker(int file) {
  struct stat status {};
  if (fstat(file, &status) != 0 || !S_ISREG(status.st_mode) || status.st_uid != geteuid()) {
    return false;
  }
  std::array<char, kFirstLine.size()> beginning{};
  const ssize_t size = pread(file, beginning.data(), beginning.size(), 0);
  return size == static_cast<ssize_t>(kFirstLine.size()) &&
         std::string_view(beginning.data(), beginning.size()) == kFirstLine;
}

Outcome<OpenMarker> openMarker(const DirectoryHandle& folder, const std::string& markerName,
                               const std::string& path) {
  FileDescriptor file;
  if (const int code = folder.openFile(markerName, file)) {
    return fileError(code, "can't open the marker of", path);
  }
  auto marker = readMarkerText(file.get());
  if (!marker) {
    return fileErrorWithWords(
        NSFileReadCorruptFileError, 0,
        "\"" + printable(markerName) + "\" has the name of a marker but is none; rename it", path);
  }
  return OpenMarker{std::move(*marker), std::move(file)};
}

}  // namespace skein::vald
