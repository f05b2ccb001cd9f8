#pragma once

#include <functional>
#include <memory>
#include <string>

#include "base/Executor.h"
#include "linux/protocol/HostService.h"
#include "linux/protocol/RpcLoop.h"
#include "linux/protocol/ServiceEndpoints.h"
#include "platform/log/Log.h"

namespace skein {

// Serves a HostService, and items' services, on a socket, to clients that run as this user.
//
// The service is called on the executor and answers from any thread; a Reply that it
// destroys uncalled makes the call fail. A stream belongs to its client: when the client
// lets go of it or is gone, it is released, on the executor.
class HostServer {
 public:
  // Listens from now on. Null with an error that names the socket. `log` has to outlive
  // the server. `addressLost`: see SocketServer.
  static std::unique_ptr<HostServer> listen(const std::shared_ptr<RpcLoop>& loop,
                                            const std::shared_ptr<Executor>& executor,
                                            const std::shared_ptr<HostService>& service,
                                            const std::shared_ptr<HostServices>& services,
                                            const std::string& socketPath, Log& log,
                                            NSErrorOut error,
                                            std::function<void()> addressLost = {});
  // Closes the socket and every connection.
  ~HostServer();

 private:
  class Implementation;
  explicit HostServer(std::unique_ptr<Implementation> implementation);
  std::unique_ptr<Implementation> _implementation;
};

}  // namespace skein
