// How a proxy of vald sends a message. Include this in few files: it costs seconds to
// compile.
#pragma once

#include <functional>
#include <memory>
#include <utility>

#include "linux/protocol/Codec.h"
#include "linux/protocol/SocketClient.h"

namespace skein {

using Patience = SocketClient::Patience;

// The messages of one proxy: either a message's answer is handed on or the proxy's error
// handler runs, once, on the executor. Any thread. Copies are of the same proxy.
class DaemonCalls {
 public:
  DaemonCalls(std::shared_ptr<SocketClient> socket, std::function<void(NSErrorPtr)> errorHandler)
      : _socket(std::move(socket)), _errorHandler(std::move(errorHandler)) {}

  const std::shared_ptr<SocketClient>& socket() const { return _socket; }

  // build(client) sends a request of `Interface`; decode(results) makes what hands the
  // answer on. Both on the loop's thread.
  template <class Interface, class Build, class Decode>
  void call(Build build, Decode decode, Patience patience = Patience::Deadline) const {
    _socket->send(
        [build = std::move(build), decode = std::move(decode)](
            capnp::Capability::Client server) mutable -> kj::Promise<Task> {
          auto object = server.castAs<Interface>();
          return build(object).then([decode = kj::mv(decode)](auto&& results) mutable -> Task {
            return decode(results);
          });
        },
        [handler = _errorHandler](NSErrorPtr error) {
          if (handler) handler(std::move(error));
        },
        patience);
  }

 private:
  std::shared_ptr<SocketClient> _socket;
  std::function<void(NSErrorPtr)> _errorHandler;
};

// For an answer that only has an error.
inline auto errorReply(Reply<NSErrorPtr> reply) {
  return [reply = std::move(reply)](const auto& results) mutable -> Task {
    return [reply = std::move(reply), error = codec::errorOf(results)]() mutable {
      reply(std::move(error));
    };
  };
}

}  // namespace skein
