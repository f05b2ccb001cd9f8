#include "tests/support/ScriptedDaemon.h"

#include "platform/log/Description.h"

namespace skein {

class ScriptedSender::Proxy final : public VLItemNotificationSending {
 public:
  Proxy(std::shared_ptr<ScriptedSender> sender, ErrorHandler errorHandler)
      : _sender(std::move(sender)), _errorHandler(std::move(errorHandler)) {}
  void boostPriority(Reply<> reply) override { _sender->boost(std::move(reply), _errorHandler); }
  void watchItemAtURL(const NSURLPtr& url, std::uint64_t options,
                      Reply<NSErrorPtr> reply) override {
    _sender->watch(url, options, std::move(reply), _errorHandler);
  }
  void invalidate() override { _sender->invalidate(); }

 private:
  const std::shared_ptr<ScriptedSender> _sender;
  const ErrorHandler _errorHandler;
};

std::shared_ptr<VLItemNotificationSending> ScriptedSender::remoteObjectProxyWithErrorHandler(
    std::function<void(NSErrorPtr)> errorHandler) {
  return std::make_shared<Proxy>(shared_from_this(), std::move(errorHandler));
}

void ScriptedSender::invalidate() {
  _transcript.add(_name + " invalidate");
  if (invalidated) invalidated();
  releaseReceiver();
}

void ScriptedSender::holdReceiver(std::shared_ptr<VLItemNotificationReceiving> receiver) {
  // The old one goes after the lock: it may hold this sender's last reference.
  MutexLock lock(_mutex);
  _receiver.swap(receiver);
}

std::shared_ptr<VLItemNotificationReceiving> ScriptedSender::receiver() const {
  MutexLock lock(_mutex);
  return _receiver;
}

void ScriptedSender::boost(Reply<> reply, ErrorHandler errorHandler) {
  _transcript.add(_name + " boostPriority");
  boosts.hold(std::move(reply), std::move(errorHandler));
}

void ScriptedSender::watch(const NSURLPtr& url, std::uint64_t options, Reply<NSErrorPtr> reply,
                           ErrorHandler errorHandler) {
  _transcript.add(_name + " watch " + description(url) + " " + std::to_string(options));
  watches.hold(std::move(reply), std::move(errorHandler));
}

class ScriptedDaemon::Proxy final : public VLDaemon {
 public:
  Proxy(ScriptedDaemon& daemon, ErrorHandler errorHandler)
      : _daemon(daemon), _errorHandler(std::move(errorHandler)) {}

  void enumerateItemsInFolder(std::optional<VLFileObjectID> folder, std::uint8_t sortOrder,
                              std::uint64_t offset, std::uint64_t limit,
                              ItemsReply completion) override {
    say("items in " + description(folder) + page(sortOrder, offset, limit));
    _daemon.pages.hold(std::move(completion), _errorHandler);
  }
  void enumerateAllFoldersWithSortOrder(std::uint8_t sortOrder, std::uint64_t offset,
                                        std::uint64_t limit, ItemsReply completion) override {
    say("all folders" + page(sortOrder, offset, limit));
    _daemon.folderPages.hold(std::move(completion), _errorHandler);
  }
  void currentNotifRankWithReply(Reply<std::uint64_t, NSErrorPtr> reply) override {
    say("rank");
    _daemon.ranks.hold(std::move(reply), _errorHandler);
  }
  void enumerateWorkingSetChangesFromChangeToken(
      std::optional<NSData> changeToken, std::uint64_t limit,
      Reply<NSFileProviderItems, std::vector<VLFileObjectID>, std::optional<NSData>, NSErrorPtr>
          completion) override {
    say("working set from " + (changeToken ? std::string(changeToken->view()) : "nil") + " limit " +
        std::to_string(limit));
    _daemon.workingSetChanges.hold(std::move(completion), _errorHandler);
  }
  void getItemUpdateSenderWithReceiver(std::shared_ptr<VLItemNotificationReceiving> receiver,
                                       SenderReply reply) override {
    say("sender");
    _daemon.senders.hold(
        [receiver = std::move(receiver), reply = std::move(reply)](
            std::shared_ptr<VLItemNotificationSender> sender, NSErrorPtr error) mutable {
          if (auto* own = dynamic_cast<ScriptedSender*>(sender.get())) {
            own->holdReceiver(std::move(receiver));
          }
          reply(std::move(sender), {{"protocol", "1"}}, std::move(error));
        },
        _errorHandler);
  }
  void getContainerURLForID(
      const std::string& containerID, bool recreateDocumentsIfNeeded,
      Reply<NSURLPtr, std::optional<std::string>, bool, NSErrorPtr> reply) override {
    say("url of container " + containerID + (recreateDocumentsIfNeeded ? ", recreated" : ""));
    _daemon.containerURLs.hold(std::move(reply), _errorHandler);
  }
  void checkIfItemIsShareableWithInode(std::uint64_t inode,
                                       Reply<bool, NSErrorPtr> reply) override {
    say("is inode " + std::to_string(inode) + " shareable");
    _daemon.shareableChecks.hold(std::move(reply), _errorHandler);
  }
  void refreshSharingStateForItemIdentifier(const NSFileProviderItemIdentifier& identifier,
                                            Reply<NSErrorPtr> reply) override {
    say("refresh the sharing of " + identifier);
    _daemon.sharingRefreshes.hold(std::move(reply), _errorHandler);
  }
  void getShareOptionsOfItemIdentifier(
      const NSFileProviderItemIdentifier& identifier,
      Reply<std::int64_t, std::int64_t, std::int64_t, std::optional<std::string>, NSErrorPtr> reply)
      override {
    say("share options of " + identifier);
    _daemon.shareOptions.hold(std::move(reply), _errorHandler);
  }
  void resolveFileObjectIDsToContentRecordIDs(
      const std::vector<VLFileObjectID>& fileObjectIDs,
      Reply<std::optional<VLContentRecordIDs>, NSErrorPtr> reply) override {
    say("content records of " + description(fileObjectIDs));
    _daemon.contentRecords.hold(std::move(reply), _errorHandler);
  }

 private:
  void say(const std::string& call) { _daemon._transcript.add("daemon: " + call); }
  static std::string page(std::uint8_t sortOrder, std::uint64_t offset, std::uint64_t limit) {
    return " order " + std::to_string(sortOrder) + " offset " + std::to_string(offset) + " limit " +
           std::to_string(limit);
  }

  ScriptedDaemon& _daemon;
  const ErrorHandler _errorHandler;
};

std::shared_ptr<VLDaemon> ScriptedDaemon::remoteObjectProxyWithErrorHandler(
    std::function<void(NSErrorPtr)> errorHandler) {
  auto proxy = std::make_shared<Proxy>(*this, std::move(errorHandler));
  MutexLock lock(_mutex);
  _proxies.push_back(proxy);
  return proxy;
}

std::shared_ptr<ScriptedSender> ScriptedDaemon::makeSender() {
  MutexLock lock(_mutex);
  auto sender = std::make_shared<ScriptedSender>("sender " + std::to_string(_senders.size() + 1),
                                                 _transcript, _ledger);
  _senders.push_back(sender);
  return sender;
}

void ScriptedDaemon::releaseReceivers() {
  std::vector<std::weak_ptr<ScriptedSender>> senders;
  {
    MutexLock lock(_mutex);
    senders = _senders;
  }
  for (const auto& weak : senders) {
    if (const auto sender = weak.lock()) sender->releaseReceiver();
  }
}

}  // namespace skein
