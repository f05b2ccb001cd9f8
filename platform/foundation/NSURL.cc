#include "platform/foundation/NSURL.h"

#include <string_view>
#include <utility>

namespace skein {
namespace {

std::string withoutTrailingSeparators(std::string path) {
  while (path.size() > 1 && path.back() == '/') path.pop_back();
  return path;
}

}  // namespace

NSURL::NSURL(std::string path) : _path(withoutTrailingSeparators(std::move(path))) {}

NSURLPtr NSURL::URLWithString(std::string string) {
  const auto colon = string.find(':');
  if (colon == std::string::npos || colon == 0 || string.starts_with("file:")) return nullptr;
  return NSURLPtr(new NSURL({}, std::move(string)));
}

std::string NSURL::lastPathComponent() const {
  if (_path == "/") return _path;
  return _path.substr(_path.rfind('/') + 1);
}

NSURLPtr NSURL::URLByAppendingPathComponent(const std::string& component) const {
  return fileURLWithPath(_path == "/" ? _path + component : _path + '/' + component);
}

NSURLPtr NSURL::URLByDeletingLastPathComponent() const {
  const auto separator = _path.rfind('/');
  if (separator == std::string::npos || separator == 0) return fileURLWithPath("/");
  return fileURLWithPath(_path.substr(0, separator));
}

std::string NSURL::absoluteString() const {
  if (!isFileURL()) return _address;
  constexpr std::string_view kPlain =
      "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789-._~/!$&'()*+,;=:@";
  constexpr std::string_view kDigits = "0123456789ABCDEF";
  std::string text = "file://";
  for (const char c : _path) {
    if (kPlain.find(c) != std::string_view::npos) {
      text += c;
    } else {
      const auto byte = static_cast<unsigned char>(c);
      text += '%';
      text += kDigits[byte >> 4];
      text += kDigits[byte & 15];
    }
  }
  return text;
}

bool isEqualURL(const NSURLPtr& a, const NSURLPtr& b) {
  if (!a || !b) return a == b;
  return *a == *b;
}

}  // namespace skein
