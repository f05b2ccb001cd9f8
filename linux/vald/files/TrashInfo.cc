#include "linux/vald/files/TrashInfo.h"

#include <algorithm>
#include <cstring>

#include "linux/vald/files/FileNames.h"

namespace skein::vald {
namespace {

int hexDigit(char c) {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  return -1;
}

bool isPlain(char c) {
  return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
         (c != '\0' && std::strchr("-._~/", c) != nullptr);
}

std::string trimmed(const std::string& text) {
  const std::size_t first = text.find_first_not_of(" \t\r");
  if (first == std::string::npos) return {};
  return text.substr(first, text.find_last_not_of(" \t\r") - first + 1);
}

}  // namespace

std::string percentEncoded(const std::string& path) {
  constexpr char kDigits[] = "0123456789ABCDEF";
  std::string text;
  for (const char c : path) {
    if (isPlain(c)) {
      text += c;
    } else {
      const auto byte = static_cast<unsigned char>(c);
      text += {'%', kDigits[byte >> 4], kDigits[byte & 15]};
    }
  }
  return text;
}

std::optional<std::string> percentDecoded(const std::string& text) {
  std::string path;
  for (std::size_t at = 0; at < text.size(); ++at) {
    if (text[at] == '\0') return std::nullopt;
    if (text[at] != '%') {
      path += text[at];
      continue;
    }
    if (at + 2 >= text.size()) return std::nullopt;
    const int high = hexDigit(text[at + 1]);
    const int low = hexDigit(text[at + 2]);
    if (high < 0 || low < 0 || (high == 0 && low == 0)) return std::nullopt;
    path += static_cast<char>(high * 16 + low);
    at += 2;
  }
  return path;
}

std::string localDeletionDate(std::time_t now) {
  struct tm local {};
  ::localtime_r(&now, &local);
  char text[32];
  std::strftime(text, sizeof(text), "%Y-%m-%dT%H:%M:%S", &local);
  return text;
}

std::string trashInfoText(const TrashInfo& info) {
  return "[Trash Info]\nPath=" + percentEncoded(info.path) + "\nDeletionDate=" + info.deletionDate +
         "\n";
}

std::optional<TrashInfo> parseTrashInfo(const std::string& text) {
  TrashInfo info;
  bool inGroup = false;
  bool hasPath = false;
  for (std::size_t at = 0; at < text.size();) {
    const std::size_t end = std::min(text.find('\n', at), text.size());
    const std::string line = trimmed(text.substr(at, end - at));
    at = end + 1;
    if (line.starts_with('[')) {
      if (inGroup) break;
      inGroup = line == "[Trash Info]";
      continue;
    }
    const std::size_t equals = line.find('=');
    if (!inGroup || equals == std::string::npos) continue;
    const std::string key = trimmed(line.substr(0, equals));
    const std::string value = trimmed(line.substr(equals + 1));
    if (key == "Path" && !hasPath) {
      const auto path = percentDecoded(value);
      if (!path || path->empty()) return std::nullopt;
      info.path = *path;
      hasPath = true;
    } else if (key == "DeletionDate" && info.deletionDate.empty()) {
      info.deletionDate = value;
    }
  }
  if (!hasPath) return std::nullopt;
  return info;
}

std::optional<TrashedPath> trashedPath(const std::string& relative) {
  std::vector<std::string> names = pathComponents(relative);
  if (names.empty() || !isTrashName(names.front())) return std::nullopt;
  TrashedPath place;
  place.trash = names.front();
  std::size_t at = 1;
  if (names.front() == ".Trash" && at < names.size()) place.trash += '/' + names[at++];
  if (at + 1 >= names.size() || names[at] != "files") return place;
  place.name = names[at + 1];
  for (at += 2; at < names.size(); ++at) place.below = joinPath(place.below, names[at]);
  return place;
}

}  // namespace skein::vald
