#include "linux/vald/shares/SharedItems.h"

#include <algorithm>
#include <utility>

#include "linux/vald/WatchScope.h"

namespace skein::vald {

std::shared_ptr<const SharedIDs> SharedItems::now() const {
  MutexLock lock(_mutex);
  return _now;
}

void SharedItems::add(VLFileObjectID item) {
  MutexLock lock(_mutex);
  if (_now->items.contains(item)) return;
  auto next = std::make_shared<SharedIDs>(*_now);
  next->items.insert(item);
  if (item.isFolderOrAliasID()) next->folders.push_back(item);
  _now = std::move(next);
}

void SharedItems::remove(VLFileObjectID item) {
  MutexLock lock(_mutex);
  if (!_now->items.contains(item)) return;
  auto next = std::make_shared<SharedIDs>(*_now);
  next->items.erase(item);
  std::erase(next->folders, item);
  _now = std::move(next);
}

bool SharedMarks::coversChildrenOf(const VLFileObjectID& folder) {
  if (_shared->folders.empty()) return false;
  const auto [entry, isNew] = _known.try_emplace(folder, false);
  if (!isNew) return entry->second;
  if (!std::exchange(_hasPaths, true)) {
    for (const VLFileObjectID& shared : _shared->folders) {
      if (auto path = _store.pathForID(shared, nullptr)) _paths.push_back(std::move(*path));
    }
  }
  const auto path = _store.pathForID(folder, nullptr);
  entry->second = path && std::any_of(_paths.begin(), _paths.end(), [&](const std::string& shared) {
                    return pathIsWithin(*path, shared);
                  });
  return entry->second;
}

VLQueryItemPtr SharedMarks::marked(const VLQueryItemPtr& item) {
  if (item == nullptr || item->isDead() || _shared->items.empty()) return item;
  bool isShared = _shared->items.contains(item->fileObjectID());
  if (!isShared) {
    // The drive's root has no identifier of this form, and cannot be shared.
    const auto folder = VLFileObjectID::fileObjectIDWithString(item->parentItemIdentifier());
    isShared = folder && coversChildrenOf(*folder);
  }
  if (!isShared) return item;
  VLQueryItem::Properties properties = item->properties();
  properties.isShared = true;
  return std::make_shared<const VLQueryItem>(std::move(properties));
}

void SharedMarks::mark(std::vector<VLQueryItemPtr>& items) {
  for (VLQueryItemPtr& item : items) item = marked(item);
}

}  // namespace skein::vald
