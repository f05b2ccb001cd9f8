#include "linux/protocol/DaemonClient.h"

#include <utility>
#include <vector>

#include "base/SerialQueue.h"
#include "linux/protocol/CloudProxy.h"
#include "linux/protocol/DaemonCalls.h"
#include "linux/protocol/DaemonCodec.h"
#include "linux/protocol/FilesProxy.h"
#include "linux/protocol/RecordsProxy.h"
#include "linux/protocol/SharesProxy.h"
#include "linux/protocol/UpdateLink.h"

namespace skein {
namespace {

// A subscriber, as vald pushes to it; held weakly. Deliveries have a queue of their own.
class EventsObject final : public wire::Events::Server {
 public:
  EventsObject(std::weak_ptr<LocalDaemonEvents> events, std::shared_ptr<Executor> executor)
      : _events(std::move(events)), _deliveries("vald-events", std::move(executor)) {}

  kj::Promise<void> accountDidChange(AccountDidChangeContext context) override {
    std::optional<LocalAccount> account;
    if (context.getParams().hasAccount()) {
      account = codec::decode(context.getParams().getAccount());
    }
    deliver([account = std::move(account)](LocalDaemonEvents& events) {
      events.accountDidChange(account);
    });
    return kj::READY_NOW;
  }
  kj::Promise<void> containerListDidChange(ContainerListDidChangeContext) override {
    deliver([](LocalDaemonEvents& events) { events.containerListDidChange(); });
    return kj::READY_NOW;
  }

 private:
  void deliver(UniqueFunction<void(LocalDaemonEvents&)> call) {
    _deliveries.async([weak = _events, call = std::move(call)]() mutable {
      if (const auto events = weak.lock()) call(*events);
    });
  }

  const std::weak_ptr<LocalDaemonEvents> _events;
  SerialQueue _deliveries;
};

template <class Results>
Task replyWithPage(VLDaemon::ItemsReply& reply, const Results& results) {
  return [reply = std::move(reply), items = codec::decodeProviderItems(results.getItems()),
          next = results.getNextOffset(), error = codec::errorOf(results)]() mutable {
    reply(std::move(items), next, std::move(error));
  };
}

class DaemonProxy final : public LocalDaemon {
 public:
  explicit DaemonProxy(DaemonCalls calls)
      : _calls(std::move(calls)),
        _files(makeFilesProxy(_calls)),
        _records(makeRecordsProxy(_calls)),
        _shares(makeSharesProxy(_calls)),
        _cloud(makeCloudProxy(_calls)) {}

  LocalFiles& files() override { return *_files; }
  LocalRecords& records() override { return *_records; }
  LocalShares& shares() override { return *_shares; }
  LocalCloud& cloud() override { return *_cloud; }

  void enumerateItemsInFolder(std::optional<VLFileObjectID> folder, std::uint8_t sortOrder,
                              std::uint64_t offset, std::uint64_t limit,
                              ItemsReply completion) override {
    call(
        [=](wire::Daemon::Client& daemon) {
          auto request = daemon.enumerateItemsInFolderRequest();
          if (folder) codec::encode(request.initFolder(), *folder);
          request.setSortOrder(sortOrder);
          request.setOffset(offset);
          request.setLimit(limit);
          return request.send();
        },
        [reply = std::move(completion)](const auto& results) mutable {
          return replyWithPage(reply, results);
        });
  }

  void enumerateAllFoldersWithSortOrder(std::uint8_t sortOrder, std::uint64_t offset,
                                        std::uint64_t limit, ItemsReply completion) override {
    call(
        [=](wire::Daemon::Client& daemon) {
          auto request = daemon.enumerateAllFoldersRequest();
          request.setSortOrder(sortOrder);
          request.setOffset(offset);
          request.setLimit(limit);
          return request.send();
        },
        [reply = std::move(completion)](const auto& results) mutable {
          return replyWithPage(reply, results);
        });
  }

  void currentNotifRankWithReply(Reply<std::uint64_t, NSErrorPtr> reply) override {
    call([](wire::Daemon::Client& daemon) { return daemon.currentNotifRankRequest().send(); },
         [reply = std::move(reply)](const auto& results) mutable -> Task {
           return [reply = std::move(reply), rank = results.getRank(),
                   error = codec::errorOf(results)]() mutable { reply(rank, std::move(error)); };
         });
  }

  void enumerateWorkingSetChangesFromChangeToken(
      std::optional<NSData> changeToken, std::uint64_t limit,
      Reply<NSFileProviderItems, std::vector<VLFileObjectID>, std::optional<NSData>, NSErrorPtr>
          completion) override {
    call(
        [changeToken = std::move(changeToken), limit](wire::Daemon::Client& daemon) {
          auto request = daemon.enumerateWorkingSetChangesRequest();
          if (changeToken) request.setChangeToken(codec::bytes(*changeToken));
          request.setLimit(limit);
          return request.send();
        },
        [reply = std::move(completion)](const auto& results) mutable -> Task {
          std::vector<VLFileObjectID> deletions;
          for (const auto id : results.getDeletions()) deletions.push_back(codec::decode(id));
          std::optional<NSData> token;
          if (results.hasChangeToken()) {
            const auto data = results.getChangeToken();
            token = NSData(std::span(data.begin(), data.size()));
          }
          return
              [reply = std::move(reply), updates = codec::decodeProviderItems(results.getUpdates()),
               deletions = std::move(deletions), token = std::move(token),
               error = codec::errorOf(results)]() mutable {
                reply(std::move(updates), std::move(deletions), std::move(token), std::move(error));
              };
        });
  }

  void getItemUpdateSenderWithReceiver(std::shared_ptr<VLItemNotificationReceiving> receiver,
                                       SenderReply reply) override {
    auto link = std::make_shared<UpdateLink>(_calls.socket(), std::move(receiver));
    call(
        [link](wire::Daemon::Client& daemon) {
          auto request = daemon.getItemUpdateSenderRequest();
          request.setReceiver(link->exportReceiver());
          return request.send();
        },
        [link, reply = std::move(reply)](auto& results) mutable -> Task {
          std::shared_ptr<VLItemNotificationSender> sender;
          if (results.hasSender()) {
            link->attach(results.getSender());
            sender = makeSender(std::move(link));
          } else {
            link->end();
          }
          return [reply = std::move(reply), sender = std::move(sender),
                  error = codec::errorOf(results)]() mutable {
            reply(std::move(sender), {}, std::move(error));
          };
        });
  }

  void getContainerURLForID(
      const std::string& containerID, bool recreateDocumentsIfNeeded,
      Reply<NSURLPtr, std::optional<std::string>, bool, NSErrorPtr> reply) override {
    call(
        [=](wire::Daemon::Client& daemon) {
          auto request = daemon.getContainerURLForIDRequest();
          request.setContainerID(codec::bytes(containerID));
          request.setRecreateDocumentsIfNeeded(recreateDocumentsIfNeeded);
          return request.send();
        },
        [reply = std::move(reply)](const auto& results) mutable -> Task {
          NSURLPtr url;
          if (results.hasUrl()) url = NSURL::fileURLWithPath(codec::text(results.getUrl()));
          std::optional<std::string> displayName;
          if (results.hasDisplayName()) displayName = codec::text(results.getDisplayName());
          return
              [reply = std::move(reply), url = std::move(url), displayName = std::move(displayName),
               recreated = results.getRecreated(), error = codec::errorOf(results)]() mutable {
                reply(std::move(url), std::move(displayName), recreated, std::move(error));
              };
        });
  }

  void URLForFileObjectID(VLFileObjectID fileObjectID, Reply<NSURLPtr, NSErrorPtr> reply) override {
    call(
        [=](wire::Daemon::Client& daemon) {
          auto request = daemon.urlForFileObjectIDRequest();
          codec::encode(request.initFileObjectID(), fileObjectID);
          return request.send();
        },
        [reply = std::move(reply)](const auto& results) mutable -> Task {
          NSURLPtr url;
          if (results.hasUrl()) url = NSURL::fileURLWithPath(codec::text(results.getUrl()));
          return [reply = std::move(reply), url = std::move(url),
                  error = codec::errorOf(results)]() mutable {
            reply(std::move(url), std::move(error));
          };
        });
  }

  void URLsForFileObjectIDs(std::vector<VLFileObjectID> fileObjectIDs,
                            Reply<std::vector<NSURLPtr>, NSErrorPtr> reply) override {
    call(
        [ids = std::move(fileObjectIDs)](wire::Daemon::Client& daemon) {
          auto request = daemon.urlsForFileObjectIDsRequest();
          codec::encode(request.initFileObjectIDs(static_cast<unsigned>(ids.size())), ids);
          return request.send();
        },
        [reply = std::move(reply)](const auto& results) mutable -> Task {
          std::vector<NSURLPtr> urls;
          urls.reserve(results.getUrls().size());
          for (const auto url : results.getUrls()) {
            urls.push_back(url.size() > 0 ? NSURL::fileURLWithPath(codec::text(url)) : nullptr);
          }
          return [reply = std::move(reply), urls = std::move(urls),
                  error = codec::errorOf(results)]() mutable {
            reply(std::move(urls), std::move(error));
          };
        });
  }

  void queryItemForURL(NSURLPtr url, bool scanFirst,
                       Reply<VLQueryItemPtr, NSErrorPtr> reply) override {
    call(
        [=](wire::Daemon::Client& daemon) {
          auto request = daemon.queryItemForURLRequest();
          if (url) request.setUrl(codec::bytes(url->path()));
          request.setScanFirst(scanFirst);
          return request.send();
        },
        [reply = std::move(reply)](const auto& results) mutable -> Task {
          VLQueryItemPtr item;
          if (results.hasItem()) item = codec::decode(results.getItem());
          return [reply = std::move(reply), item = std::move(item),
                  error = codec::errorOf(results)]() mutable {
            reply(std::move(item), std::move(error));
          };
        });
  }

  void account(Reply<std::optional<LocalAccount>, NSErrorPtr> reply) override {
    call([](wire::Daemon::Client& daemon) { return daemon.accountRequest().send(); },
         [reply = std::move(reply)](const auto& results) mutable -> Task {
           std::optional<LocalAccount> account;
           if (results.hasAccount()) account = codec::decode(results.getAccount());
           return [reply = std::move(reply), account = std::move(account),
                   error = codec::errorOf(results)]() mutable {
             reply(std::move(account), std::move(error));
           };
         });
  }

  void logIn(LocalAccount account, Reply<NSErrorPtr> reply) override {
    call(
        [account = std::move(account)](wire::Daemon::Client& daemon) {
          auto request = daemon.logInRequest();
          codec::encode(request.initAccount(), account);
          return request.send();
        },
        errorReply(std::move(reply)));
  }

  void logOut(Reply<NSErrorPtr> reply) override {
    call([](wire::Daemon::Client& daemon) { return daemon.logOutRequest().send(); },
         errorReply(std::move(reply)));
  }

  void containers(Reply<std::vector<VLContainer::Properties>, NSErrorPtr> reply) override {
    call([](wire::Daemon::Client& daemon) { return daemon.containersRequest().send(); },
         [reply = std::move(reply)](const auto& results) mutable -> Task {
           std::vector<VLContainer::Properties> containers;
           for (const auto one : results.getContainers()) {
             containers.push_back(codec::decode(one));
           }
           return [reply = std::move(reply), containers = std::move(containers),
                   error = codec::errorOf(results)]() mutable {
             reply(std::move(containers), std::move(error));
           };
         });
  }

  void subscribe(std::shared_ptr<LocalDaemonEvents> events, Reply<NSErrorPtr> reply) override {
    call(
        [weak = std::weak_ptr(events),
         executor = _calls.socket()->executor()](wire::Daemon::Client& daemon) {
          auto request = daemon.subscribeRequest();
          request.setEvents(kj::heap<EventsObject>(weak, executor));
          return request.send();
        },
        errorReply(std::move(reply)));
  }

  void status(Reply<LocalDaemonStatus, NSErrorPtr> reply) override {
    call([](wire::Daemon::Client& daemon) { return daemon.statusRequest().send(); },
         [reply = std::move(reply)](const auto& results) mutable -> Task {
           return [reply = std::move(reply), status = codec::decode(results.getStatus()),
                   error = codec::errorOf(results)]() mutable {
             reply(std::move(status), std::move(error));
           };
         });
  }

  void checkIndex(std::uint64_t limit,
                  Reply<std::vector<IndexDifference>, NSErrorPtr> reply) override {
    call(
        [=](wire::Daemon::Client& daemon) {
          auto request = daemon.checkIndexRequest();
          request.setLimit(limit);
          return request.send();
        },
        [reply = std::move(reply)](const auto& results) mutable -> Task {
          std::vector<IndexDifference> differences;
          for (const auto one : results.getDifferences()) {
            differences.push_back(codec::decode(one));
          }
          return [reply = std::move(reply), differences = std::move(differences),
                  error = codec::errorOf(results)]() mutable {
            reply(std::move(differences), std::move(error));
          };
        },
        Patience::WhilePeerLives);
  }

  void injectFault(FaultInjection fault, Reply<NSErrorPtr> reply) override {
    call(
        [fault = std::move(fault)](wire::Daemon::Client& daemon) {
          auto request = daemon.injectFaultRequest();
          codec::encode(request.initFault(), fault);
          return request.send();
        },
        errorReply(std::move(reply)));
  }

  void stop(Reply<NSErrorPtr> reply) override {
    call([](wire::Daemon::Client& daemon) { return daemon.stopRequest().send(); },
         errorReply(std::move(reply)));
  }

 private:
  template <class Build, class Decode>
  void call(Build build, Decode decode, Patience patience = Patience::Deadline) {
    _calls.call<wire::Daemon>(std::move(build), std::move(decode), patience);
  }

  const DaemonCalls _calls;
  const std::unique_ptr<LocalFiles> _files;
  const std::unique_ptr<LocalRecords> _records;
  const std::unique_ptr<LocalShares> _shares;
  const std::unique_ptr<LocalCloud> _cloud;
};

}  // namespace

DaemonClient::DaemonClient(std::shared_ptr<RpcLoop> loop, std::shared_ptr<Executor> executor,
                           Options options)
    : _socket(std::make_shared<SocketClient>(
          std::move(loop), std::move(executor),
          SocketClient::Options{"vald", std::move(options.socketPath), std::move(options.program),
                                options.deadline})) {}

DaemonClient::~DaemonClient() { _socket->close(); }

std::shared_ptr<LocalDaemon> DaemonClient::remoteObjectProxyWithErrorHandler(
    std::function<void(NSErrorPtr)> errorHandler) {
  return std::make_shared<DaemonProxy>(DaemonCalls(_socket, std::move(errorHandler)));
}

void DaemonClient::setConnectedHandler(std::function<void()> handler) {
  _socket->setConnectedHandler(std::move(handler));
}

ProgramToStart daemonProgram(const std::string& store, const std::string& socketPath,
                             const std::string& logPath) {
  ProgramToStart program;
  program.program = "vald";
  program.arguments = {"--store", store};
  program.socketPath = socketPath;
  program.logPath = logPath;
  return program;
}

}  // namespace skein
