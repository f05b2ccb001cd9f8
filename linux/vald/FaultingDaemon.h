#pragma once

#include <chrono>
#include <functional>
#include <memory>

#include "base/Executor.h"
#include "linux/protocol/LocalDaemon.h"
#include "linux/vald/FaultInjector.h"

namespace skein::vald {

// A daemon whose calls fail when they are told to: for tests and trials of its clients.
// Faults are taken in the order in which the calls come. Everything else is handed on.
class FaultingDaemon final : public LocalDaemon,
                             public std::enable_shared_from_this<FaultingDaemon> {
 public:
  struct Parts {
    std::shared_ptr<LocalDaemon> daemon;
    std::shared_ptr<Executor> executor;
    bool allowed = false;
    // Blocks the executor's thread that it runs on.
    std::function<void(std::chrono::milliseconds)> sleep;
    // Closes the clients' connections; their open calls get no reply. Any thread.
    std::function<void()> dropConnections;
  };
  explicit FaultingDaemon(Parts parts);

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
  void getItemUpdateSenderWithReceiver(
      std::shared_ptr<VLItemNotificationReceiving> receiver,
      Reply<std::shared_ptr<VLItemNotificationSender>, NSErrorPtr> reply) override;
  void URLForFileObjectID(VLFileObjectID fileObjectID, Reply<NSURLPtr, NSErrorPtr> reply) override;
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
  void injectFault(FaultInjection fault, Reply<NSErrorPtr> reply) override;
  void stop(Reply<NSErrorPtr> reply) override;

 private:
  // Runs `call(reply)`, or the fault that is planned for `method` instead.
  template <class R, class Call>
  void intercept(const char* method, R reply, Call call);

  const Parts _parts;
  FaultInjector _injector;
};

}  // namespace skein::vald
