#include "linux/protocol/DaemonServer.h"

#include <algorithm>
#include <utility>
#include <vector>

#include "linux/protocol/Answer.h"
#include "linux/protocol/CloudObject.h"
#include "linux/protocol/DaemonReferences.h"
#include "linux/protocol/FilesObject.h"
#include "linux/protocol/LinkBreaking.h"
#include "linux/protocol/RecordsObject.h"
#include "linux/protocol/SharesObject.h"
#include "linux/protocol/SocketServer.h"
#include "linux/protocol/WithFaults.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

// What one connection may have and one call may ask for.
constexpr std::size_t kMostSenders = 2048;
constexpr std::size_t kMostSubscriptions = 16;
constexpr std::uint64_t kMostDifferences = 10'000;

void encodePage(auto results, const NSFileProviderItems& items, std::uint64_t nextOffset,
                const NSErrorPtr& error) {
  codec::encode(results.initItems(static_cast<unsigned>(items.size())), items);
  results.setNextOffset(nextOffset);
  codec::setError(results, error);
}

// All of `values`, into a list as long as that.
void encodeAll(auto list, const auto& values) {
  unsigned at = 0;
  for (const auto& value : values) codec::encode(list[at++], value);
}

// vald, as one connection sees it. Lives on the loop's thread.
class DaemonObject : public wire::Daemon::Server,
                     public CloudObject,
                     public FilesObject,
                     public RecordsObject,
                     public SharesObject {
 public:
  explicit DaemonObject(DaemonServicePtr service)
      : CloudObject(service),
        FilesObject(service),
        RecordsObject(service),
        SharesObject(service),
        _service(std::move(service)) {}

  kj::Promise<void> enumerateItemsInFolder(EnumerateItemsInFolderContext context) override {
    const auto params = context.getParams();
    std::optional<VLFileObjectID> folder;
    if (params.hasFolder()) folder = codec::decode(params.getFolder());
    return answer(
        _service, context,
        [&](auto reply) {
          daemon().enumerateItemsInFolder(folder, params.getSortOrder(), params.getOffset(),
                                          std::min(params.getLimit(), DaemonService::kLongestPage),
                                          std::move(reply));
        },
        [](auto results, const auto& items, std::uint64_t nextOffset, const NSErrorPtr& error) {
          encodePage(results, items, nextOffset, error);
        });
  }

  kj::Promise<void> enumerateAllFolders(EnumerateAllFoldersContext context) override {
    const auto params = context.getParams();
    return answer(
        _service, context,
        [&](auto reply) {
          daemon().enumerateAllFoldersWithSortOrder(
              params.getSortOrder(), params.getOffset(),
              std::min(params.getLimit(), DaemonService::kLongestPage), std::move(reply));
        },
        [](auto results, const auto& items, std::uint64_t nextOffset, const NSErrorPtr& error) {
          encodePage(results, items, nextOffset, error);
        });
  }

  kj::Promise<void> currentNotifRank(CurrentNotifRankContext context) override {
    return answer(
        _service, context,
        [&](auto reply) { daemon().currentNotifRankWithReply(std::move(reply)); },
        [](auto results, std::uint64_t rank, const NSErrorPtr& error) {
          results.setRank(rank);
          codec::setError(results, error);
        });
  }

  kj::Promise<void> enumerateWorkingSetChanges(EnumerateWorkingSetChangesContext context) override {
    const auto params = context.getParams();
    std::optional<NSData> token;
    if (params.hasChangeToken()) {
      const auto data = params.getChangeToken();
      token = NSData(std::span(data.begin(), data.size()));
    }
    return answer(
        _service, context,
        [&](auto reply) {
          daemon().enumerateWorkingSetChangesFromChangeToken(
              std::move(token), std::min(params.getLimit(), DaemonService::kLongestPage),
              std::move(reply));
        },
        [](auto results, const NSFileProviderItems& updates,
           const std::vector<VLFileObjectID>& deletions, const std::optional<NSData>& newToken,
           const NSErrorPtr& error) {
          codec::encode(results.initUpdates(static_cast<unsigned>(updates.size())), updates);
          codec::encode(results.initDeletions(static_cast<unsigned>(deletions.size())), deletions);
          if (newToken) results.setChangeToken(codec::bytes(*newToken));
          codec::setError(results, error);
        });
  }

  kj::Promise<void> getItemUpdateSender(GetItemUpdateSenderContext context) override {
    KJ_REQUIRE(context.getParams().hasReceiver(), "no receiver");
    KJ_REQUIRE(*_senders < kMostSenders, "this client has too many update senders");
    auto receiver =
        std::make_shared<ReceiverReference>(_service, context.getParams().getReceiver());
    context.releaseParams();
    return answer(
        _service, context,
        [&](auto reply) {
          daemon().getItemUpdateSenderWithReceiver(
              receiver, [reply = std::move(reply), executor = _service->executor](
                            std::shared_ptr<VLItemNotificationSender> sender,
                            const auto& /*dictionary*/, NSErrorPtr error) mutable {
                if (sender) sender = invalidatedAtTheEnd(std::move(sender), std::move(executor));
                reply(std::move(sender), std::move(error));
              });
        },
        [service = _service, senders = _senders, receiver](
            auto results, std::shared_ptr<VLItemNotificationSender>& sender,
            const NSErrorPtr& error) {
          codec::setError(results, error);
          if (!sender) return;
          auto* link = dynamic_cast<LinkBreaking*>(sender.get());
          results.setSender(
              kj::heap<WithFaults<SenderObject>>(service, std::move(sender), senders));
          if (link != nullptr) {
            link->setLinkBrokenHandler(
                [receiver](NSErrorPtr broken) { receiver->linkDidBreak(std::move(broken)); });
          }
        });
  }

  kj::Promise<void> getContainerURLForID(GetContainerURLForIDContext context) override {
    const auto params = context.getParams();
    return answer(
        _service, context,
        [&](auto reply) {
          daemon().getContainerURLForID(codec::text(params.getContainerID()),
                                        params.getRecreateDocumentsIfNeeded(), std::move(reply));
        },
        [](auto results, const NSURLPtr& url, const std::optional<std::string>& displayName,
           bool recreated, const NSErrorPtr& error) {
          if (url) results.setUrl(codec::bytes(url->path()));
          if (displayName) results.setDisplayName(codec::bytes(*displayName));
          results.setRecreated(recreated);
          codec::setError(results, error);
        });
  }

  kj::Promise<void> urlForFileObjectID(UrlForFileObjectIDContext context) override {
    const VLFileObjectID id = codec::decode(context.getParams().getFileObjectID());
    return answer(
        _service, context, [&](auto reply) { daemon().URLForFileObjectID(id, std::move(reply)); },
        [](auto results, const NSURLPtr& url, const NSErrorPtr& error) {
          if (url) results.setUrl(codec::bytes(url->path()));
          codec::setError(results, error);
        });
  }

  kj::Promise<void> urlsForFileObjectIDs(UrlsForFileObjectIDsContext context) override {
    std::vector<VLFileObjectID> ids;
    for (const auto id : context.getParams().getFileObjectIDs()) ids.push_back(codec::decode(id));
    return answer(
        _service, context,
        [&](auto reply) { daemon().URLsForFileObjectIDs(std::move(ids), std::move(reply)); },
        [](auto results, const std::vector<NSURLPtr>& urls, const NSErrorPtr& error) {
          auto list = results.initUrls(static_cast<unsigned>(urls.size()));
          for (unsigned at = 0; at < urls.size(); ++at) {
            if (urls[at]) list.set(at, codec::bytes(urls[at]->path()));
          }
          codec::setError(results, error);
        });
  }

  kj::Promise<void> queryItemForURL(QueryItemForURLContext context) override {
    const auto params = context.getParams();
    NSURLPtr url = urlFromClient(params.getUrl());
    return answer(
        _service, context,
        [&](auto reply) {
          if (url) {
            daemon().queryItemForURL(std::move(url), params.getScanFirst(), std::move(reply));
          } else {
            reply(VLQueryItemPtr(), vlc_errorInvalidParameter("url", codec::text(params.getUrl())));
          }
        },
        [](auto results, const VLQueryItemPtr& item, const NSErrorPtr& error) {
          if (item) codec::encode(results.initItem(), *item);
          codec::setError(results, error);
        });
  }

  kj::Promise<void> account(AccountContext context) override {
    return answer(
        _service, context, [&](auto reply) { daemon().account(std::move(reply)); },
        [](auto results, const std::optional<LocalAccount>& account, const NSErrorPtr& error) {
          if (account) codec::encode(results.initAccount(), *account);
          codec::setError(results, error);
        });
  }

  kj::Promise<void> logIn(LogInContext context) override {
    LocalAccount account = codec::decode(context.getParams().getAccount());
    return answer(
        _service, context,
        [&](auto reply) { daemon().logIn(std::move(account), std::move(reply)); },
        codec::encodeError);
  }

  kj::Promise<void> logOut(LogOutContext context) override {
    return answer(
        _service, context, [&](auto reply) { daemon().logOut(std::move(reply)); },
        codec::encodeError);
  }

  kj::Promise<void> containers(ContainersContext context) override {
    return answer(
        _service, context, [&](auto reply) { daemon().containers(std::move(reply)); },
        [](auto results, const std::vector<VLContainer::Properties>& containers,
           const NSErrorPtr& error) {
          encodeAll(results.initContainers(static_cast<unsigned>(containers.size())), containers);
          codec::setError(results, error);
        });
  }

  kj::Promise<void> subscribe(SubscribeContext context) override {
    KJ_REQUIRE(context.getParams().hasEvents(), "nobody to tell");
    KJ_REQUIRE(_subscriptions.size() < kMostSubscriptions, "this client subscribed too often");
    auto events = std::make_shared<EventsReference>(_service, context.getParams().getEvents());
    context.releaseParams();
    _subscriptions.push_back(events);
    return answer(
        _service, context,
        [&](auto reply) { daemon().subscribe(std::move(events), std::move(reply)); },
        codec::encodeError);
  }

  kj::Promise<void> status(StatusContext context) override {
    return answer(
        _service, context, [&](auto reply) { daemon().status(std::move(reply)); },
        [](auto results, const LocalDaemonStatus& status, const NSErrorPtr& error) {
          codec::encode(results.initStatus(), status);
          codec::setError(results, error);
        });
  }

  kj::Promise<void> checkIndex(CheckIndexContext context) override {
    const std::uint64_t limit = std::min(context.getParams().getLimit(), kMostDifferences);
    return answer(
        _service, context, [&](auto reply) { daemon().checkIndex(limit, std::move(reply)); },
        [](auto results, const std::vector<IndexDifference>& differences, const NSErrorPtr& error) {
          encodeAll(results.initDifferences(static_cast<unsigned>(differences.size())),
                    differences);
          codec::setError(results, error);
        });
  }

  kj::Promise<void> injectFault(InjectFaultContext context) override {
    FaultInjection fault = codec::decode(context.getParams().getFault());
    return answer(
        _service, context,
        [&](auto reply) { daemon().injectFault(std::move(fault), std::move(reply)); },
        codec::encodeError);
  }

  kj::Promise<void> stop(StopContext context) override {
    return answer(
        _service, context, [&](auto reply) { daemon().stop(std::move(reply)); },
        codec::encodeError);
  }

 private:
  LocalDaemon& daemon() const { return *_service->server->daemon; }

  const DaemonServicePtr _service;
  const std::shared_ptr<std::size_t> _senders = std::make_shared<std::size_t>(0);
  std::vector<std::shared_ptr<EventsReference>> _subscriptions;
};

}  // namespace

class DaemonServer::Implementation {
 public:
  Implementation(std::shared_ptr<RpcLoop> loop, std::shared_ptr<ServedDaemon> served)
      : _loop(std::move(loop)), _served(std::move(served)) {}
  ~Implementation() {
    sockets.reset();
    _loop->postAndWait([served = _served] { served->close(); });
  }
  Implementation(const Implementation&) = delete;
  Implementation& operator=(const Implementation&) = delete;

  std::shared_ptr<SocketServer> sockets;

 private:
  const std::shared_ptr<RpcLoop> _loop;
  const std::shared_ptr<ServedDaemon> _served;
};

std::unique_ptr<DaemonServer> DaemonServer::listen(const std::shared_ptr<RpcLoop>& loop,
                                                   const std::shared_ptr<Executor>& executor,
                                                   const std::shared_ptr<LocalDaemon>& daemon,
                                                   const std::string& socketPath, Log& log,
                                                   NSErrorOut error,
                                                   const std::shared_ptr<CallFaults>& faults,
                                                   std::function<void()> addressLost) {
  const std::shared_ptr<ServedDaemon> served =
      loop->own(std::make_unique<ServedDaemon>(daemon, faults));
  auto implementation = std::make_unique<Implementation>(loop, served);
  implementation->sockets = SocketServer::listen(
      loop, socketPath,
      [loop, executor, served](pid_t) -> capnp::Capability::Client {
        return kj::heap<WithFaults<DaemonObject>>(
            std::make_shared<DaemonService>(DaemonService{loop, executor, served}));
      },
      log, {}, error, std::move(addressLost));
  if (!implementation->sockets) return nullptr;
  loop->post([served, weak = std::weak_ptr(implementation->sockets)] {
    served->dropConnections = [weak] {
      if (const auto sockets = weak.lock()) sockets->dropConnections();
    };
  });
  return std::unique_ptr<DaemonServer>(new DaemonServer(std::move(implementation)));
}

DaemonServer::DaemonServer(std::unique_ptr<Implementation> implementation)
    : _implementation(std::move(implementation)) {}

DaemonServer::~DaemonServer() = default;

void DaemonServer::finish(std::chrono::milliseconds patience) {
  _implementation->sockets->finish(patience);
}

void DaemonServer::dropConnections() { _implementation->sockets->dropConnections(); }

}  // namespace skein
