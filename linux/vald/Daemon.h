#pragma once

#include <atomic>
#include <functional>
#include <memory>

#include "base/Executor.h"
#include "base/SerialQueue.h"
#include "linux/protocol/LocalDaemon.h"
#include "linux/vald/Accounts.h"
#include "linux/vald/Containers.h"
#include "linux/vald/EventSubscribers.h"
#include "linux/vald/FaultInjector.h"
#include "linux/vald/ItemUpdateSenders.h"
#include "linux/vald/Store.h"

namespace skein::vald {

// What the daemon works with; each outlives it and what it posted.
struct DaemonParts {
  std::shared_ptr<Executor> executor;
  // For what takes minutes, so that it never keeps a listing waiting.
  std::shared_ptr<Executor> slowExecutor;
  Store& store;
  ItemUpdateSenders& senders;
  Accounts& accounts;
  Containers& containers;
  EventSubscribers& subscribers;
  LocalFiles& files;
  LocalRecords& records;
  LocalShares& shares;
  LocalCloud& cloud;
  FaultInjector& faults;
  Log& log;
  std::string drive;           // the drive's folder, absolute
  std::function<void()> stop;  // asks the process to end; returns at once
  // Before the store hears that the containers are these.
  std::function<void(const std::vector<StoreRoot>&)> containersWillChange = nullptr;
  // What a person should know of the drive: LocalDaemonStatus::notes.
  std::function<std::vector<std::string>()> notes = nullptr;
};

// vald's core: every call is posted to the executor and answered from there, exactly
// once, under no lock. Listings, changes and update senders answer vlc_errorLoggedOut
// while nobody is logged in; lookups do not ask. An account without a per-app identifier
// is the client's business.
class Daemon final : public LocalDaemon, public std::enable_shared_from_this<Daemon> {
 public:
  explicit Daemon(DaemonParts parts);

  LocalFiles& files() override { return _parts.files; }
  LocalRecords& records() override { return _parts.records; }
  LocalShares& shares() override { return _parts.shares; }
  LocalCloud& cloud() override { return _parts.cloud; }

  void enumerateItemsInFolder(std::optional<VLFileObjectID> folder, std::uint8_t sortOrder,
                              std::uint64_t offset, std::uint64_t limit,
                              ItemsReply completion) override;
  void enumerateAllFoldersWithSortOrder(std::uint8_t sortOrder, std::uint64_t offset,
                                        std::uint64_t limit, ItemsReply completion) override;
  void currentNotifRankWithReply(Reply<std::uint64_t, NSErrorPtr> reply) override;
  void enumerateWorkingSetChangesFromChangeToken(
      std::optional<NSData> changeToken, std::uint64_t limit,
      Reply<NSFileProviderItems, std::vector<VLFileObjectID>, std::optional<NSData>, NSErrorPtr>
          completion) override;
  void getItemUpdateSenderWithReceiver(std::shared_ptr<VLItemNotificationReceiving> receiver,
                                       SenderReply reply) override;

  void getContainerURLForID(
      const std::string& containerID, bool recreateDocumentsIfNeeded,
      Reply<NSURLPtr, std::optional<std::string>, bool, NSErrorPtr> reply) override;

  void URLForFileObjectID(VLFileObjectID fileObjectID, Reply<NSURLPtr, NSErrorPtr> reply) override;
  void URLsForFileObjectIDs(std::vector<VLFileObjectID> fileObjectIDs,
                            Reply<std::vector<NSURLPtr>, NSErrorPtr> reply) override;
  void queryItemForURL(NSURLPtr url, bool scanFirst,
                       Reply<VLQueryItemPtr, NSErrorPtr> reply) override;
  void account(Reply<std::optional<LocalAccount>, NSErrorPtr> reply) override;
  void logIn(LocalAccount account, Reply<NSErrorPtr> reply) override;
  void logOut(Reply<NSErrorPtr> reply) override;
  void containers(Reply<std::vector<VLContainer::Properties>, NSErrorPtr> reply) override;
  void subscribe(std::shared_ptr<LocalDaemonEvents> events, Reply<NSErrorPtr> reply) override;
  void status(Reply<LocalDaemonStatus, NSErrorPtr> reply) override;
  void checkIndex(std::uint64_t limit,
                  Reply<std::vector<IndexDifference>, NSErrorPtr> reply) override;
  // Plans it; the server has every call pass by the faults.
  void injectFault(FaultInjection fault, Reply<NSErrorPtr> reply) override;
  void stop(Reply<NSErrorPtr> reply) override;

  // Looks at the containers again, soon, and tells the store and the subscribers what
  // differs. Calls that come before it has begun are one. Any thread.
  void refreshContainers();
  // The same for the drive's own folders alone: for every change of the store.
  void refreshDriveFolders();

 private:
  // Posts `work(daemon, reply)`.
  template <class R, class Work>
  void answer(R reply, Work work);
  // The same, answered with an error while nobody is logged in.
  template <class R, class Work>
  void answerLoggedIn(R reply, Work work);
  // Announces what logging in or out changed.
  void accountChanged();

  const DaemonParts _parts;
  SerialQueue _accountQueue;
  SerialQueue _checkQueue;  // one check of the index at a time
  SerialQueue _containerQueue;
  std::atomic<bool> _refreshPosted{false};
  std::atomic<bool> _driveRefreshPosted{false};
};

}  // namespace skein::vald
