#pragma once

#include <memory>
#include <vector>

#include "base/Executor.h"
#include "base/Mutex.h"
#include "linux/vald/ItemUpdateSender.h"
#include "linux/vald/Store.h"

namespace skein::vald {

// Every living update sender: hands each the store's changes, boosted ones first. Any
// thread. Made before the store, whose listener it is, and outlives it.
class ItemUpdateSenders final : public StoreListener {
 public:
  explicit ItemUpdateSenders(std::shared_ptr<Executor> executor, SenderLimits limits = {});

  // Null with an error when there are too many already.
  std::shared_ptr<ItemUpdateSender> make(std::shared_ptr<VLItemNotificationReceiving> receiver,
                                         Store& store, NSErrorOut error) SKEIN_EXCLUDES(_mutex);

  // Breaks every link, so that every receiver asks again.
  void breakAll(const NSErrorPtr& error) SKEIN_EXCLUDES(_mutex);
  std::size_t count() const SKEIN_EXCLUDES(_mutex);

  void storeDidChange(const std::vector<StoreChange>& changes) override SKEIN_EXCLUDES(_mutex);
  void storeDidOverflow(std::optional<VLFileObjectID> folder) override SKEIN_EXCLUDES(_mutex);

 private:
  std::vector<std::shared_ptr<ItemUpdateSender>> living() const SKEIN_EXCLUDES(_mutex);

  const std::shared_ptr<Executor> _executor;
  const SenderLimits _limits;
  mutable Mutex _mutex;
  std::vector<std::weak_ptr<ItemUpdateSender>> _senders SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein::vald
