// Which names documents and folders may have in a store.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

#include "linux/protocol/ReservedNames.h"
#include "platform/foundation/NSError.h"

namespace skein::vald {

inline constexpr std::size_t kLongestName = 255;  // bytes
// How many folders lie in one another at most, below a root or in what is brought in. Deeper
// ones can be removed, and nothing else.
inline constexpr std::size_t kDeepestTree = 1000;

// The user's own trash at a root.
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
