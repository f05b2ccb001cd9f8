// skein-host's ends of services on the socket. Include this in few files: it costs seconds
// to compile.
#pragma once

#include <capnp/capability.h>

#include <memory>

#include "base/Executor.h"
#include "linux/protocol/RpcLoop.h"
#include "linux/protocol/ServiceEndpoints.h"

namespace skein {

// `services`, as one client's connection meets it. On the loop's thread.
//
// Services are called on the executor, those of one connection one after the other in the
// order of the messages, and answer from any thread. An endpoint and a connection belong to
// their client: what it lets go of is released on the executor, and with a connection that
// ends its requests under way are cancelled. One client holds a bounded number of them.
capnp::Capability::Client makeServicesObject(std::shared_ptr<RpcLoop> loop,
                                             std::shared_ptr<Executor> executor,
                                             std::shared_ptr<HostServices> services);

}  // namespace skein
