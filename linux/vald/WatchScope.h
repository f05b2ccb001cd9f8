#pragma once

#include <optional>
#include <string>
#include <unordered_map>

#include "linux/vald/Store.h"

namespace skein::vald {

// Whether `path` is `folder` or lies below it. Both absolute, without trailing separator.
bool pathIsWithin(const std::string& path, const std::string& folder);

// What a watcher of a folder's own children sees of a change: the item, the item as dead
// when it left the folder, null when the change is none of the watcher's. The folder's
// own item belongs to the watch.
VLQueryItemPtr seenByChildrenWatch(const VLFileObjectID& folder, const StoreChange& change);

// The same for watchers of whole subtrees, for one batch of changes: asks the store where
// folders are, each once. A folder that is gone counts as inside for deletions alone,
// since telling a deletion too many harms nobody.
class SubtreeScope {
 public:
  SubtreeScope(Store& store, VLFileObjectID folder);

  VLQueryItemPtr seen(const StoreChange& change);

 private:
  // nil: it cannot be told any more.
  std::optional<bool> holds(const VLFileObjectID& folder);

  Store& _store;
  const VLFileObjectID _folder;
  const std::optional<std::string> _path;
  std::unordered_map<VLFileObjectID, std::optional<bool>> _known;
};

}  // namespace skein::vald
