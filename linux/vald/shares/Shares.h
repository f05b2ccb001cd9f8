#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "base/Executor.h"
#include "base/SerialQueue.h"
#include "linux/protocol/LocalShares.h"
#include "linux/vald/Accounts.h"
#include "linux/vald/Containers.h"
#include "linux/vald/Replies.h"
#include "linux/vald/Store.h"
#include "linux/vald/cloud/CloudErrors.h"
#include "linux/vald/shares/ShareRules.h"
#include "linux/vald/shares/SharedItems.h"
#include "platform/log/Log.h"
#include "vellum/VLErrors.h"

namespace skein::vald {

// What the shares work with; each outlives them and what they posted.
struct SharesParts {
  std::shared_ptr<Executor> executor;
  Store& store;  // as clients see it
  ShareRecords& records;
  SharedItems& shared;
  Accounts& accounts;
  Containers& containers;
  Log& log;
  std::string drive;  // the drive's folder, absolute
  // Notes on a document's file which document it is, so that a shared one is known again when
  // the index is lost; may be empty.
  std::function<void(const std::string& path, std::uint64_t document)> writeHint = {};
};

// vald's shares. Calls are served one at a time, in the order in which they came, and
// answered from the executor, exactly once, under no lock; vlc_errorLoggedOut while nobody is
// logged in. A call that is cancelled before its turn does nothing.
//
// What a call changed is durable before the store journals the item as changed, and both
// before the reply. A change that a crash kept from being told is told at the next start.
class Shares final : public LocalShares, public std::enable_shared_from_this<Shares> {
 public:
  explicit Shares(SharesParts parts);

  // Marks what is shared, and has the store tell what was not told. Once, before anything is
  // asked. An error: the records cannot be read.
  NSErrorPtr load();

  std::shared_ptr<NSProgress> copyShare(
      NSURLPtr url, Reply<CKSharePtr, std::optional<std::string>, NSErrorPtr> reply) override;
  std::shared_ptr<NSProgress> newShare(NSURLPtr url, ShareReply reply) override;
  std::shared_ptr<NSProgress> copyShareURL(NSURLPtr url,
                                           Reply<NSURLPtr, NSErrorPtr> reply) override;
  std::shared_ptr<NSProgress> saveShare(CKShare share, ShareReply reply) override;
  std::shared_ptr<NSProgress> destroyShare(CKShare share, Reply<NSErrorPtr> reply) override;
  std::shared_ptr<NSProgress> copyShareTokens(
      NSURLPtr url,
      Reply<std::optional<std::string>, std::optional<std::string>, NSErrorPtr> reply) override;

  void answerInvitation(NSURLPtr shareURL, std::string participant, bool accepts,
                        Reply<NSErrorPtr> reply) override;
  void attachZone(NSURLPtr folder, CKRecordZoneID zone, CKShareParticipantPermission permission,
                  Reply<NSErrorPtr> reply) override;
  void detachZone(NSURLPtr folder, Reply<NSErrorPtr> reply) override;
  void attachedZones(Reply<std::vector<AttachedZone>, NSErrorPtr> reply) override;

  void isShareable(VLFileObjectID item, Reply<bool, NSErrorPtr> reply) override;
  void refreshSharingState(NSFileProviderItemIdentifier item, Reply<NSErrorPtr> reply) override;
  void shareOptions(NSFileProviderItemIdentifier item,
                    Reply<ShareOptions, NSErrorPtr> reply) override;

  // Tells the zone of somebody else's that an item is in; nil for one's own items and for one
  // that is gone. Any thread; not after the shares.
  using ZoneFinder = std::function<std::optional<CKRecordZoneID>(VLFileObjectID)>;
  // By the zones that are attached at the moment: for one request, however many items it names.
  Outcome<ZoneFinder> attachedZoneFinder();

  // A folder that was moved into or out of a shared one: has the store tell of what it holds.
  // Any thread; returns at once.
  void coverageDidChange(VLFileObjectID folder);

 private:
  // Calls work(self, reply) when it is its turn.
  template <class... Values, class Work>
  std::shared_ptr<NSProgress> perform(Reply<Values...> reply, Work work);

  // On the queue.
  Outcome<SharePlace> placeOf(const NSURLPtr& url);
  Outcome<SharePlace> placeOf(const NSFileProviderItemIdentifier& identifier);
  Outcome<SharePlace> place(VLQueryItemPtr item, std::string path);
  Outcome<ShareRecord> keep(CKShare share, const SharePlace& place);
  Outcome<ShareRecord> ownShareToChange(const CKShare& share);
  NSErrorPtr attach(const SharePlace& place, const CKRecordZoneID& zone,
                    CKShareParticipantPermission permission);
  void tell(VLFileObjectID item, bool isShared);

  const SharesParts _parts;
  SerialQueue _queue;
};

template <class... Values, class Work>
std::shared_ptr<NSProgress> Shares::perform(Reply<Values...> reply, Work work) {
  auto progress = NSProgress::progressWithTotalUnitCount(1);
  _queue.async([self = shared_from_this(), progress, reply = std::move(reply),
                work = std::move(work)]() mutable {
    if (progress->isCancelled()) return answerError(reply, cancelledError());
    if (!self->_parts.accounts.current()) return answerError(reply, vlc_errorLoggedOut());
    work(*self, reply);
    progress->setCompletedUnitCount(1);
  });
  return progress;
}

}  // namespace skein::vald
