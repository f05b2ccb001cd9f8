// A LocalDaemon that a test scripts: it notes what it was asked and answers what it was
// told to, at once or when the test says so.
#pragma once

#include <atomic>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "base/Executor.h"
#include "base/Mutex.h"
#include "linux/protocol/DocumentURL.h"
#include "linux/protocol/LinkBreaking.h"
#include "linux/protocol/LocalDaemon.h"
#include "tests/protocol/FakeCloud.h"
#include "tests/protocol/FakeFiles.h"
#include "tests/protocol/FakeRecords.h"
#include "tests/protocol/FakeShares.h"

namespace skein {

// vald's end of a watch, as the test sees it.
class FakeSender final : public VLItemNotificationSender,
                         public LinkBreaking,
                         public std::enable_shared_from_this<FakeSender> {
 public:
  FakeSender(std::shared_ptr<VLItemNotificationReceiving> to, std::shared_ptr<Inbox<int>> ended)
      : receiver(std::move(to)), _ended(std::move(ended)) {}
  ~FakeSender() override { _ended->add(1); }

  void boostPriority(Reply<> reply) override { boosts.add(std::move(reply)); }
  void watchItemAtURL(const NSURLPtr& url, std::uint64_t options,
                      Reply<NSErrorPtr> gatherReply) override {
    watches.add({url->path(), options, fileObjectIDOfDocumentURL(url), std::move(gatherReply)});
  }
  void invalidate() override { invalidations.add(1); }
  std::shared_ptr<VLItemNotificationSending> remoteObjectProxyWithErrorHandler(
      std::function<void(NSErrorPtr)>) override {
    return shared_from_this();
  }
  void setLinkBrokenHandler(std::function<void(NSErrorPtr)> handler) override {
    linkBrokenHandlers.add(std::move(handler));
  }

  struct Watch {
    std::string path;
    std::uint64_t options;
    std::optional<VLFileObjectID> item;
    Reply<NSErrorPtr> reply;
  };
  const std::shared_ptr<VLItemNotificationReceiving> receiver;
  Inbox<Reply<>> boosts;
  Inbox<Watch> watches;
  Inbox<int> invalidations;
  Inbox<std::function<void(NSErrorPtr)>> linkBrokenHandlers;

 private:
  const std::shared_ptr<Inbox<int>> _ended;
};

class FakeDaemon final : public LocalDaemon {
 public:
  FakeFiles fakeFiles;
  FakeShares fakeShares;
  LocalFiles& files() override { return fakeFiles; }
  LocalShares& shares() override { return fakeShares; }
  FakeRecords fakeRecords;
  LocalRecords& records() override { return fakeRecords; }
  FakeCloud fakeCloud;
  LocalCloud& cloud() override { return fakeCloud; }

  // What is answered; set it before asking.
  VLQueryItems items;
  std::uint64_t number = 0;
  std::vector<VLFileObjectID> deletions;
  std::optional<NSData> token;
  NSURLPtr url;
  std::vector<NSURLPtr> urls;
  VLQueryItemPtr item;
  NSErrorPtr error;
  LocalDaemonStatus statusNow;
  std::vector<IndexDifference> differences;

  // State that pushes change while others ask.
  void setAccount(std::optional<LocalAccount> account) {
    MutexLock lock(_mutex);
    _account = std::move(account);
  }
  void setContainers(std::vector<VLContainer::Properties> containers) {
    MutexLock lock(_mutex);
    _containers = std::move(containers);
  }

  // What was asked, as text, in order.
  Inbox<std::string> asked;
  // Folder listings are kept here unanswered while `holds` is set.
  std::atomic<bool> holds{false};
  Inbox<ItemsReply> held;
  Inbox<std::shared_ptr<FakeSender>> senders;
  std::shared_ptr<Inbox<int>> sendersGone = std::make_shared<Inbox<int>>();
  Inbox<std::weak_ptr<LocalDaemonEvents>> subscribers;

  void enumerateItemsInFolder(std::optional<VLFileObjectID> folder, std::uint8_t sortOrder,
                              std::uint64_t offset, std::uint64_t limit,
                              ItemsReply completion) override {
    asked.add("items " + (folder ? folder->asString() : "nil") + ' ' + std::to_string(sortOrder) +
              ' ' + std::to_string(offset) + ' ' + std::to_string(limit));
    if (holds) {
      held.add(std::move(completion));
    } else {
      completion(provided(), number, error);
    }
  }
  void enumerateAllFoldersWithSortOrder(std::uint8_t sortOrder, std::uint64_t offset,
                                        std::uint64_t limit, ItemsReply completion) override {
    asked.add("folders " + std::to_string(sortOrder) + ' ' + std::to_string(offset) + ' ' +
              std::to_string(limit));
    completion(provided(), number, error);
  }
  void currentNotifRankWithReply(Reply<std::uint64_t, NSErrorPtr> reply) override {
    asked.add("rank");
    reply(number, error);
  }
  void enumerateWorkingSetChangesFromChangeToken(
      std::optional<NSData> changeToken, std::uint64_t limit,
      Reply<NSFileProviderItems, std::vector<VLFileObjectID>, std::optional<NSData>, NSErrorPtr>
          completion) override {
    asked.add("changes " + (changeToken ? '"' + std::string(changeToken->view()) + '"' : "nil") +
              ' ' + std::to_string(limit));
    completion(provided(), deletions, token, error);
  }
  void getItemUpdateSenderWithReceiver(std::shared_ptr<VLItemNotificationReceiving> receiver,
                                       SenderReply reply) override {
    if (error) {
      reply(nullptr, {}, error);
      return;
    }
    auto sender = std::make_shared<FakeSender>(std::move(receiver), sendersGone);
    senders.add(sender);
    reply(std::move(sender), {}, nullptr);
  }
  void URLForFileObjectID(VLFileObjectID fileObjectID, Reply<NSURLPtr, NSErrorPtr> reply) override {
    asked.add("url " + fileObjectID.asString());
    reply(url, error);
  }
  void URLsForFileObjectIDs(std::vector<VLFileObjectID> fileObjectIDs,
                            Reply<std::vector<NSURLPtr>, NSErrorPtr> reply) override {
    asked.add(std::to_string(fileObjectIDs.size()) + " urls");
    reply(urls, error);
  }
  void queryItemForURL(NSURLPtr queried, bool scanFirst,
                       Reply<VLQueryItemPtr, NSErrorPtr> reply) override {
    asked.add("item " + queried->path() + (scanFirst ? " scan" : ""));
    reply(item, error);
  }
  void account(Reply<std::optional<LocalAccount>, NSErrorPtr> reply) override {
    std::optional<LocalAccount> now;
    {
      MutexLock lock(_mutex);
      now = _account;
    }
    reply(now, error);
  }
  void logIn(LocalAccount newAccount, Reply<NSErrorPtr> reply) override {
    setAccount(std::move(newAccount));
    reply(error);
  }
  void logOut(Reply<NSErrorPtr> reply) override {
    setAccount(std::nullopt);
    reply(error);
  }
  void containers(Reply<std::vector<VLContainer::Properties>, NSErrorPtr> reply) override {
    std::vector<VLContainer::Properties> now;
    {
      MutexLock lock(_mutex);
      now = _containers;
    }
    reply(now, error);
  }
  void subscribe(std::shared_ptr<LocalDaemonEvents> events, Reply<NSErrorPtr> reply) override {
    subscribers.add(events);
    reply(error);
  }
  void status(Reply<LocalDaemonStatus, NSErrorPtr> reply) override { reply(statusNow, error); }
  void checkIndex(std::uint64_t limit,
                  Reply<std::vector<IndexDifference>, NSErrorPtr> reply) override {
    asked.add("check " + std::to_string(limit));
    if (holds) {
      heldChecks.add(std::move(reply));
    } else {
      reply(differences, error);
    }
  }
  Inbox<Reply<std::vector<IndexDifference>, NSErrorPtr>> heldChecks;
  void injectFault(FaultInjection fault, Reply<NSErrorPtr> reply) override {
    asked.add("fault " + fault.method + ' ' + std::to_string(static_cast<int>(fault.action)) + ' ' +
              fault.errorDomain + ' ' + std::to_string(fault.errorCode) + ' ' +
              std::to_string(fault.delayMilliseconds) + ' ' + std::to_string(fault.times));
    reply(error);
  }
  void stop(Reply<NSErrorPtr> reply) override {
    asked.add("stop");
    reply(error);
  }

 private:
  NSFileProviderItems provided() const { return {items.begin(), items.end()}; }

  Mutex _mutex;
  std::optional<LocalAccount> _account SKEIN_GUARDED_BY(_mutex);
  std::vector<VLContainer::Properties> _containers SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein
