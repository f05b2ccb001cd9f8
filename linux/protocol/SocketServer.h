#pragma once

#include <capnp/capability.h>

#include <chrono>
#include <cstddef>
#include <functional>
#include <memory>
#include <string>

#include "linux/protocol/Deadlines.h"
#include "linux/protocol/RpcLoop.h"
#include "platform/foundation/NSError.h"
#include "platform/log/Log.h"

namespace skein {

// Listens on a Unix socket and serves an object to each peer that runs as this user.
//
// Any peer may misbehave: what cannot be parsed, is too long or never ends its calls
// closes that connection and nothing else. There is an upper bound to connections; when
// it is reached, the one that has been silent for longest makes room, first of all one
// that never spoke.
class SocketServer {
 public:
  // Makes the object for one connection, of the process `peer`; called on the loop's thread.
  // The connection holds it, and releases it (there) when it ends.
  using Bootstrap = std::function<capnp::Capability::Client(pid_t peer)>;

  struct Options {
    std::size_t mostConnections = 128;
    // A connection that says nothing for so long from its start is closed.
    std::chrono::milliseconds firstMessage{deadlines::kFirstMessage};
  };

  // Listens from now on. Null with an error that names the path. Any thread but the
  // loop's. `log` has to outlive the server.
  //
  // `addressLost` is called once, on the loop's thread, when the socket's file is gone or
  // another has its place: nobody finds this server any more. Whoever wants it to end may
  // remove the file.
  static std::shared_ptr<SocketServer> listen(const std::shared_ptr<RpcLoop>& loop,
                                              const std::string& path, Bootstrap bootstrap,
                                              Log& log, Options options, NSErrorOut error,
                                              std::function<void()> addressLost = {});

  // Closes the socket and every connection, and removes the socket's file, unless another
  // has its place. When it
  // returns, neither the log nor the bootstrap function is used any more.
  ~SocketServer();
  SocketServer(const SocketServer&) = delete;
  SocketServer& operator=(const SocketServer&) = delete;

  // Sends what is still to be sent, then waits until every peer has read it and closed its
  // end, or for `patience`. Otherwise a peer that is just writing would lose what it has not
  // read. Any thread but the loop's.
  void finish(std::chrono::milliseconds patience);

  // Closes every connection there is; new ones are accepted. Any thread.
  void dropConnections();

 private:
  struct Core;
  SocketServer(std::shared_ptr<RpcLoop> loop, std::shared_ptr<Core> core);

  std::shared_ptr<RpcLoop> _loop;
  std::shared_ptr<Core> _core;
};

}  // namespace skein
