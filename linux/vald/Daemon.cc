#include "linux/vald/Daemon.h"

#include <unistd.h>

#include <algorithm>
#include <limits>
#include <string>
#include <utility>

#include "linux/protocol/AnswerRoom.h"
#include "linux/vald/ChangeToken.h"
#include "linux/vald/DrivePath.h"
#include "linux/vald/Replies.h"
#include "platform/fileprovider/NSFileProviderError.h"
#include "vellum/VLErrors.h"

namespace skein::vald {
namespace {

constexpr std::uint64_t kMostItems = 1000;
constexpr std::uint64_t kMostDifferences = 10'000;

NSErrorPtr checkPage(std::uint8_t sortOrder, std::uint64_t offset, std::uint64_t limit) {
  if (sortOrder > static_cast<std::uint8_t>(SortOrder::Date)) {
    return vlc_errorInvalidParameter("sortOrder", std::to_string(sortOrder));
  }
  if (offset > std::numeric_limits<std::int64_t>::max()) {
    return vlc_errorInvalidParameter("offset", std::to_string(offset));
  }
  if (limit == 0) return vlc_errorInvalidParameter("limit", "0");
  return nullptr;
}

NSErrorPtr expired() {
  return NSError::errorWithDomain(NSFileProviderErrorDomain, NSFileProviderErrorSyncAnchorExpired);
}

}  // namespace

Daemon::Daemon(DaemonParts parts)
    : _parts(std::move(parts)),
      _accountQueue("vald-accounts", _parts.executor),
      _checkQueue("vald-checks", _parts.slowExecutor),
      _containerQueue("vald-containers", _parts.executor) {}

template <class R, class Work>
void Daemon::answer(R reply, Work work) {
  _parts.executor->post([self = shared_from_this(), reply = std::move(reply),
                         work = std::move(work)]() mutable { work(*self, reply); });
}

template <class R, class Work>
void Daemon::answerLoggedIn(R reply, Work work) {
  answer(std::move(reply), [work = std::move(work)](Daemon& self, R& answered) mutable {
    if (self._parts.accounts.current()) {
      work(self, answered);
    } else {
      answerError(answered, vlc_errorLoggedOut());
    }
  });
}

void Daemon::enumerateItemsInFolder(std::optional<VLFileObjectID> folder, std::uint8_t sortOrder,
                                    std::uint64_t offset, std::uint64_t limit,
                                    ItemsReply completion) {
  answerLoggedIn(std::move(completion), [=](Daemon& self, ItemsReply& reply) {
    NSErrorPtr error = checkPage(sortOrder, offset, limit);
    Page page;
    if (!error) {
      // Where it begins it waits for the store to catch up.
      const ScopedWait wait(*self._parts.executor);
      page = self._parts.store.listFolder(folder, static_cast<SortOrder>(sortOrder), offset,
                                          std::min(limit, kMostItems), &error);
    }
    if (error) return answerError(reply, error);
    reply({page.items.begin(), page.items.end()}, page.nextOffset, nullptr);
  });
}

void Daemon::enumerateAllFoldersWithSortOrder(std::uint8_t sortOrder, std::uint64_t offset,
                                              std::uint64_t limit, ItemsReply completion) {
  answerLoggedIn(std::move(completion), [=](Daemon& self, ItemsReply& reply) {
    NSErrorPtr error = checkPage(sortOrder, offset, limit);
    Page page;
    if (!error) {
      page = self._parts.store.listAllFolders(static_cast<SortOrder>(sortOrder), offset,
                                              std::min(limit, kMostItems), &error);
    }
    if (error) return answerError(reply, error);
    reply({page.items.begin(), page.items.end()}, page.nextOffset, nullptr);
  });
}

void Daemon::currentNotifRankWithReply(Reply<std::uint64_t, NSErrorPtr> reply) {
  answerLoggedIn(std::move(reply), [](Daemon& self, Reply<std::uint64_t, NSErrorPtr>& answered) {
    answered(self._parts.store.currentRank(), nullptr);
  });
}

void Daemon::enumerateWorkingSetChangesFromChangeToken(
    std::optional<NSData> changeToken, std::uint64_t limit,
    Reply<NSFileProviderItems, std::vector<VLFileObjectID>, std::optional<NSData>, NSErrorPtr>
        completion) {
  answerLoggedIn(
      std::move(completion), [token = std::move(changeToken), limit](Daemon& self, auto& reply) {
        if (limit == 0) return answerError(reply, vlc_errorInvalidParameter("limit", "0"));
        Store& store = self._parts.store;
        const std::string journal = store.journalID();
        std::optional<std::uint64_t> rank = 0;
        if (token) rank = rankOfChangeToken(*token, journal);
        // A rank that is yet to come is of an index that was since replaced by an older one.
        if (!rank || *rank > store.currentRank()) return answerError(reply, expired());

        NSErrorPtr error;
        const ChangePage page = store.changesSince(*rank, std::min(limit, kMostItems), &error);
        if (!error && page.expired) error = expired();
        if (error) return answerError(reply, error);
        NSFileProviderItems updated;
        std::vector<VLFileObjectID> deleted;
        for (const StoreChange& change : page.changes) {
          if (change.item->isDead()) {
            deleted.push_back(change.item->fileObjectID());
          } else {
            updated.push_back(change.item);
          }
        }
        // Never empty, and equal to the token asked with when there was nothing more.
        NSData next = changeTokenFromRank(std::max(page.newestRank, *rank), journal);
        reply(std::move(updated), std::move(deleted), std::move(next), nullptr);
      });
}

void Daemon::getItemUpdateSenderWithReceiver(std::shared_ptr<VLItemNotificationReceiving> receiver,
                                             SenderReply reply) {
  answerLoggedIn(
      std::move(reply), [receiver = std::move(receiver)](Daemon& self, auto& answered) mutable {
        if (!receiver)
          return answerError(answered, vlc_errorInvalidParameter("receiver", "(null)"));
        NSErrorPtr error;
        auto sender = self._parts.senders.make(std::move(receiver), self._parts.store, &error);
        // Whoever logged out since the question was asked has broken the links there were.
        if (!self._parts.accounts.current()) {
          return answerError(answered, vlc_errorLoggedOut());
        }
        answered(std::move(sender), {}, error);
      });
}

void Daemon::getContainerURLForID(
    const std::string& containerID, bool recreateDocumentsIfNeeded,
    Reply<NSURLPtr, std::optional<std::string>, bool, NSErrorPtr> reply) {
  _containerQueue.async([self = shared_from_this(), containerID, recreateDocumentsIfNeeded,
                         reply = std::move(reply)]() mutable {
    NSErrorPtr error;
    bool recreated = false;
    const auto container =
        self->_parts.containers.find(containerID, recreateDocumentsIfNeeded, recreated, &error);
    if (error) return answerError(reply, error);
    if (recreated) {
      // It is another folder than the one that was there, and looked up next.
      self->_parts.store.setContainers(self->_parts.containers.storeRoots());
      // So that it is in the index then; where that fails, the lookup says so.
      self->_parts.store.itemAtPath(container.documentsURL->path(), /*scanFirst=*/true, nullptr);
    }
    reply(container.documentsURL, container.displayName, recreated, nullptr);
  });
}

void Daemon::URLForFileObjectID(VLFileObjectID fileObjectID, Reply<NSURLPtr, NSErrorPtr> reply) {
  answer(std::move(reply), [fileObjectID](Daemon& self, auto& answered) {
    NSErrorPtr error;
    const auto path = self._parts.store.pathForID(fileObjectID, &error);
    answered(path ? NSURL::fileURLWithPath(*path) : nullptr, error);
  });
}

void Daemon::URLsForFileObjectIDs(std::vector<VLFileObjectID> fileObjectIDs,
                                  Reply<std::vector<NSURLPtr>, NSErrorPtr> reply) {
  answer(std::move(reply), [ids = std::move(fileObjectIDs)](Daemon& self, auto& answered) {
    NSErrorPtr error;
    std::vector<NSURLPtr> urls;
    urls.reserve(ids.size());
    // Who misses one asks for it alone.
    AnswerRoom room(kAnswerBytes);
    for (const auto& path : self._parts.store.pathsForIDs(ids, &error)) {
      const bool isTold = path && room.take(path->size());
      urls.push_back(isTold ? NSURL::fileURLWithPath(*path) : nullptr);
    }
    answered(std::move(urls), error);
  });
}

void Daemon::queryItemForURL(NSURLPtr url, bool scanFirst,
                             Reply<VLQueryItemPtr, NSErrorPtr> reply) {
  answer(std::move(reply), [url = std::move(url), scanFirst](Daemon& self, auto& answered) {
    if (!url) return answerError(answered, vlc_errorInvalidParameter("url", "(null)"));
    std::vector<std::string> roots{self._parts.drive};
    for (const StoreRoot& root : self._parts.containers.storeRoots()) roots.push_back(root.path);
    NSErrorPtr error = checkDrivePath(url->path(), roots);
    VLQueryItemPtr item;
    if (!error) item = self._parts.store.itemAtPath(url->path(), scanFirst, &error);
    answered(item, error);
  });
}

void Daemon::account(Reply<std::optional<LocalAccount>, NSErrorPtr> reply) {
  answer(std::move(reply),
         [](Daemon& self, auto& answered) { answered(self._parts.accounts.current(), nullptr); });
}

void Daemon::logIn(LocalAccount account, Reply<NSErrorPtr> reply) {
  _accountQueue.async([self = shared_from_this(), account = std::move(account),
                       reply = std::move(reply)]() mutable {
    bool changed = false;
    const NSErrorPtr error = self->_parts.accounts.logIn(account, changed);
    if (changed) self->accountChanged();
    reply(error);
  });
}

void Daemon::logOut(Reply<NSErrorPtr> reply) {
  _accountQueue.async([self = shared_from_this(), reply = std::move(reply)]() mutable {
    bool changed = false;
    self->_parts.accounts.logOut(changed);
    if (changed) self->accountChanged();
    reply(nullptr);
  });
}

void Daemon::accountChanged() {
  const std::optional<LocalAccount> account = _parts.accounts.current();
  if (account) {
    VL_NOTICE(_parts.log, "[NOTICE] %@ logged in", account->name);
  } else {
    VL_NOTICE(_parts.log, "[NOTICE] the account logged out");
  }
  // A client that is linked hears of the change through its link alone.
  _parts.senders.breakAll(
      account ? NSError::errorWithDomain(
                    VLVellumErrorDomain, VLVellumErrorChangesLost,
                    {{NSLocalizedDescriptionKey,
                      std::string("Another account logged in; list the folder again.")}})
              : vlc_errorLoggedOut());
  _parts.subscribers.accountDidChange(account);
}

void Daemon::containers(Reply<std::vector<VLContainer::Properties>, NSErrorPtr> reply) {
  answer(std::move(reply),
         [](Daemon& self, auto& answered) { answered(self._parts.containers.list(), nullptr); });
}

void Daemon::subscribe(std::shared_ptr<LocalDaemonEvents> events, Reply<NSErrorPtr> reply) {
  // Now, not when the executor comes to it: `events` may be all that holds the subscriber.
  NSErrorPtr error;
  if (!events) {
    error = vlc_errorInvalidParameter("events", "(null)");
  } else if (!_parts.subscribers.add(events)) {
    error = vlc_errorInvalidParameter("events", "one more subscriber than vald serves");
  }
  answer(std::move(reply), [error](Daemon&, auto& answered) { answered(error); });
}

void Daemon::status(Reply<LocalDaemonStatus, NSErrorPtr> reply) {
  answer(std::move(reply), [](Daemon& self, auto& answered) {
    LocalDaemonStatus status;
    self._parts.store.status(status);
    status.store = self._parts.drive;
    status.processID = getpid();
    status.senders = self._parts.senders.count();
    status.account = self._parts.accounts.current();
    if (self._parts.notes) status.notes = self._parts.notes();
    answered(std::move(status), nullptr);
  });
}

void Daemon::checkIndex(std::uint64_t limit,
                        Reply<std::vector<IndexDifference>, NSErrorPtr> reply) {
  _checkQueue.async([self = shared_from_this(), limit, reply = std::move(reply)]() mutable {
    reply(self->_parts.store.check(std::min(limit, kMostDifferences)), nullptr);
  });
}

void Daemon::injectFault(FaultInjection fault, Reply<NSErrorPtr> reply) {
  answer(std::move(reply), [fault = std::move(fault)](Daemon& self, auto& answered) mutable {
    answered(self._parts.faults.plan(std::move(fault)));
  });
}

void Daemon::stop(Reply<NSErrorPtr> reply) {
  answer(std::move(reply), [](Daemon& self, auto& answered) {
    answered(nullptr);
    self._parts.stop();
  });
}

void Daemon::refreshContainers() {
  if (_refreshPosted.exchange(true)) return;
  _containerQueue.async([self = shared_from_this()] {
    self->_refreshPosted.store(false);
    if (!self->_parts.containers.refresh()) return;
    std::vector<StoreRoot> roots = self->_parts.containers.storeRoots();
    VL_INFO(self->_parts.log, "[INFO] the containers changed, %lu apps have one", roots.size());
    if (self->_parts.containersWillChange) self->_parts.containersWillChange(roots);
    self->_parts.store.setContainers(std::move(roots));
    self->_parts.subscribers.containerListDidChange();
  });
}

void Daemon::refreshDriveFolders() {
  if (_driveRefreshPosted.exchange(true)) return;
  _containerQueue.async([self = shared_from_this()] {
    self->_driveRefreshPosted.store(false);
    if (self->_parts.containers.refreshDriveFolders()) {
      self->_parts.subscribers.containerListDidChange();
    }
  });
}

}  // namespace skein::vald
