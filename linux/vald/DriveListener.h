#pragma once

#include <algorithm>
#include <functional>

#include "base/Mutex.h"
#include "linux/vald/Store.h"

namespace skein::vald {

// Hands what the store tells to the update senders, and then says that folders changed. Made
// before the store and outlives it.
class DriveListener final : public StoreListener {
 public:
  explicit DriveListener(StoreListener& senders) : _senders(senders) {}

  // `afterFolderChange` runs on the store's writer thread and returns at once.
  void setAfterFolderChange(std::function<void()> afterFolderChange) SKEIN_EXCLUDES(_mutex) {
    MutexLock lock(_mutex);
    _afterFolderChange = std::move(afterFolderChange);
  }

  void storeDidChange(const std::vector<StoreChange>& changes) override SKEIN_EXCLUDES(_mutex) {
    _senders.storeDidChange(changes);
    const bool isOfFolder = std::any_of(changes.begin(), changes.end(), [](const auto& change) {
      return change.item->fileObjectID().isFolderOrAliasID();
    });
    if (isOfFolder) tell();
  }
  void storeDidOverflow(std::optional<VLFileObjectID> folder) override SKEIN_EXCLUDES(_mutex) {
    _senders.storeDidOverflow(folder);
    tell();
  }

 private:
  void tell() SKEIN_EXCLUDES(_mutex) {
    std::function<void()> afterFolderChange;
    {
      MutexLock lock(_mutex);
      afterFolderChange = _afterFolderChange;
    }
    if (afterFolderChange) afterFolderChange();
  }

  StoreListener& _senders;
  Mutex _mutex;
  std::function<void()> _afterFolderChange SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein::vald
