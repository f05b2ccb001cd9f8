// The enumerator of one folder: lists its items page by page, and follows its changes as
// the daemon pushes them.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <unordered_map>

#include "base/Completion.h"
#include "base/Mutex.h"
#include "base/SerialQueue.h"
#include "enumeration/PendingDeletions.h"
#include "platform/fileprovider/NSFileProviderEnumerating.h"
#include "platform/foundation/uuid.h"
#include "support/Environment.h"

namespace skein {

// Any thread may call; two things order what happens inside:
//   _queue  owns the notification link and its flags;
//   _lock   guards the change state: what is pending, the rank and the uuid.
// Work on _queue may take the lock; whoever holds the lock never waits for _queue. The
// lock is held while an observer hears that there is nothing new or that its anchor has
// expired, so observers queue their answers.
//
// A sync anchor names a change state (by its uuid) and how many batches of it were handed
// out (the rank). A reset begins a new state, so every older anchor has expired and the
// host lists again.
//
// The daemon holds the enumerator as its receiver while the link stands: what ends it is
// invalidate, or the link's own end. Observers are held by running requests alone.
class VLFileEnumerator final : public NSFileProviderEnumerator,
                               public NSFileProviderChangeEnumerating,
                               public VLItemNotificationReceiving,
                               public std::enable_shared_from_this<VLFileEnumerator> {
 public:
  // initWithFileObjectID:url:itemIdentifier:recursive:
  // Null without a URL. A nil object identifier is the root. Asks the daemon nothing yet.
  // `environment` outlives the enumerator.
  static std::shared_ptr<VLFileEnumerator> initWithFileObjectID(
      std::optional<VLFileObjectID> fileObjectID, NSURLPtr url,
      NSFileProviderItemIdentifier itemIdentifier, bool recursive, Environment& environment);

  // Listing: VLFileEnumerator.cc. Asks for 200 items once change notification is set up;
  // without it there is no listing. Errors are translated.
  void enumerateItemsForObserver(std::shared_ptr<NSFileProviderEnumerationObserver> observer,
                                 std::optional<NSFileProviderPage> startingAtPage) override;

  // Change tracking: VLFileEnumerator+Changes.cc.

  // Links the enumerator to the daemon's updates unless it is linked. The completion gets
  // null or what went wrong, on _queue or on a reply thread.
  void setupNotificationReceivingIfNeededWithCompletion(Completion<NSErrorPtr> completion);

  void receiveUpdates(const VLQueryItems& items, const std::vector<std::string>& logicalExtensions,
                      const std::vector<std::string>& physicalExtensions, Reply<> reply) override
      SKEIN_EXCLUDES(_lock);
  // Never replies.
  void receiveProgressUpdates(const VLQueryItems& updates, Reply<> reply) override;

  // Waits for no lock that is held while an observer is called.
  void currentSyncAnchorWithCompletionHandler(
      UniqueFunction<void(std::optional<NSFileProviderSyncAnchor>)> completionHandler) override
      SKEIN_EXCLUDES(_uuidMutex);
  void enumerateChangesForObserver(std::shared_ptr<NSFileProviderChangeObserver> observer,
                                   std::optional<NSFileProviderSyncAnchor> fromSyncAnchor) override
      SKEIN_EXCLUDES(_lock);
  void containerListDidChange();
  // Asynchronous: what was asked before still runs.
  void invalidate() override;

  // Updates and deletions that wait for the next batch; for diagnostics.
  std::size_t pendingChangeCount() SKEIN_EXCLUDES(_lock);

 private:
  struct ListingRequest;

  VLFileEnumerator(std::optional<VLFileObjectID> fileObjectID, NSURLPtr url,
                   NSFileProviderItemIdentifier itemIdentifier, bool recursive,
                   Environment& environment);

  void _listPage(const std::shared_ptr<ListingRequest>& request);

  void _setupNotificationReceivingIfNeededWithCompletion(Completion<NSErrorPtr> completion)
      SKEIN_REQUIRES(_queue);
  void _linkToSender(const std::shared_ptr<VLItemNotificationSender>& sender)
      SKEIN_REQUIRES(_queue);
  void _startObservingAccountChangesIfNeeded() SKEIN_REQUIRES(_queue);
  void _stopObservingAccountChanges() SKEIN_REQUIRES(_queue);
  void _invalidate() SKEIN_REQUIRES(_queue) SKEIN_EXCLUDES(_lock);

  // On the poster's thread; waits for _queue.
  void _accountTokenDidChange();
  // Any thread; goes on on _queue.
  void _handleNotificationError(NSErrorPtr error);
  // Tells the host that there are changes. Any thread, any lock held.
  void _signalChange();

  // Begins a new change state. The second form is for callers that hold the lock.
  void _invalidateChangeToken() SKEIN_EXCLUDES(_lock);
  void _invalidateChangeTokenWithLock() SKEIN_REQUIRES(_lock);
  void _resetChangeState() SKEIN_REQUIRES(_lock);
  std::size_t _pendingCount() const SKEIN_REQUIRES(_lock);
  uuid_t _currentUUID() const SKEIN_EXCLUDES(_uuidMutex);
  void _drawUUID() SKEIN_EXCLUDES(_uuidMutex);

  Environment& _environment;
  Monitor _lock;
  // A leaf: lets the current anchor be read while _lock is held elsewhere.
  mutable Mutex _uuidMutex;

  const NSFileProviderItemIdentifier _itemIdentifier;
  const std::optional<VLFileObjectID> _fileObjectID;
  const NSURLPtr _url;
  std::shared_ptr<VLItemNotificationSending> _remoteNotificationSender SKEIN_GUARDED_BY(_queue);
  std::unordered_map<VLFileObjectID, VLQueryItemPtr> _updatedItemsByIDs SKEIN_GUARDED_BY(_lock);
  PendingDeletions _deletedItemsIdentifiers SKEIN_GUARDED_BY(_lock);
  uuid_t _uuid SKEIN_GUARDED_BY(_uuidMutex){};
  std::uint64_t _rank SKEIN_GUARDED_BY(_lock) = 0;
  const bool _isRecursive;
  bool _invalidated SKEIN_GUARDED_BY(_queue) = false;
  // Set on _queue; cleared there or on a reply thread.
  std::atomic<bool> _isSettingUpNotificationReceiving{false};
  bool _isObservingAccountChanges SKEIN_GUARDED_BY(_queue) = false;
  SerialQueue _queue;
};

}  // namespace skein
