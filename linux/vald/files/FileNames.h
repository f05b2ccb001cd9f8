// Which names documents and folders may have in a store.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

#include "platform/foundation/NSError.h"

namespace skein::vald {

inline constexpr std::size_t kLongestName = 255;  // bytes
// How many folders lie in one another at most, below a root or in what is brought in. Deeper
// ones can be removed, and nothing else.
inline constexpr std::size_t kDeepestTree = 1000;

// What this system puts into a store's folders for a moment, when it has no place on the
// same volume outside: an import that is under way, and a tree that is being removed.
inline constexpr char kImportPrefix[] = ".skein-import-";
inline constexpr char kRemovalPrefix[] = ".skein-removed-";
bool isStagingName(std::string_view name);

// What it puts beside a document NAME that comes from the cloud or goes there, as ".NAME" and
// one of these (see EvictionMarker.h).
inline constexpr std::string_view kPartSuffix = ".skein-part";
inline constexpr std::string_view kFreshSuffix = ".skein-new";
inline constexpr std::string_view kAsideSuffix = ".skein-old";

// The one table of names that this system uses itself, in any folder of a store: those above,
// and ".Trash-<number>". No operation gives one to an item, and the index leaves them out. What
// such a name is for, in words; null for every other name.
const char* useOfReservedName(std::string_view name);

// ".Trash" or ".Trash-<number>": a trash where it is at a store's root.
bool isTrashName(std::string_view name);
std::string trashFolderName(uid_t user);

// Null when `name` may be given to an item; else NSFileWriteInvalidFileNameError with
// words that say why: empty, ".", "..", with a separator or a NUL, over 255 bytes, a
// reserved name, or, `atStoreRoot`, ".Trash". Touches nothing.
NSErrorPtr refusalOfName(const std::string& name, bool atStoreRoot);

// "name 2.ext": the name with a number before its extension (nothing for 1), shortened
// at a character's boundary so that it and `room` more bytes fit into a name. A leading
// dot begins no extension; "name.tar.gz" keeps ".tar.gz".
std::string numberedName(const std::string& name, unsigned number, char separator,
                         std::size_t room = 0);

// The components of a relative path; an empty path has none.
std::vector<std::string> pathComponents(const std::string& path);

// What is before and after the last separator; the parent of a lone name is empty.
std::string parentOfPath(const std::string& path);
std::string nameOfPath(const std::string& path);
// `folder`/`name`, or `name` when the folder is empty.
std::string joinPath(const std::string& folder, const std::string& name);
// Whether `path` is `folder` or lies below it. Both absolute, or both relative.
bool isAtOrBelow(const std::string& path, const std::string& folder);

}  // namespace skein::vald
