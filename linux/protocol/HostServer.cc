#include "linux/protocol/HostServer.h"

#include <utility>

#include "linux/protocol/CloudCodec.h"
#include "linux/protocol/HostCodec.h"
#include "linux/protocol/HostFilesObject.h"
#include "linux/protocol/HostPeer.h"
#include "linux/protocol/HostThumbnailsObject.h"
#include "linux/protocol/ServicesServer.h"
#include "linux/protocol/SocketServer.h"

namespace skein {
namespace {

class ListingObject final : public wire::Listing::Server {
 public:
  ListingObject(HostPeerPtr peer, std::shared_ptr<HostListing> stream)
      : _stream(std::move(peer), std::move(stream)) {}

  kj::Promise<void> next(NextContext context) override {
    return _stream.next(context, [](auto results, const NSFileProviderItems& items, bool last,
                                    const NSErrorPtr& error) {
      codec::encode(results.initItems(static_cast<unsigned>(items.size())), items);
      results.setLast(last);
      codec::setError(results, error);
    });
  }

 private:
  StreamOwner<HostListing> _stream;
};

class WatchObject final : public wire::Watch::Server {
 public:
  WatchObject(HostPeerPtr peer, std::shared_ptr<HostWatch> stream)
      : _stream(std::move(peer), std::move(stream)) {}

  kj::Promise<void> next(NextContext context) override {
    return _stream.next(
        context, [](auto results, const std::vector<HostChange>& changes, const NSErrorPtr& error) {
          auto list = results.initChanges(static_cast<unsigned>(changes.size()));
          unsigned at = 0;
          for (const HostChange& change : changes) codec::encode(list[at++], change);
          codec::setError(results, error);
        });
  }

 private:
  StreamOwner<HostWatch> _stream;
};

class CheckObject final : public wire::Check::Server {
 public:
  CheckObject(HostPeerPtr peer, std::shared_ptr<HostCheck> stream)
      : _stream(std::move(peer), std::move(stream)) {}

  kj::Promise<void> next(NextContext context) override {
    return _stream.next(
        context, [](auto results, const HostCheckStep& step, const NSErrorPtr& error) {
          auto list = results.initDifferences(static_cast<unsigned>(step.differences.size()));
          unsigned at = 0;
          for (const auto& difference : step.differences) {
            codec::encode(list[at++], difference);
          }
          results.setFolders(step.folders);
          results.setItems(step.items);
          results.setVerified(step.verified);
          results.setVerifiedBytes(step.verifiedBytes);
          results.setFinished(step.finished);
          codec::setError(results, error);
        });
  }

 private:
  StreamOwner<HostCheck> _stream;
};

// The host, as one connection sees it. Lives on the loop's thread.
class HostObject final : public virtual wire::Host::Server,
                         public HostFilesObject,
                         public HostThumbnailsObject {
 public:
  explicit HostObject(HostPeerPtr peer)
      : HostFilesObject(peer),
        HostThumbnailsObject(peer),
        _peer(std::move(peer)),
        _services(makeServicesObject(_peer->loop, _peer->executor, _peer->services)) {}

  kj::Promise<void> list(ListContext context) override {
    const auto params = context.getParams();
    const HostOrder order = params.getOrder() == 1 ? HostOrder::Date : HostOrder::Name;
    return answerOnExecutor(
        _peer, context,
        [service = service(), target = codec::decode(params.getContainer()), order](auto reply) {
          service->list(target, order, std::move(reply));
        },
        [peer = _peer](auto results, std::shared_ptr<HostListing>& listing,
                       const NSErrorPtr& error) {
          if (listing) results.setListing(kj::heap<ListingObject>(peer, std::move(listing)));
          codec::setError(results, error);
        });
  }

  kj::Promise<void> item(ItemContext context) override {
    return answerOnExecutor(
        _peer, context,
        [service = service(), target = codec::decode(context.getParams().getTarget())](auto reply) {
          service->item(target, std::move(reply));
        },
        [](auto results, const HostItem& item, const NSErrorPtr& error) {
          codec::encode(results.initItem(), item);
          codec::setError(results, error);
        });
  }

  kj::Promise<void> identifierForPath(IdentifierForPathContext context) override {
    return answerOnExecutor(
        _peer, context,
        [service = service(), path = codec::text(context.getParams().getPath())](auto reply) {
          service->identifierForPath(path, std::move(reply));
        },
        [](auto results, const std::string& identifier, const NSErrorPtr& error) {
          results.setIdentifier(codec::bytes(identifier));
          codec::setError(results, error);
        });
  }

  kj::Promise<void> pathForIdentifier(PathForIdentifierContext context) override {
    return answerOnExecutor(
        _peer, context,
        [service = service(), identifier = codec::text(context.getParams().getIdentifier())](
            auto reply) { service->pathForIdentifier(identifier, std::move(reply)); },
        [](auto results, const std::string& path, const NSErrorPtr& error) {
          results.setPath(codec::bytes(path));
          codec::setError(results, error);
        });
  }

  kj::Promise<void> watch(WatchContext context) override {
    return answerOnExecutor(
        _peer, context,
        [service = service(), target = codec::decode(context.getParams().getContainer())](
            auto reply) { service->watch(target, std::move(reply)); },
        [peer = _peer](auto results, std::shared_ptr<HostWatch>& watch, const NSErrorPtr& error) {
          if (watch) results.setWatch(kj::heap<WatchObject>(peer, std::move(watch)));
          codec::setError(results, error);
        });
  }

  kj::Promise<void> changesSince(ChangesSinceContext context) override {
    std::optional<NSData> token;
    if (context.getParams().hasToken()) {
      const auto data = context.getParams().getToken();
      token = NSData(std::span(data.begin(), data.size()));
    }
    return answerOnExecutor(
        _peer, context,
        [service = service(), token = std::move(token)](auto reply) {
          service->changesSince(token, std::move(reply));
        },
        [](auto results, const HostChangeBatch& batch, const NSErrorPtr& error) {
          codec::encode(results.initUpdates(static_cast<unsigned>(batch.updates.size())),
                        batch.updates);
          codec::encode(results.initDeletions(static_cast<unsigned>(batch.deletions.size())),
                        batch.deletions);
          results.setToken(codec::bytes(batch.token));
          results.setMoreComing(batch.moreComing);
          codec::setError(results, error);
        });
  }

  kj::Promise<void> account(AccountContext context) override {
    return answerOnExecutor(
        _peer, context, [service = service()](auto reply) { service->account(std::move(reply)); },
        [](auto results, const std::optional<LocalAccount>& account, const NSErrorPtr& error) {
          if (account) codec::encode(results.initAccount(), *account);
          codec::setError(results, error);
        });
  }

  kj::Promise<void> logIn(LogInContext context) override {
    return answerOnExecutor(
        _peer, context,
        [service = service(), account = codec::decode(context.getParams().getAccount())](
            auto reply) { service->logIn(account, std::move(reply)); },
        encodeError);
  }

  kj::Promise<void> logOut(LogOutContext context) override {
    return answerOnExecutor(
        _peer, context, [service = service()](auto reply) { service->logOut(std::move(reply)); },
        encodeError);
  }

  kj::Promise<void> status(StatusContext context) override {
    return answerOnExecutor(
        _peer, context, [service = service()](auto reply) { service->status(std::move(reply)); },
        [](auto results, const HostStatus& status, const NSErrorPtr& error) {
          codec::encode(results.initStatus(), status);
          codec::setError(results, error);
        });
  }

  kj::Promise<void> cloudStatus(CloudStatusContext context) override {
    return answerOnExecutor(
        _peer, context,
        [service = service()](auto reply) { service->cloudStatus(std::move(reply)); },
        [](auto results, const LocalCloudStatus& status, const NSErrorPtr& error) {
          codec::encode(results.initStatus(), status);
          codec::setError(results, error);
        });
  }

  kj::Promise<void> setCloudConditions(SetCloudConditionsContext context) override {
    return answerOnExecutor(
        _peer, context,
        [service = service(), conditions = codec::decode(context.getParams().getConditions())](
            auto reply) { service->setCloudConditions(conditions, std::move(reply)); },
        encodeError);
  }

  kj::Promise<void> setCloudKeeping(SetCloudKeepingContext context) override {
    return answerOnExecutor(
        _peer, context,
        [service = service(), keeping = codec::decode(context.getParams().getKeeping())](
            auto reply) { service->setCloudKeeping(keeping, std::move(reply)); },
        encodeError);
  }

  kj::Promise<void> collectCloud(CollectCloudContext context) override {
    return answerOnExecutor(
        _peer, context,
        [service = service()](auto reply) { service->collectCloud(std::move(reply)); },
        [](auto results, const LocalCloudCollection& collection, const NSErrorPtr& error) {
          codec::encode(results.initCollection(), collection);
          codec::setError(results, error);
        });
  }

  kj::Promise<void> check(CheckContext context) override {
    return answerOnExecutor(
        _peer, context,
        [service = service(), quick = context.getParams().getQuick()](auto reply) {
          service->check(quick, std::move(reply));
        },
        [peer = _peer](auto results, std::shared_ptr<HostCheck>& check, const NSErrorPtr& error) {
          if (check) results.setCheck(kj::heap<CheckObject>(peer, std::move(check)));
          codec::setError(results, error);
        });
  }

  kj::Promise<void> setDebugLog(SetDebugLogContext context) override {
    return answerOnExecutor(
        _peer, context,
        [service = service(), enabled = context.getParams().getEnabled()](auto reply) {
          service->setDebugLog(enabled, std::move(reply));
        },
        encodeError);
  }

  kj::Promise<void> services(ServicesContext context) override {
    context.getResults().setServices(_services);
    return kj::READY_NOW;
  }

 private:
  const std::shared_ptr<HostService>& service() const { return _peer->service; }

  const HostPeerPtr _peer;
  capnp::Capability::Client _services;
};

}  // namespace

class HostServer::Implementation {
 public:
  std::shared_ptr<SocketServer> server;
};

std::unique_ptr<HostServer> HostServer::listen(
    const std::shared_ptr<RpcLoop>& loop, const std::shared_ptr<Executor>& executor,
    const std::shared_ptr<HostService>& service, const std::shared_ptr<HostServices>& services,
    const std::string& socketPath, Log& log, NSErrorOut error, std::function<void()> addressLost) {
  auto implementation = std::make_unique<Implementation>();
  implementation->server = SocketServer::listen(
      loop, socketPath,
      [loop, executor, service, services](pid_t peer) -> capnp::Capability::Client {
        return kj::heap<HostObject>(
            std::make_shared<HostPeer>(HostPeer{loop, executor, service, services, peer}));
      },
      log, {}, error, std::move(addressLost));
  if (!implementation->server) return nullptr;
  return std::unique_ptr<HostServer>(new HostServer(std::move(implementation)));
}

HostServer::HostServer(std::unique_ptr<Implementation> implementation)
    : _implementation(std::move(implementation)) {}

HostServer::~HostServer() = default;

}  // namespace skein
