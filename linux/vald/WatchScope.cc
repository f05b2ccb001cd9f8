#include "linux/vald/WatchScope.h"

#include <memory>

namespace skein::vald {
namespace {

VLQueryItemPtr deadItem(const VLQueryItemPtr& item) {
  if (item->isDead()) return item;
  VLQueryItem::Properties dead;
  dead.fileObjectID = item->fileObjectID();
  dead.itemIdentifier = item->itemIdentifier();
  dead.parentItemIdentifier = item->parentItemIdentifier();
  dead.kind = item->properties().kind;
  dead.isDead = true;
  return std::make_shared<const VLQueryItem>(std::move(dead));
}

}  // namespace

bool pathIsWithin(const std::string& path, const std::string& folder) {
  if (folder == "/") return true;
  return path.starts_with(folder) && (path.size() == folder.size() || path[folder.size()] == '/');
}

VLQueryItemPtr seenByChildrenWatch(const VLFileObjectID& folder, const StoreChange& change) {
  if (change.item->fileObjectID() == folder || change.folder == folder) return change.item;
  return change.previousFolder == folder ? deadItem(change.item) : nullptr;
}

SubtreeScope::SubtreeScope(Store& store, VLFileObjectID folder)
    : _store(store), _folder(folder), _path(store.pathForID(folder, nullptr)) {}

VLQueryItemPtr SubtreeScope::seen(const StoreChange& change) {
  if (change.item->fileObjectID() == _folder) return change.item;
  const std::optional<bool> now = holds(change.folder);
  if (now.value_or(false)) return change.item;
  if (change.item->isDead() && now.value_or(true)) return change.item;
  return holds(change.previousFolder).value_or(true) ? deadItem(change.item) : nullptr;
}

std::optional<bool> SubtreeScope::holds(const VLFileObjectID& folder) {
  if (folder == _folder) return true;
  const auto [known, isNew] = _known.try_emplace(folder);
  if (isNew && _path) {
    if (const auto path = _store.pathForID(folder, nullptr)) {
      known->second = pathIsWithin(*path, *_path);
    }
  }
  return known->second;
}

}  // namespace skein::vald
