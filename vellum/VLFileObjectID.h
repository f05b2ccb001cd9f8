#pragma once

#include <compare>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

namespace skein {

// The daemon's identifier of a file or folder. Documents are known by a number of
// their own, folders and aliases by their inode. A value; any thread.
class VLFileObjectID {
 public:
  static VLFileObjectID documentWithRawID(std::uint64_t rawID) { return {Kind::Document, rawID}; }
  static VLFileObjectID folderOrAliasWithRawID(std::uint64_t rawID) { return {Kind::Inode, rawID}; }

  // Parses exactly what asString gives: "d" or "i" and 16 lower-case hexadecimal
  // digits. nil for anything else, nil included.
  static std::optional<VLFileObjectID> fileObjectIDWithString(
      const std::optional<std::string>& string);

  std::string asString() const;
  std::uint64_t rawID() const { return _rawID; }
  bool isFolderOrAliasID() const { return _kind == Kind::Inode; }

  friend auto operator<=>(const VLFileObjectID&, const VLFileObjectID&) = default;

 private:
  enum class Kind : char { Document = 'd', Inode = 'i' };
  VLFileObjectID(Kind kind, std::uint64_t rawID) : _kind(kind), _rawID(rawID) {}

  Kind _kind;
  std::uint64_t _rawID;
};

std::string description(const VLFileObjectID& fileObjectID);

}  // namespace skein

template <>
struct std::hash<skein::VLFileObjectID> {
  std::size_t operator()(const skein::VLFileObjectID& id) const noexcept {
    return std::hash<std::uint64_t>()(id.rawID() ^ (id.isFolderOrAliasID() ? ~0ULL : 0ULL));
  }
};
