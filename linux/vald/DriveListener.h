#pragma once

#include <functional>

#include "base/Mutex.h"
#include "linux/vald/Store.h"

namespace skein::vald {

// Hands what the store tells to the update senders, and then says that something changed.
// Made before the store and outlives it.
class DriveListener final : public StoreListener {
 public:
  explicit DriveListener(StoreListener& senders) : _senders(senders) {}

  // `afterChange` runs on the store's writer thread and returns at once.
  void setAfterChange(std::function<void()> afterChange) SKEIN_EXCLUDES(_mutex) {
    MutexLock lock(_mutex);
    _afterChange = std::move(afterChange);
  }

  void storeDidChange(const std::vector<StoreChange>& changes) override SKEIN_EXCLUDES(_mutex) {
    _senders.storeDidChange(changes);
    tell();
  }
  void storeDidOverflow(std::optional<VLFileObjectID> folder) override SKEIN_EXCLUDES(_mutex) {
    _senders.storeDidOverflow(folder);
    tell();
  }

 private:
  void tell() SKEIN_EXCLUDES(_mutex) {
    std::function<void()> afterChange;
    {
      MutexLock lock(_mutex);
      afterChange = _afterChange;
    }
    if (afterChange) afterChange();
  }

  StoreListener& _senders;
  Mutex _mutex;
  std::function<void()> _afterChange SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein::vald
