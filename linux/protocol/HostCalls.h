// How a proxy of skein-host sends a message. Include this in few files: it costs seconds to
// compile.
#pragma once

#include <cstdint>
#include <memory>
#include <type_traits>
#include <utility>

#include "linux/protocol/Codec.h"
#include "linux/protocol/HostTypes.h"
#include "linux/protocol/SocketClient.h"

namespace skein {

// An answer may take as long as the host lives: it times its own requests.
inline constexpr auto kHostPatience = SocketClient::Patience::WhilePeerLives;

template <class... Values>
using SharedReply = std::shared_ptr<Reply<Values..., NSErrorPtr>>;
template <class... Values>
SharedReply<Values...> share(std::type_identity_t<Reply<Values..., NSErrorPtr>>& reply) {
  return std::make_shared<Reply<Values..., NSErrorPtr>>(std::move(reply));
}

// One stream, on the connection that it was made on. The reference belongs to the loop.
// `Decode` is a function object without state; `Stream` the HostStream<Values...> that it is.
template <class Stream, class Client, class Decode, class... Values>
class StreamProxy : public Stream {
 public:
  StreamProxy(std::shared_ptr<SocketClient> socket, Client client)
      : _socket(std::move(socket)),
        _client(_socket->loop()->own(std::make_unique<Client>(kj::mv(client)))),
        _connection(_socket->currentConnection()) {}

  void next(Reply<Values..., NSErrorPtr> reply) override {
    auto shared = share<Values...>(reply);
    _socket->loop()->post([socket = _socket, client = _client, connection = _connection, shared] {
      socket->sendOver(
          connection,
          [client, shared]() -> kj::Promise<Task> {
            return client->nextRequest().send().then(
                [shared](auto results) -> Task { return Decode()(results, shared); });
          },
          [shared](NSErrorPtr error) { (*shared)(Values()..., std::move(error)); }, kHostPatience);
    });
  }

 protected:
  const std::shared_ptr<SocketClient> _socket;
  const std::shared_ptr<Client> _client;

 private:
  const std::uint64_t _connection;
};

template <class... Values, class Client, class Decode>
std::shared_ptr<HostStream<Values...>> makeStream(const std::shared_ptr<SocketClient>& socket,
                                                  Client client, Decode) {
  using Stream = HostStream<Values...>;
  return std::make_shared<StreamProxy<Stream, Client, Decode, Values...>>(socket, kj::mv(client));
}

// The messages of one interface of the host's object. A call's `reply` runs once, on the
// executor, with the answer or the connection's error. send(object) sends a request and
// decode(results) makes its value, both on the loop's thread.
template <class Interface>
class HostCalls {
 public:
  explicit HostCalls(std::shared_ptr<SocketClient> socket) : _socket(std::move(socket)) {}

 protected:
  template <class Value, class Send, class Decode>
  void call(Send send, Decode decode, Reply<Value, NSErrorPtr>& reply) {
    struct Waiting {
      Reply<Value, NSErrorPtr> reply;
      Decode decode;
    };
    auto waiting = std::make_shared<Waiting>(Waiting{std::move(reply), std::move(decode)});
    _socket->send(
        [send = std::move(send),
         waiting](capnp::Capability::Client server) mutable -> kj::Promise<Task> {
          auto host = server.castAs<Interface>();
          return send(host).then([waiting](auto results) -> Task {
            return [waiting, value = waiting->decode(results),
                    error = codec::errorOf(results)]() mutable {
              waiting->reply(std::move(value), std::move(error));
            };
          });
        },
        [waiting](NSErrorPtr error) { waiting->reply(Value(), std::move(error)); }, kHostPatience);
  }

  template <class Send>
  void callForError(Send send, Reply<NSErrorPtr>& reply) {
    auto shared = std::make_shared<Reply<NSErrorPtr>>(std::move(reply));
    _socket->send(
        [send = std::move(send),
         shared](capnp::Capability::Client server) mutable -> kj::Promise<Task> {
          auto host = server.castAs<Interface>();
          return send(host).then([shared](auto results) -> Task {
            return [shared, error = codec::errorOf(results)]() mutable {
              (*shared)(std::move(error));
            };
          });
        },
        [shared](NSErrorPtr error) { (*shared)(std::move(error)); }, kHostPatience);
  }

  const std::shared_ptr<SocketClient> _socket;
};

}  // namespace skein
