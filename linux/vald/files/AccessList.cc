#include "linux/vald/files/AccessList.h"

#include <utility>

namespace skein::vald {
namespace {

// The version in four bytes, then entries: tag and permissions in two bytes each, and a user or
// group in four. Everything begins with the lowest byte.
constexpr std::size_t kHeader = 4;
constexpr std::size_t kEntry = 8;
constexpr char kVersion[] = {2, 0, 0, 0};
constexpr unsigned kAll = 7;

}  // namespace

AccessList::AccessList(std::string bytes) : _bytes(std::move(bytes)) {
  const bool isKnown = _bytes.size() > kHeader && (_bytes.size() - kHeader) % kEntry == 0 &&
                       _bytes.compare(0, kHeader, kVersion, kHeader) == 0;
  if (!isKnown) _bytes.clear();
}

std::size_t AccessList::find(Tag tag) const {
  const auto wanted = static_cast<std::uint16_t>(tag);
  for (std::size_t at = kHeader; at < _bytes.size(); at += kEntry) {
    const auto low = static_cast<unsigned char>(_bytes[at]);
    const auto high = static_cast<unsigned char>(_bytes[at + 1]);
    if ((low | high << 8) == wanted) return at;
  }
  return std::string::npos;
}

unsigned AccessList::permissions(std::size_t entry) const {
  return static_cast<unsigned char>(_bytes[entry + 2]) & kAll;
}

unsigned AccessList::groupPermissions() const {
  const std::size_t group = find(Tag::Group);
  const std::size_t mask = find(Tag::Mask);
  if (group == std::string::npos) return 0;
  return permissions(group) & (mask == std::string::npos ? kAll : permissions(mask));
}

void AccessList::limitGroup(unsigned most) {
  const std::size_t group = find(Tag::Group);
  if (group == std::string::npos) return;
  _bytes[group + 2] = static_cast<char>(permissions(group) & most);
}

}  // namespace skein::vald
