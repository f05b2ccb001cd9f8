// The freedesktop trash as text: names, and what a ".trashinfo" file says.
#pragma once

#include <ctime>
#include <optional>
#include <string>

namespace skein::vald {

inline constexpr char kTrashInfoSuffix[] = ".trashinfo";

struct TrashInfo {
  std::string path;          // where it was: relative to the trash's top, or absolute
  std::string deletionDate;  // "YYYY-MM-DDThh:mm:ss", local time
};

// Every byte but letters, digits and "-._~/" as "%XX".
std::string percentEncoded(const std::string& path);
// nil when a "%" is not followed by two hexadecimal digits, or a NUL would come out.
std::optional<std::string> percentDecoded(const std::string& text);

std::string localDeletionDate(std::time_t now);
std::string trashInfoText(const TrashInfo& info);
// nil for text that is no trash info. Other tools' files have keys of their own; the
// first of each key counts.
std::optional<TrashInfo> parseTrashInfo(const std::string& text);

// A place inside a trash at a store's root, by its path relative to that root.
struct TrashedPath {
  std::string trash;  // ".Trash-1000", or ".Trash/1000" where an administrator made one
  std::string name;   // of the trashed item, in "files"; empty for the trash's own folders
  std::string below;  // what follows, inside a trashed folder
};
// nil for a path outside every trash.
std::optional<TrashedPath> trashedPath(const std::string& relative);

}  // namespace skein::vald
