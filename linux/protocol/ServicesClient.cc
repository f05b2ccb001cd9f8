#include "linux/protocol/ServicesClient.h"

#include <algorithm>
#include <atomic>
#include <utility>

#include "linux/protocol/ServiceProgress.h"
#include "linux/protocol/ServicesCodec.h"
#include "linux/protocol/host.capnp.h"

namespace skein {
namespace {

constexpr auto kPatience = SocketClient::Patience::WhilePeerLives;

// A reference of skein-host's, on the connection that it came on.
template <class Client>
struct Remote {
  // On the loop's thread, inside a Send.
  Remote(std::shared_ptr<SocketClient> socketClient, Client reference)
      : socket(std::move(socketClient)),
        connection(socket->currentConnection()),
        client(socket->loop()->own(std::make_unique<Client>(kj::mv(reference)))) {}

  const std::shared_ptr<SocketClient> socket;
  const std::uint64_t connection;
  const std::shared_ptr<Client> client;
};

template <class Results>
NSErrorPtr errorIn(const Results& results) {
  if constexpr (requires { results.hasError(); }) {
    return codec::errorOf(results);
  } else if constexpr (requires { results.error; }) {
    return results.error;
  } else {
    return nullptr;
  }
}

// Sends one message to `remote`: build(client) on the loop's thread, then decode(results)
// there, which gives the values that `reply` is called with on the executor; or the error
// with empty values.
template <class... Values, class Client, class Build, class Decode>
void send(const Remote<Client>& remote, std::type_identity_t<Reply<Values..., NSErrorPtr>> reply,
          Build build, Decode decode) {
  auto shared = std::make_shared<Reply<Values..., NSErrorPtr>>(std::move(reply));
  remote.socket->loop()->post([remote, shared, build = std::move(build),
                               decode = std::move(decode)]() mutable {
    remote.socket->sendOver(
        remote.connection,
        [client = remote.client, shared, build = std::move(build),
         decode = std::move(decode)]() mutable -> kj::Promise<Task> {
          return build(*client).then([shared, client,
                                      decode = std::move(decode)](auto&& results) mutable -> Task {
            return [shared, values = decode(results), error = errorIn(results)]() mutable {
              std::apply([&](auto&... value) { (*shared)(std::move(value)..., error); }, values);
            };
          });
        },
        [shared, executor = remote.socket->executor()](NSErrorPtr error) {
          executor->post([shared, error = std::move(error)] { (*shared)(Values()..., error); });
        },
        kPatience);
  });
}

constexpr auto noValues = [](auto&&) { return std::tuple<>(); };

// What both kinds of connections have in common.
template <class Client>
class ConnectionProxy {
 public:
  explicit ConnectionProxy(Remote<Client> remote) : _remote(std::move(remote)) {}

  void close() {
    if (_closed.exchange(true)) return;
    send<>(
        _remote, [](const NSErrorPtr&) {},
        [](Client& client) { return client.closeRequest().send(); }, noValues);
  }

 protected:
  using Progress = std::shared_ptr<NSProgress>;

  // A message with a reply. `build` makes the request, which is sent as it is.
  template <class... Values, class Build, class Decode>
  void ask(Completion<Values..., NSErrorPtr>& completion, Build build, Decode decode) {
    if (_closed) {
      fail<Values...>(std::move(completion));
      return;
    }
    send<Values...>(
        _remote, std::move(completion),
        [build = std::move(build)](Client& client) mutable { return build(client).send(); },
        std::move(decode));
  }

  // The same with a progress.
  template <class... Values, class Build, class Decode>
  Progress askWithProgress(Completion<Values..., NSErrorPtr>& completion, Build build,
                           Decode decode) {
    auto [progress, makeObserver] =
        makeRemoteProgress(_remote.socket->loop(), _remote.socket->executor());
    if (_closed) {
      fail<Values...>(std::move(completion));
      return progress;
    }
    send<Values...>(
        _remote, std::move(completion),
        [build = std::move(build), makeObserver = std::move(makeObserver)](Client& client) mutable {
          auto request = build(client);
          request.setObserver(makeObserver());
          return request.send();
        },
        std::move(decode));
    return progress;
  }

  // A message without a reply.
  template <class Build>
  void tell(Build build) {
    if (_closed) return;
    send<>(
        _remote, [](const NSErrorPtr&) {},
        [build = std::move(build)](Client& client) mutable { return build(client).send(); },
        noValues);
  }

 private:
  template <class... Values>
  void fail(Completion<Values..., NSErrorPtr> completion) {
    _remote.socket->executor()->post([completion = std::move(completion)]() mutable {
      completion(Values()..., connectionHasEndedError());
    });
  }

  const Remote<Client> _remote;
  std::atomic<bool> _closed{false};
};

constexpr auto decodeShare = [](auto&& results) {
  return std::tuple(results.hasShare() ? codec::decodeFromClient(results.getShare())
                                       : CKSharePtr());
};

template <class Results>
NSURLPtr urlIn(Results&& results) {
  return results.hasUrl() ? codec::urlFromAddress(codec::text(results.getUrl())) : nullptr;
}
constexpr auto decodeURL = [](auto&& results) { return std::tuple(urlIn(results)); };

std::optional<std::string> textIf(bool present, capnp::Data::Reader data) {
  if (!present) return std::nullopt;
  return codec::text(data);
}

template <class Results>
NSFileProviderItemPtr itemIn(Results&& results) {
  if (!results.hasItem()) return nullptr;
  return codec::decode(results.getItem());
}

class SharingConnectionProxy final : public VLSharingServiceV1,
                                     public ConnectionProxy<wire::Sharing::Client> {
 public:
  using ConnectionProxy::ConnectionProxy;
  using Client = wire::Sharing::Client;
  using Progress = VLSharingServiceV1::Progress;

  void fetchSharingInfo(Completion<bool, NSFileProviderItemPtr, NSErrorPtr> reply) override {
    ask<bool, NSFileProviderItemPtr>(
        reply, [](Client& client) { return client.fetchSharingInfoRequest(); },
        [](auto&& results) { return std::tuple(results.getShared(), itemIn(results)); });
  }

  Progress preflightCheckIfCurrentlyShareableWithCompletion(
      Completion<bool, NSFileProviderItemPtr, Items, Items, NSErrorPtr> completion) override {
    return askWithProgress<bool, NSFileProviderItemPtr, Items, Items>(
        completion,
        [](Client& client) { return client.preflightCheckIfCurrentlyShareableRequest(); },
        [](auto&& results) {
          Items items;
          Items others;
          if (results.hasItems()) items = codec::decodeProviderItems(results.getItems());
          if (results.hasOtherItems()) others = codec::decodeProviderItems(results.getOtherItems());
          return std::tuple(results.getShareable(), itemIn(results), std::move(items),
                            std::move(others));
        });
  }

  Progress fetchParticipantListAndPublicPermission(
      Completion<Participants, std::int64_t, NSErrorPtr> reply) override {
    return askWithProgress<Participants, std::int64_t>(
        reply,
        [](Client& client) { return client.fetchParticipantListAndPublicPermissionRequest(); },
        [](auto&& results) {
          Participants participants;
          if (results.hasParticipants()) participants = codec::decode(results.getParticipants());
          return std::tuple(std::move(participants), results.getPublicPermission());
        });
  }

  void startPreparingForShareWhenForcing(bool forcing) override {
    tell([forcing](Client& client) {
      auto request = client.startPreparingForShareRequest();
      request.setForcing(forcing);
      return request;
    });
  }

  Progress fetchShareWithCompletion(Completion<CKSharePtr, NSErrorPtr> completion) override {
    return askWithProgress<CKSharePtr>(
        completion, [](Client& client) { return client.fetchShareRequest(); }, decodeShare);
  }

  Progress fetchShareURLWithCompletion(Completion<NSURLPtr, NSErrorPtr> completion) override {
    return askWithProgress<NSURLPtr>(
        completion, [](Client& client) { return client.fetchShareURLRequest(); }, decodeURL);
  }

  Progress saveShare(CKSharePtr share, Completion<CKSharePtr, NSErrorPtr> completion) override {
    return askWithProgress<CKSharePtr>(
        completion,
        [share = std::move(share)](Client& client) {
          auto request = client.saveShareRequest();
          if (share) codec::encodeForClient(request.initShare(), *share);
          return request;
        },
        decodeShare);
  }

  Progress unshareWithCompletion(Completion<NSErrorPtr> completion) override {
    return askWithProgress<>(
        completion, [](Client& client) { return client.unshareRequest(); }, noValues);
  }
};

class CollaborationConnectionProxy final : public VLFileProviderQuireCollaboration,
                                           public ConnectionProxy<wire::Collaboration::Client> {
 public:
  using Client = wire::Collaboration::Client;
  using Progress = VLFileProviderQuireCollaboration::Progress;

  CollaborationConnectionProxy(Remote<Client> remote, std::vector<std::string> selectors)
      : ConnectionProxy(std::move(remote)), _selectors(std::move(selectors)) {}

  bool respondsToSelector(std::string_view selector) const override {
    return std::find(_selectors.begin(), _selectors.end(), selector) != _selectors.end();
  }

  void fetchVersionAndCapabilitiesWithCompletionHandler(
      Completion<std::uint64_t, std::uint64_t, NSErrorPtr> handler) override {
    ask<std::uint64_t, std::uint64_t>(
        handler, [](Client& client) { return client.fetchVersionAndCapabilitiesRequest(); },
        [](auto&& results) {
          return std::tuple(std::uint64_t{results.getVersion()},
                            std::uint64_t{results.getCapabilities()});
        });
  }

  void setEnvironmentType(std::uint64_t environmentType) override {
    tell([environmentType](Client& client) {
      auto request = client.setEnvironmentTypeRequest();
      request.setEnvironmentType(environmentType);
      return request;
    });
  }

  Progress fetchCollaborationTokenWithCompletionHandler(
      Completion<Text, Text, Text, std::optional<NSDate>, NSErrorPtr> handler) override {
    return askWithProgress<Text, Text, Text, std::optional<NSDate>>(
        handler, [](Client& client) { return client.fetchCollaborationTokenRequest(); },
        [](auto&& results) {
          std::optional<NSDate> expiry;
          if (results.getHasExpiry()) expiry = codec::date(results.getExpiry());
          return std::tuple(textIf(results.hasProvider(), results.getProvider()),
                            textIf(results.hasFirstToken(), results.getFirstToken()),
                            textIf(results.hasSecondToken(), results.getSecondToken()), expiry);
        });
  }

  Progress fetchLatestRevisionWithCompletionHandler(Completion<NSErrorPtr> handler) override {
    return askWithProgress<>(
        handler, [](Client& client) { return client.fetchLatestRevisionRequest(); }, noValues);
  }

  Progress refreshSharingStateWithCompletionHandler(Completion<NSErrorPtr> handler) override {
    return askWithProgress<>(
        handler, [](Client& client) { return client.refreshSharingStateRequest(); }, noValues);
  }

  Progress fetchPrivacyStateWithCompletionHandler(
      Completion<bool, bool, NSURLPtr, NSErrorPtr> handler) override {
    return askWithProgress<bool, bool, NSURLPtr>(
        handler, [](Client& client) { return client.fetchPrivacyStateRequest(); },
        [](auto&& results) {
          return std::tuple(results.getFirst(), results.getSecond(), urlIn(results));
        });
  }

  void documentIsInUseWithTimeout(double timeout) override {
    tell([timeout](Client& client) {
      auto request = client.documentIsInUseRequest();
      request.setTimeout(timeout);
      return request;
    });
  }

  void fetchFileProviderIdentifierWithCompletionHandler(
      Completion<Text, NSErrorPtr> handler) override {
    ask<Text>(
        handler, [](Client& client) { return client.fetchFileProviderIdentifierRequest(); },
        [](auto&& results) {
          return std::tuple(textIf(results.hasIdentifier(), results.getIdentifier()));
        });
  }

  void fetchURLForSharingFileWithCompletionHandler(
      Completion<NSURLPtr, NSErrorPtr> handler) override {
    ask<NSURLPtr>(
        handler, [](Client& client) { return client.fetchURLForSharingFileRequest(); }, decodeURL);
  }

  Progress fetchFolderSharingStateWithCompletionHandler(
      Completion<bool, NSErrorPtr> handler) override {
    return askWithProgress<bool>(
        handler, [](Client& client) { return client.fetchFolderSharingStateRequest(); },
        [](auto&& results) { return std::tuple(results.getShared()); });
  }

  Progress fetchSharedFolderInfoWithCompletionHandler(
      Completion<bool, Text, NSErrorPtr> handler) override {
    return askWithProgress<bool, Text>(
        handler, [](Client& client) { return client.fetchSharedFolderInfoRequest(); },
        [](auto&& results) {
          return std::tuple(results.getShared(),
                            textIf(results.hasFolderName(), results.getFolderName()));
        });
  }

 private:
  const std::vector<std::string> _selectors;
};

// The proxies hold the connection too: it ends with the last of them, or when it is closed.
class Connection final : public ServiceConnection {
 public:
  explicit Connection(std::shared_ptr<SharingConnectionProxy> sharing)
      : _sharing(std::move(sharing)) {}
  explicit Connection(std::shared_ptr<CollaborationConnectionProxy> collaboration)
      : _collaboration(std::move(collaboration)) {}

  std::shared_ptr<VLSharingServiceV1> sharing() override { return _closed ? nullptr : _sharing; }
  std::shared_ptr<VLFileProviderQuireCollaboration> collaboration() override {
    return _closed ? nullptr : _collaboration;
  }
  void close() override {
    _closed = true;
    if (_sharing) _sharing->close();
    if (_collaboration) _collaboration->close();
  }

 private:
  const std::shared_ptr<SharingConnectionProxy> _sharing;
  const std::shared_ptr<CollaborationConnectionProxy> _collaboration;
  std::atomic<bool> _closed{false};
};

class Endpoint final : public ServiceEndpoint {
 public:
  explicit Endpoint(Remote<wire::Endpoint::Client> remote) : _remote(std::move(remote)) {}

  void connect(Reply<std::shared_ptr<ServiceConnection>, NSErrorPtr> reply) override {
    send<std::shared_ptr<ServiceConnection>>(
        _remote, std::move(reply),
        [socket = _remote.socket](wire::Endpoint::Client& endpoint) {
          return endpoint.connectRequest().send().then(
              [socket](auto&& results) { return connected(socket, results); });
        },
        [](Made& made) { return std::tuple(std::move(made.connection)); });
  }

 private:
  // Looks like results to send().
  struct Made {
    std::shared_ptr<ServiceConnection> connection;
    NSErrorPtr error;
  };
  template <class Results>
  static kj::Promise<Made> connected(const std::shared_ptr<SocketClient>& socket,
                                     Results& results) {
    if (!results.hasConnection()) {
      NSErrorPtr error = codec::errorOf(results);
      return Made{nullptr, error ? error : connectionHasEndedError()};
    }
    auto reference = results.getConnection();
    if (codec::text(results.getProtocolName()) != VLQuireCollaborationProtocolName) {
      using Client = wire::Sharing::Client;
      return Made{std::make_shared<Connection>(std::make_shared<SharingConnectionProxy>(
                      Remote<Client>(socket, reference.template castAs<wire::Sharing>()))),
                  nullptr};
    }
    using Client = wire::Collaboration::Client;
    auto client = reference.template castAs<wire::Collaboration>();
    return client.selectorsRequest().send().then([socket, client](auto&& answer) mutable {
      return Made{
          std::make_shared<Connection>(std::make_shared<CollaborationConnectionProxy>(
              Remote<Client>(socket, kj::mv(client)), codec::decode(answer.getSelectors()))),
          nullptr};
    });
  }

  const Remote<wire::Endpoint::Client> _remote;
};

class HostServicesProxy final : public HostServices {
 public:
  explicit HostServicesProxy(std::shared_ptr<SocketClient> socket) : _socket(std::move(socket)) {}
  ~HostServicesProxy() override { _socket->close(); }

  void serviceSources(HostTarget target,
                      Reply<std::vector<std::string>, NSErrorPtr> reply) override {
    call<std::vector<std::string>>(
        [target = std::move(target)](wire::Services::Client services) {
          auto request = services.serviceSourcesRequest();
          encode(request, target);
          return request.send();
        },
        [](auto& results) { return codec::decode(results.getNames()); }, reply);
  }

  void endpoint(HostTarget target, std::string serviceName,
                Reply<std::shared_ptr<ServiceEndpoint>, NSErrorPtr> reply) override {
    call<std::shared_ptr<ServiceEndpoint>>(
        [target = std::move(target),
         name = std::move(serviceName)](wire::Services::Client services) {
          auto request = services.endpointRequest();
          encode(request, target);
          request.setServiceName(codec::bytes(name));
          return request.send();
        },
        [socket = _socket](auto& results) -> std::shared_ptr<ServiceEndpoint> {
          if (!results.hasEndpoint()) return nullptr;
          return std::make_shared<Endpoint>(
              Remote<wire::Endpoint::Client>(socket, results.getEndpoint()));
        },
        reply);
  }

 private:
  static void encode(auto& request, const HostTarget& target) {
    request.setIsIdentifier(target.kind == HostTarget::Kind::Identifier);
    request.setTarget(codec::bytes(target.text));
  }

  template <class Value, class Build, class Decode>
  void call(Build build, Decode decode, Reply<Value, NSErrorPtr>& reply) {
    auto shared = std::make_shared<Reply<Value, NSErrorPtr>>(std::move(reply));
    _socket->send(
        [build = std::move(build), decode = std::move(decode),
         shared](capnp::Capability::Client server) mutable -> kj::Promise<Task> {
          auto services = server.castAs<wire::Host>()
                              .servicesRequest()
                              .send()
                              .getServices()
                              .castAs<wire::Services>();
          return build(kj::mv(services))
              .then([shared, decode = std::move(decode)](auto&& results) mutable -> Task {
                return
                    [shared, value = decode(results), error = codec::errorOf(results)]() mutable {
                      (*shared)(std::move(value), std::move(error));
                    };
              });
        },
        [shared](NSErrorPtr error) { (*shared)(Value(), std::move(error)); }, kPatience);
  }

  const std::shared_ptr<SocketClient> _socket;
};

}  // namespace

std::shared_ptr<HostServices> makeHostServicesClient(std::shared_ptr<SocketClient> socket) {
  return std::make_shared<HostServicesProxy>(std::move(socket));
}

std::shared_ptr<HostServices> makeHostServicesClient(std::shared_ptr<RpcLoop> loop,
                                                     std::shared_ptr<Executor> executor,
                                                     SocketClient::Options options) {
  return makeHostServicesClient(
      std::make_shared<SocketClient>(std::move(loop), std::move(executor), std::move(options)));
}

}  // namespace skein
