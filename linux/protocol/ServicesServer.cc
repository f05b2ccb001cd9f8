#include "linux/protocol/ServicesServer.h"

#include <utility>

#include "base/SerialQueue.h"
#include "linux/protocol/Answer.h"
#include "linux/protocol/ServiceProgress.h"
#include "linux/protocol/ServicesCodec.h"
#include "platform/log/Description.h"

namespace skein {
namespace {

// What the service objects of one client share. On the loop's thread.
struct ServicePeer {
  static constexpr std::size_t kMostUnanswered = 256;
  static constexpr std::size_t kMostObjects = 1024;

  std::shared_ptr<RpcLoop> loop;
  std::shared_ptr<Executor> executor;
  std::size_t unanswered = 0;
  std::size_t objects = 0;  // endpoints and connections
};
using ServicePeerPtr = std::shared_ptr<ServicePeer>;

// Counts one object of a client's, and releases `held` on the executor.
template <class T>
class ClientHold {
 public:
  ClientHold(ServicePeerPtr peer, std::shared_ptr<T> held)
      : _peer(std::move(peer)), _held(std::move(held)) {
    ++_peer->objects;
  }
  ~ClientHold() {
    --_peer->objects;
    _peer->executor->post([held = std::move(_held)]() mutable { held = nullptr; });
  }
  ClientHold(const ClientHold&) = delete;
  ClientHold& operator=(const ClientHold&) = delete;

  const ServicePeerPtr& peer() const { return _peer; }
  const std::shared_ptr<T>& get() const { return _held; }
  // What is held, given up; null from now on.
  std::shared_ptr<T> take() { return std::exchange(_held, nullptr); }

 private:
  const ServicePeerPtr _peer;
  std::shared_ptr<T> _held;
};

void requireRoom(const ServicePeerPtr& peer) {
  KJ_REQUIRE(peer->objects < ServicePeer::kMostObjects,
             "too many endpoints and connections are held");
}

using codec::encodeError;

constexpr auto encodeClientShare = [](auto results, const CKSharePtr& share,
                                      const NSErrorPtr& error) {
  if (share) codec::encodeForClient(results.initShare(), *share);
  codec::setError(results, error);
};

constexpr auto encodeAddress = [](auto results, const NSURLPtr& url, const NSErrorPtr& error) {
  if (url) results.setUrl(codec::bytes(codec::address(url)));
  codec::setError(results, error);
};

// What both kinds of connections do. `Wire` is the server class of one of them, `Service`
// what is exported.
template <class Wire, class Service>
class ConnectionObject : public Wire {
 public:
  using Exported = std::shared_ptr<Service> (ServiceConnection::*)();
  using CloseContext = wire::ServiceConnection::Server::CloseContext;

  ConnectionObject(ServicePeerPtr peer, std::shared_ptr<ServiceConnection> connection,
                   Exported exported)
      : _hold(std::move(peer), std::move(connection)),
        _exported(exported),
        _messages("service-messages", _hold.peer()->executor),
        _progresses(_hold.peer()->loop->own(
            std::make_unique<ProgressTable>(_hold.peer()->loop, _hold.peer()->executor))) {}
  ~ConnectionObject() { _progresses->end(); }

  kj::Promise<void> close(CloseContext context) override {
    _progresses->end();
    return answer(
        _hold.peer(), context,
        [&](auto reply) {
          _messages.async([connection = _hold.take(), reply = std::move(reply)]() mutable {
            if (connection) connection->close();
            connection = nullptr;
            reply();
          });
        },
        [](auto&&) {});
  }

 protected:
  // A message with a reply of `Values` and an error: call(service, completion) in its turn,
  // which answers a progress or nothing. The service may take long: whoever waits for it must
  // not keep a connection whose client is gone.
  template <class... Values, class Context, class Call, class Encode>
  kj::Promise<void> request(Context context, Call call, Encode encode) {
    context.allowCancellation();
    auto tracked = _progresses->begin(observerIn(context.getParams()));
    return answer(
        _hold.peer(), context,
        [&](auto reply) {
          Completion<Values..., NSErrorPtr> completion(
              [tracked, reply = std::move(reply)](Values... values, NSErrorPtr error) mutable {
                tracked->didReply();
                reply(std::move(values)..., std::move(error));
              });
          _messages.async([connection = _hold.get(), exported = _exported, tracked,
                           call = std::move(call), completion = std::move(completion)]() mutable {
            const auto service = connection ? (connection.get()->*exported)() : nullptr;
            if (!service) {
              completion(Values()..., connectionHasEndedError());
            } else if constexpr (std::is_void_v<decltype(call(*service, std::move(completion)))>) {
              call(*service, std::move(completion));
            } else {
              tracked->didReturn(call(*service, std::move(completion)));
            }
          });
        },
        std::move(encode));
  }

  // A message without a reply of its own: answered once it was delivered.
  template <class Context, class Call>
  kj::Promise<void> notify(Context context, Call call) {
    return answer(
        _hold.peer(), context,
        [&](auto reply) {
          _messages.async([connection = _hold.get(), exported = _exported, call = std::move(call),
                           reply = std::move(reply)]() mutable {
            const auto service = connection ? (connection.get()->*exported)() : nullptr;
            if (service) call(*service);
            reply();
          });
        },
        [](auto&&) {});
  }

  const ServicePeerPtr& peer() const { return _hold.peer(); }
  std::shared_ptr<Service> exported() const {
    return _hold.get() ? (_hold.get().get()->*_exported)() : nullptr;
  }

 private:
  template <class Params>
  static kj::Maybe<wire::ProgressObserver::Client> observerIn(Params params) {
    if constexpr (requires { params.getObserver(); }) {
      if (params.hasObserver()) return params.getObserver();
    }
    return nullptr;
  }

  ClientHold<ServiceConnection> _hold;
  const Exported _exported;
  SerialQueue _messages;
  const std::shared_ptr<ProgressTable> _progresses;
};

void encodeItem(wire::Item::Builder builder, const NSFileProviderItemPtr& item) {
  if (const auto* own = dynamic_cast<const VLQueryItem*>(item.get())) codec::encode(builder, *own);
}

class SharingObject final : public ConnectionObject<wire::Sharing::Server, VLSharingServiceV1> {
 public:
  SharingObject(ServicePeerPtr peer, std::shared_ptr<ServiceConnection> connection)
      : ConnectionObject(std::move(peer), std::move(connection), &ServiceConnection::sharing) {}

  kj::Promise<void> fetchSharingInfo(FetchSharingInfoContext context) override {
    return request<bool, NSFileProviderItemPtr>(
        context, [](auto& service, auto reply) { service.fetchSharingInfo(std::move(reply)); },
        [](auto results, bool shared, const NSFileProviderItemPtr& item, const NSErrorPtr& error) {
          results.setShared(shared);
          if (item) encodeItem(results.initItem(), item);
          codec::setError(results, error);
        });
  }

  kj::Promise<void> preflightCheckIfCurrentlyShareable(
      PreflightCheckIfCurrentlyShareableContext context) override {
    using Items = VLSharingServiceV1::Items;
    return request<bool, NSFileProviderItemPtr, Items, Items>(
        context,
        [](auto& service, auto reply) {
          return service.preflightCheckIfCurrentlyShareableWithCompletion(std::move(reply));
        },
        [](auto results, bool shareable, const NSFileProviderItemPtr& item, const Items& items,
           const Items& others, const NSErrorPtr& error) {
          results.setShareable(shareable);
          if (item) encodeItem(results.initItem(), item);
          const auto size = [](const Items& list) { return static_cast<unsigned>(list->size()); };
          if (items) codec::encode(results.initItems(size(items)), *items);
          if (others) codec::encode(results.initOtherItems(size(others)), *others);
          codec::setError(results, error);
        });
  }

  kj::Promise<void> fetchParticipantListAndPublicPermission(
      FetchParticipantListAndPublicPermissionContext context) override {
    return request<VLSharingServiceV1::Participants, std::int64_t>(
        context,
        [](auto& service, auto reply) {
          return service.fetchParticipantListAndPublicPermission(std::move(reply));
        },
        [](auto results, const VLSharingServiceV1::Participants& participants,
           std::int64_t permission, const NSErrorPtr& error) {
          if (participants) {
            codec::encode(results.initParticipants(static_cast<unsigned>(participants->size())),
                          *participants);
          }
          results.setPublicPermission(permission);
          codec::setError(results, error);
        });
  }

  kj::Promise<void> startPreparingForShare(StartPreparingForShareContext context) override {
    return notify(context, [forcing = context.getParams().getForcing()](auto& service) {
      service.startPreparingForShareWhenForcing(forcing);
    });
  }

  kj::Promise<void> fetchShare(FetchShareContext context) override {
    return request<CKSharePtr>(
        context,
        [](auto& service, auto reply) {
          return service.fetchShareWithCompletion(std::move(reply));
        },
        encodeClientShare);
  }

  kj::Promise<void> fetchShareURL(FetchShareURLContext context) override {
    return request<NSURLPtr>(
        context,
        [](auto& service, auto reply) {
          return service.fetchShareURLWithCompletion(std::move(reply));
        },
        encodeAddress);
  }

  kj::Promise<void> saveShare(SaveShareContext context) override {
    CKSharePtr share;
    if (context.getParams().hasShare())
      share = codec::decodeFromClient(context.getParams().getShare());
    return request<CKSharePtr>(
        context,
        [share = std::move(share)](auto& service, auto reply) {
          return service.saveShare(share, std::move(reply));
        },
        encodeClientShare);
  }

  kj::Promise<void> unshare(UnshareContext context) override {
    return request<>(
        context,
        [](auto& service, auto reply) { return service.unshareWithCompletion(std::move(reply)); },
        encodeError);
  }
};

class CollaborationObject final
    : public ConnectionObject<wire::Collaboration::Server, VLFileProviderQuireCollaboration> {
 public:
  using Text = VLFileProviderQuireCollaboration::Text;

  CollaborationObject(ServicePeerPtr peer, std::shared_ptr<ServiceConnection> connection)
      : ConnectionObject(std::move(peer), std::move(connection),
                         &ServiceConnection::collaboration) {}

  kj::Promise<void> selectors(SelectorsContext context) override {
    std::vector<std::string> known;
    if (const auto service = exported()) {
      for (const std::string_view selector : VLFileProviderQuireCollaborationSelectors) {
        if (service->respondsToSelector(selector)) known.emplace_back(selector);
      }
    }
    codec::encode(context.getResults().initSelectors(static_cast<unsigned>(known.size())), known);
    return kj::READY_NOW;
  }

  kj::Promise<void> fetchVersionAndCapabilities(
      FetchVersionAndCapabilitiesContext context) override {
    return request<std::uint64_t, std::uint64_t>(
        context,
        [](auto& service, auto reply) {
          service.fetchVersionAndCapabilitiesWithCompletionHandler(std::move(reply));
        },
        [](auto results, std::uint64_t version, std::uint64_t bits, const NSErrorPtr& error) {
          results.setVersion(version);
          results.setCapabilities(bits);
          codec::setError(results, error);
        });
  }

  kj::Promise<void> setEnvironmentType(SetEnvironmentTypeContext context) override {
    return notify(context, [type = context.getParams().getEnvironmentType()](auto& service) {
      service.setEnvironmentType(type);
    });
  }

  kj::Promise<void> fetchCollaborationToken(FetchCollaborationTokenContext context) override {
    return request<Text, Text, Text, std::optional<NSDate>>(
        context,
        [](auto& service, auto reply) {
          return service.fetchCollaborationTokenWithCompletionHandler(std::move(reply));
        },
        [](auto results, const Text& provider, const Text& first, const Text& second,
           const std::optional<NSDate>& expiry, const NSErrorPtr& error) {
          if (provider) results.setProvider(codec::bytes(*provider));
          if (first) results.setFirstToken(codec::bytes(*first));
          if (second) results.setSecondToken(codec::bytes(*second));
          results.setHasExpiry(expiry.has_value());
          if (expiry) results.setExpiry(codec::moment(*expiry));
          codec::setError(results, error);
        });
  }

  kj::Promise<void> fetchLatestRevision(FetchLatestRevisionContext context) override {
    return request<>(
        context,
        [](auto& service, auto reply) {
          return service.fetchLatestRevisionWithCompletionHandler(std::move(reply));
        },
        encodeError);
  }

  kj::Promise<void> refreshSharingState(RefreshSharingStateContext context) override {
    return request<>(
        context,
        [](auto& service, auto reply) {
          return service.refreshSharingStateWithCompletionHandler(std::move(reply));
        },
        encodeError);
  }

  kj::Promise<void> fetchPrivacyState(FetchPrivacyStateContext context) override {
    return request<bool, bool, NSURLPtr>(
        context,
        [](auto& service, auto reply) {
          return service.fetchPrivacyStateWithCompletionHandler(std::move(reply));
        },
        [](auto results, bool first, bool second, const NSURLPtr& url, const NSErrorPtr& error) {
          results.setFirst(first);
          results.setSecond(second);
          encodeAddress(results, url, error);
        });
  }

  kj::Promise<void> documentIsInUse(DocumentIsInUseContext context) override {
    return notify(context, [timeout = context.getParams().getTimeout()](auto& service) {
      service.documentIsInUseWithTimeout(timeout);
    });
  }

  kj::Promise<void> fetchFileProviderIdentifier(
      FetchFileProviderIdentifierContext context) override {
    return request<Text>(
        context,
        [](auto& service, auto reply) {
          service.fetchFileProviderIdentifierWithCompletionHandler(std::move(reply));
        },
        [](auto results, const Text& identifier, const NSErrorPtr& error) {
          if (identifier) results.setIdentifier(codec::bytes(*identifier));
          codec::setError(results, error);
        });
  }

  kj::Promise<void> fetchURLForSharingFile(FetchURLForSharingFileContext context) override {
    return request<NSURLPtr>(
        context,
        [](auto& service, auto reply) {
          service.fetchURLForSharingFileWithCompletionHandler(std::move(reply));
        },
        encodeAddress);
  }

  kj::Promise<void> fetchFolderSharingState(FetchFolderSharingStateContext context) override {
    return request<bool>(
        context,
        [](auto& service, auto reply) {
          return service.fetchFolderSharingStateWithCompletionHandler(std::move(reply));
        },
        [](auto results, bool shared, const NSErrorPtr& error) {
          results.setShared(shared);
          codec::setError(results, error);
        });
  }

  kj::Promise<void> fetchSharedFolderInfo(FetchSharedFolderInfoContext context) override {
    return request<bool, Text>(
        context,
        [](auto& service, auto reply) {
          return service.fetchSharedFolderInfoWithCompletionHandler(std::move(reply));
        },
        [](auto results, bool shared, const Text& name, const NSErrorPtr& error) {
          results.setShared(shared);
          if (name) results.setFolderName(codec::bytes(*name));
          codec::setError(results, error);
        });
  }
};

class EndpointObject final : public wire::Endpoint::Server {
 public:
  EndpointObject(ServicePeerPtr peer, std::shared_ptr<ServiceEndpoint> endpoint)
      : _hold(std::move(peer), std::move(endpoint)) {}

  kj::Promise<void> connect(ConnectContext context) override {
    requireRoom(_hold.peer());
    return answer(
        _hold.peer(), context,
        [&](auto reply) {
          _hold.peer()->executor->post(
              [endpoint = _hold.get(), reply = std::move(reply)]() mutable {
                endpoint->connect(std::move(reply));
              });
        },
        [peer = _hold.peer()](auto results, std::shared_ptr<ServiceConnection>& connection,
                              const NSErrorPtr& error) {
          if (connection && connection->sharing()) {
            results.setProtocolName(codec::bytes(getSharingServiceInterface().protocolName));
            results.setConnection(kj::heap<SharingObject>(peer, std::move(connection)));
          } else if (connection && connection->collaboration()) {
            results.setProtocolName(codec::bytes(VLQuireCollaborationProtocolName));
            results.setConnection(kj::heap<CollaborationObject>(peer, std::move(connection)));
          }
          codec::setError(results, error);
        });
  }

 private:
  const ClientHold<ServiceEndpoint> _hold;
};

class ServicesObject final : public wire::Services::Server {
 public:
  ServicesObject(ServicePeerPtr peer, std::shared_ptr<HostServices> services)
      : _peer(std::move(peer)), _services(std::move(services)) {}

  kj::Promise<void> serviceSources(ServiceSourcesContext context) override {
    return answer(
        _peer, context,
        [&](auto reply) {
          _peer->executor->post([services = _services, target = targetIn(context.getParams()),
                                 reply = std::move(reply)]() mutable {
            services->serviceSources(std::move(target), std::move(reply));
          });
        },
        [](auto results, const std::vector<std::string>& names, const NSErrorPtr& error) {
          codec::encode(results.initNames(static_cast<unsigned>(names.size())), names);
          codec::setError(results, error);
        });
  }

  kj::Promise<void> endpoint(EndpointContext context) override {
    requireRoom(_peer);
    return answer(
        _peer, context,
        [&](auto reply) {
          const auto params = context.getParams();
          _peer->executor->post([services = _services, target = targetIn(params),
                                 name = codec::text(params.getServiceName()),
                                 reply = std::move(reply)]() mutable {
            services->endpoint(std::move(target), std::move(name), std::move(reply));
          });
        },
        [peer = _peer](auto results, std::shared_ptr<ServiceEndpoint>& endpoint,
                       const NSErrorPtr& error) {
          if (endpoint) results.setEndpoint(kj::heap<EndpointObject>(peer, std::move(endpoint)));
          codec::setError(results, error);
        });
  }

 private:
  template <class Params>
  static HostTarget targetIn(Params params) {
    auto text = codec::text(params.getTarget());
    return params.getIsIdentifier() ? HostTarget::identifier(std::move(text))
                                    : HostTarget::path(std::move(text));
  }

  const ServicePeerPtr _peer;
  const std::shared_ptr<HostServices> _services;
};

}  // namespace

capnp::Capability::Client makeServicesObject(std::shared_ptr<RpcLoop> loop,
                                             std::shared_ptr<Executor> executor,
                                             std::shared_ptr<HostServices> services) {
  return kj::heap<ServicesObject>(
      std::make_shared<ServicePeer>(ServicePeer{std::move(loop), std::move(executor)}),
      std::move(services));
}

}  // namespace skein
