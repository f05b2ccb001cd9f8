// The one table of names that this system uses itself in the folders of a store, for whoever makes
// them, refuses them and leaves them out.
#pragma once

#include <string_view>

namespace skein {

// For a moment, when there is no place on the same volume outside: a copy that is on its way in,
// and a tree that is being removed.
inline constexpr char kImportPrefix[] = ".skein-import-";
inline constexpr char kRemovalPrefix[] = ".skein-removed-";
bool isStagingName(std::string_view name);

// Beside a document NAME that comes from the cloud or goes there, as ".NAME" and one of these.
inline constexpr std::string_view kPartSuffix = ".skein-part";
inline constexpr std::string_view kFreshSuffix = ".skein-new";
inline constexpr std::string_view kAsideSuffix = ".skein-old";

// ".Trash" or ".Trash-<number>": a trash where it is at a store's root.
bool isTrashName(std::string_view name);

// What such a name is for, in words, in any folder of a store: those above, and ".Trash-<number>".
// No operation gives one to an item, and the index leaves them out. Null for every other name.
const char* useOfReservedName(std::string_view name);

}  // namespace skein
