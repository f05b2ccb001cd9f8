// Tags where file managers keep them: "user.xdg.tags", UTF-8 with commas between.
#pragma once

#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "linux/vald/files/DirectoryHandle.h"
#include "linux/vald/files/FileKey.h"
#include "linux/vald/files/FileLayer.h"
#include "platform/foundation/NSError.h"

namespace skein::vald {

inline constexpr char kTagsAttribute[] = "user.xdg.tags";

enum class TagStorage {
  Kept,         // in the file's attribute
  Unsupported,  // the file system, or a link, has no attributes: the index alone keeps them
  Failed,       // see the error
};

struct TagResult {
  TagStorage storage = TagStorage::Kept;
  std::vector<std::string> names;  // what the file has now, in its order
  NSErrorPtr error;                // with Failed alone
};

// Null when all may be tags; else "invalid name" with words: empty, with a comma (the
// list's separator), with a NUL or another control character, or no UTF-8.
NSErrorPtr refusalOfTags(const std::vector<std::string>& names);

// The list as the attribute holds it, and back: what is empty is left out, repetitions too.
std::string joinTags(const std::vector<std::string>& names);
std::vector<std::string> splitTags(const std::string& value);

// The entry's tags. `path` is named by errors. Links are not followed.
TagResult readTags(const DirectoryHandle& folder, const std::string& name, const std::string& path);
// Replaces the whole set, in one step that is on the disk when this returns; no names
// removes the attribute. `written` (or null) is called between the two. What the file has
// already is neither written nor waited for. `asked`: another file of that name is left as it
// is, which is ESTALE.
TagResult writeTags(FileLayer& files, const DirectoryHandle& folder, const std::string& name,
                    const std::string& path, const std::vector<std::string>& names,
                    const std::function<void()>& written,
                    const std::optional<FileKey>& asked = std::nullopt);

}  // namespace skein::vald
