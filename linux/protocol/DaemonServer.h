#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <string>

#include "base/Executor.h"
#include "linux/protocol/CallFaults.h"
#include "linux/protocol/LocalDaemon.h"
#include "linux/protocol/RpcLoop.h"
#include "platform/log/Log.h"

namespace skein {

// Serves a LocalDaemon on a socket, to clients that run as this user.
//
// The daemon is called on the loop's thread and has to return at once; it answers from any
// thread, and a Reply that it destroys uncalled makes the call fail. What a client sends
// back (replies to pushes) reaches the daemon on the executor.
//
// An update sender belongs to its client: when the client lets go of it or is gone, it is
// invalidated and released, on the executor. Where it is a LinkBreaking, the client hears
// of its broken link. Subscribers are held by the server until their client is gone; the
// daemon holds them weakly.
class DaemonServer {
 public:
  // Listens from now on. Null with an error that names the socket. `log` has to outlive
  // the server. `faults` is asked before every call; null: no call has any. `addressLost`: see
  // SocketServer.
  static std::unique_ptr<DaemonServer> listen(const std::shared_ptr<RpcLoop>& loop,
                                              const std::shared_ptr<Executor>& executor,
                                              const std::shared_ptr<LocalDaemon>& daemon,
                                              const std::string& socketPath, Log& log,
                                              NSErrorOut error,
                                              const std::shared_ptr<CallFaults>& faults = nullptr,
                                              std::function<void()> addressLost = {});
  // Closes the socket and every connection. When it returns, the server has let go of the
  // daemon and the log; update senders may still be on their way to the executor.
  ~DaemonServer();

  // Lets every client read what was answered; see SocketServer::finish.
  void finish(std::chrono::milliseconds patience);

  // Closes every connection there is; new ones are accepted. Any thread.
  void dropConnections();

 private:
  class Implementation;
  explicit DaemonServer(std::unique_ptr<Implementation> implementation);
  std::unique_ptr<Implementation> _implementation;
};

}  // namespace skein
