#pragma once

#include <memory>

#include "linux/protocol/DrivePaths.h"
#include "linux/protocol/HostService.h"
#include "linux/protocol/SocketClient.h"

namespace skein {

// How a client reaches the drive's skein-host, which is started when it does not run.
SocketClient::Options hostClientOptions(const DrivePaths& paths);

// skein-host, over its socket. Replies come on the executor. An answer may take as long as
// the host lives and answers probes: the host times its own requests. Errors of the
// connection are VLVellumErrorDaemonUnreachable and name skein-host. Streams belong to the
// connection that they were made on.
std::shared_ptr<HostService> makeHostClient(std::shared_ptr<RpcLoop> loop,
                                            std::shared_ptr<Executor> executor,
                                            SocketClient::Options options);

}  // namespace skein
