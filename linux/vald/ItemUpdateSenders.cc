#include "linux/vald/ItemUpdateSenders.h"

#include <algorithm>
#include <string>
#include <utility>

#include "vellum/VLErrors.h"

namespace skein::vald {
namespace {

constexpr std::size_t kMostSenders = 4096;

NSErrorPtr scannedAnew() {
  return NSError::errorWithDomain(
      VLVellumErrorDomain, VLVellumErrorChangesLost,
      {{NSLocalizedDescriptionKey,
        std::string("The drive was scanned anew and changed in too many places to tell; list the "
                    "folder again.")}});
}

}  // namespace

ItemUpdateSenders::ItemUpdateSenders(std::shared_ptr<Executor> executor, SenderLimits limits)
    : _executor(std::move(executor)), _limits(limits) {}

std::shared_ptr<ItemUpdateSender> ItemUpdateSenders::make(
    std::shared_ptr<VLItemNotificationReceiving> receiver, Store& store, NSErrorOut error) {
  auto sender = std::make_shared<ItemUpdateSender>(std::move(receiver), _executor, store, _limits);
  {
    MutexLock lock(_mutex);
    std::erase_if(_senders, [](const auto& weak) { return weak.expired(); });
    if (_senders.size() < kMostSenders) {
      _senders.push_back(sender);
      return sender;
    }
  }
  error.store(NSError::errorWithDomain(
      VLVellumErrorDomain, VLVellumErrorInvalidParameter,
      {{NSLocalizedDescriptionKey, "vald serves " + std::to_string(kMostSenders) +
                                       " update senders already; end some watches first."}}));
  return nullptr;
}

void ItemUpdateSenders::breakAll(const NSErrorPtr& error) {
  for (const auto& sender : living()) sender->breakLink(error);
}

std::size_t ItemUpdateSenders::count() const { return living().size(); }

void ItemUpdateSenders::storeDidChange(const std::vector<StoreChange>& changes) {
  auto senders = living();
  std::stable_partition(senders.begin(), senders.end(),
                        [](const auto& sender) { return sender->isBoosted(); });
  for (const auto& sender : senders) sender->storeDidChange(changes);
}

void ItemUpdateSenders::storeDidOverflow(std::optional<VLFileObjectID> folder) {
  if (!folder) {
    breakAll(scannedAnew());
    return;
  }
  // Whom it concerns is for the store to say, and its writer must not wait for that.
  _executor->post([senders = living(), folder = *folder] {
    for (const auto& sender : senders) sender->storeDidOverflow(folder);
  });
}

std::vector<std::shared_ptr<ItemUpdateSender>> ItemUpdateSenders::living() const {
  std::vector<std::shared_ptr<ItemUpdateSender>> senders;
  {
    MutexLock lock(_mutex);
    senders.reserve(_senders.size());
    for (const auto& weak : _senders) {
      if (auto sender = weak.lock()) senders.push_back(std::move(sender));
    }
  }
  std::erase_if(senders, [](const auto& sender) { return sender->hasEnded(); });
  return senders;
}

}  // namespace skein::vald
