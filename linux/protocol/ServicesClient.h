#pragma once

#include <memory>

#include "linux/protocol/ServiceEndpoints.h"
#include "linux/protocol/SocketClient.h"

namespace skein {

// skein-host's services, over a connection of their own. Replies come on the executor.
// Endpoints and connections belong to the socket's connection that they were made on: when
// that is lost, their errors are VLVellumErrorDaemonUnreachable.
std::shared_ptr<HostServices> makeHostServicesClient(std::shared_ptr<SocketClient> socket);
std::shared_ptr<HostServices> makeHostServicesClient(std::shared_ptr<RpcLoop> loop,
                                                     std::shared_ptr<Executor> executor,
                                                     SocketClient::Options options);

}  // namespace skein
