// Change tracking: the link to the daemon's updates, the pending set, and sync anchors.
#include <utility>

#include "enumeration/VLFileEnumerator.h"
#include "platform/fileprovider/NSFileProviderError.h"
#include "support/NSData+Additions.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

// With one more the host does better to list the folder again.
constexpr std::size_t kMostPendingChanges = 5000;

// What the daemon is asked to watch: a folder's children, or its whole subtree.
constexpr std::uint64_t kWatchChildren = 19;
constexpr std::uint64_t kWatchSubtree = 23;

}  // namespace

// The notification link, on _queue.

void VLFileEnumerator::setupNotificationReceivingIfNeededWithCompletion(
    Completion<NSErrorPtr> completion) {
  _queue.async([self = shared_from_this(), completion = std::move(completion)]() mutable {
    self->_queue.assumeCurrent();
    self->_setupNotificationReceivingIfNeededWithCompletion(std::move(completion));
  });
}

void VLFileEnumerator::_setupNotificationReceivingIfNeededWithCompletion(
    Completion<NSErrorPtr> completion) {
  VL_ASSERT(_environment.log, _queue.isCurrent());
  _startObservingAccountChangesIfNeeded();

  // Setups that overlap each get a sender; the last one stays. Two listings at once are
  // the host's fault, and a listing without a link would be worse than a spare link.
  VL_ASSERT(_environment.log, !_isSettingUpNotificationReceiving);
  _isSettingUpNotificationReceiving = true;
  // A failing connection ends the setup on its reply thread, so the flag is atomic.
  const auto finish =
      Completion<NSErrorPtr>([self = shared_from_this(),
                              completion = std::move(completion)](const NSErrorPtr& error) mutable {
        self->_isSettingUpNotificationReceiving = false;
        completion(error);
      }).share();

  if (_remoteNotificationSender) {
    (*finish)(nullptr);
    return;
  }
  const auto daemon = _environment.daemonConnection.remoteObjectProxyWithErrorHandler(
      [finish](const NSErrorPtr& error) { (*finish)(error); });
  daemon->getItemUpdateSenderWithReceiver(
      shared_from_this(),
      [self = shared_from_this(), finish](std::shared_ptr<VLItemNotificationSender> sender,
                                          const auto& /*dictionary*/, NSErrorPtr error) {
        self->_queue.async([self, finish, sender = std::move(sender), error = std::move(error)] {
          self->_queue.assumeCurrent();
          if (!error) self->_linkToSender(sender);
          // Without waiting for the watch to stand.
          (*finish)(error);
        });
      });
}

void VLFileEnumerator::_linkToSender(const std::shared_ptr<VLItemNotificationSender>& sender) {
  // The daemon had none to give: still unlinked, and the next listing asks again.
  if (!sender) return;
  if (_invalidated) {
    sender->invalidate();
    return;
  }
  // Weak: the enumerator keeps the proxy, and the proxy this handler. Held strongly, an
  // enumerator that was let go of without invalidate would keep itself alive for good. The
  // watch's reply below is a running request: that one holds the enumerator until it ends.
  const auto errorHandler = [weak = weak_from_this()](NSErrorPtr error) {
    if (const auto self = weak.lock()) self->_handleNotificationError(std::move(error));
  };
  _remoteNotificationSender = sender->remoteObjectProxyWithErrorHandler(errorHandler);
  _remoteNotificationSender->boostPriority([] {});
  sender->remoteObjectProxyWithErrorHandler(errorHandler)
      ->watchItemAtURL(_url, _isRecursive ? kWatchSubtree : kWatchChildren,
                       [self = shared_from_this()](NSErrorPtr error) {
                         if (error) self->_handleNotificationError(std::move(error));
                       });
}

void VLFileEnumerator::_handleNotificationError(NSErrorPtr error) {
  _queue.async([self = shared_from_this(), error = std::move(error)] {
    self->_queue.assumeCurrent();
    VL_DEBUG(self->_environment.log, "[DEBUG] There was an error while fetching items: %@", error);
    // Not invalidated: there is nobody left to tell. The next listing links again.
    self->_remoteNotificationSender = nullptr;
    self->_invalidateChangeToken();
    if (error && error->domain() == VLVellumErrorDomain) self->_signalChange();
  });
}

void VLFileEnumerator::_startObservingAccountChangesIfNeeded() {
  VL_ASSERT(_environment.log, _queue.isCurrent());
  if (_isObservingAccountChanges || _invalidated) return;
  _isObservingAccountChanges = true;
  NSNotificationCenter& center = _environment.notificationCenter;
  const auto self = shared_from_this();
  center.addObserver(self, &VLFileEnumerator::_accountTokenDidChange,
                     VLAccountTokenDidChangeNotification);
  if (_itemIdentifier != NSFileProviderRootContainerItemIdentifier) return;
  // Containers show at the root alone. Asking for them is what makes their notification be
  // posted; the answer itself is not wanted.
  _environment.containers.allContainers();
  center.addObserver(self, &VLFileEnumerator::containerListDidChange,
                     VLContainerListDidChangeNotification);
}

void VLFileEnumerator::_stopObservingAccountChanges() {
  VL_ASSERT(_environment.log, _queue.isCurrent());
  _isObservingAccountChanges = false;
  _environment.notificationCenter.removeObserver(this);
}

void VLFileEnumerator::_accountTokenDidChange() {
  VL_NOTICE(_environment.log,
            "[NOTICE] received account did update notification, invalidating change token");
  _queue.sync([this] {
    _queue.assumeCurrent();
    // A standing link hears of the account's changes from the daemon itself.
    if (_remoteNotificationSender) return;
    _invalidateChangeToken();
    _signalChange();
  });
}

void VLFileEnumerator::containerListDidChange() {
  Log& log = _environment.log;
  const VLLogSection section(log, _environment.logSections);
  VL_DEBUG(log, "[DEBUG] ┏%llx container list did change, invalidating our change token",
           section.number());
  _invalidateChangeToken();
  _signalChange();
}

void VLFileEnumerator::invalidate() {
  _queue.async([self = shared_from_this()] {
    self->_queue.assumeCurrent();
    self->_invalidate();
  });
}

void VLFileEnumerator::_invalidate() {
  VL_ASSERT(_environment.log, _queue.isCurrent());
  {
    MonitorLock lock(_lock);
    _invalidated = true;
    if (_remoteNotificationSender) _remoteNotificationSender->invalidate();
    _remoteNotificationSender = nullptr;
  }
  _stopObservingAccountChanges();
}

// The change state, under _lock.

void VLFileEnumerator::receiveUpdates(const VLQueryItems& items, const std::vector<std::string>&,
                                      const std::vector<std::string>&, Reply<> reply) {
  {
    MonitorLock lock(_lock);
    for (const VLQueryItemPtr& item : items) {
      const VLFileObjectID& id = item->fileObjectID();
      if (item->isDead()) {
        _updatedItemsByIDs.erase(id);
        _deletedItemsIdentifiers.append(id);
      } else {
        _deletedItemsIdentifiers.removeEvery(id);
        _updatedItemsByIDs.insert_or_assign(id, item);
      }
    }
    if (_pendingCount() > kMostPendingChanges) _invalidateChangeTokenWithLock();
  }
  // Also after a reset: asking for changes is how the host learns that its anchor expired.
  _signalChange();
  if (reply) reply();
}

void VLFileEnumerator::receiveProgressUpdates(const VLQueryItems&, Reply<>) {
  // Progress is nothing that the host is told. The daemon does not wait for a reply to
  // these, so none is sent.
}

void VLFileEnumerator::_signalChange() {
  Log& log = _environment.log;
  VL_DEBUG(log, "[DEBUG] signal changes to fileproviderd");
  _environment.providerManager.signalEnumeratorForContainerItemIdentifier(
      _itemIdentifier, [&log](const NSErrorPtr& error) {
        if (!error) return;
        // Says "root container" whichever container it is: the log's readers know the line.
        VL_ERROR(log, "[ERROR] failed to signal enumerator for root container: %@", error);
      });
}

void VLFileEnumerator::_invalidateChangeToken() {
  // Before the lock, which may be held for as long as an observer takes.
  VL_DEBUG(_environment.log, "[DEBUG] invalidating change token");
  MonitorLock lock(_lock);
  _resetChangeState();
}

void VLFileEnumerator::_invalidateChangeTokenWithLock() {
  VL_DEBUG(_environment.log, "[DEBUG] invalidating change token");
  _resetChangeState();
}

void VLFileEnumerator::_resetChangeState() {
  _deletedItemsIdentifiers.clear();
  _updatedItemsByIDs.clear();
  _rank = 0;
  _drawUUID();
}

void VLFileEnumerator::currentSyncAnchorWithCompletionHandler(
    UniqueFunction<void(std::optional<NSFileProviderSyncAnchor>)> completionHandler) {
  // Rank 0 whatever _rank is: this anchor stands for the state's beginning, so once a batch
  // was handed out a host that starts from it is made to list again.
  const NSFileProviderSyncAnchor anchor = vl_changeTokenFromRank(0, _currentUUID());
  if (completionHandler) completionHandler(anchor);
}

void VLFileEnumerator::enumerateChangesForObserver(
    std::shared_ptr<NSFileProviderChangeObserver> observer,
    std::optional<NSFileProviderSyncAnchor> fromSyncAnchor) {
  Log& log = _environment.log;
  const VLLogSection section(log, _environment.logSections);
  VL_DEBUG(log, "[DEBUG] ┏%llx listing changes", section.number());

  NSFileProviderItems updated;
  std::vector<NSFileProviderItemIdentifier> deleted;
  NSFileProviderSyncAnchor anchor;
  {
    MonitorLock lock(_lock);
    const std::int64_t rank = vl_changeTokenRankWithUUID(fromSyncAnchor, _currentUUID());
    VL_DEBUG(log, "[DEBUG] requested rank: %lld", rank);

    if (rank < 0 || static_cast<std::uint64_t>(rank) != _rank) {
      VL_DEBUG(log, "[DEBUG] token expired (current rank %llu)", _rank);
      observer->finishEnumeratingWithError(NSError::errorWithDomain(
          NSFileProviderErrorDomain, NSFileProviderErrorSyncAnchorExpired));
      _invalidateChangeTokenWithLock();
      return;
    }
    if (_pendingCount() == 0) {
      VL_DEBUG(log, "[DEBUG] no update to send back");
      observer->finishEnumeratingChangesUpToSyncAnchor(*fromSyncAnchor, false);
      return;
    }
    updated.reserve(_updatedItemsByIDs.size());
    for (auto& [id, item] : _updatedItemsByIDs) updated.push_back(std::move(item));
    deleted = _deletedItemsIdentifiers.strings();
    _updatedItemsByIDs.clear();
    _deletedItemsIdentifiers.clear();
    anchor = vl_changeTokenFromRank(++_rank, _currentUUID());
  }
  // Both lists, also when one of them is empty.
  observer->didUpdateItems(updated);
  observer->didDeleteItemsWithIdentifiers(deleted);
  observer->finishEnumeratingChangesUpToSyncAnchor(std::move(anchor), false);
}

std::size_t VLFileEnumerator::_pendingCount() const {
  return _updatedItemsByIDs.size() + _deletedItemsIdentifiers.count();
}

std::size_t VLFileEnumerator::pendingChangeCount() {
  MonitorLock lock(_lock);
  return _pendingCount();
}

uuid_t VLFileEnumerator::_currentUUID() const {
  MutexLock lock(_uuidMutex);
  return _uuid;
}

void VLFileEnumerator::_drawUUID() {
  uuid_t fresh;
  uuid_generate(fresh);
  MutexLock lock(_uuidMutex);
  _uuid = fresh;
}

}  // namespace skein
