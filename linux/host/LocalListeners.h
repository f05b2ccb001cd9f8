// The platform's listeners on this host. What a client process reaches is a reference; see
// linux/protocol/ServicesServer.h for how it crosses.
#pragma once

#include <memory>

#include "base/Executor.h"
#include "linux/protocol/ServiceEndpoints.h"
#include "platform/xpc/NSXPCListener.h"

namespace skein {

// Makes anonymous listeners, whose endpoints are also ServiceEndpoints. Any thread.
class LocalListeners final : public NSXPCListeners {
 public:
  // Connections' handlers run on the executor.
  explicit LocalListeners(std::shared_ptr<Executor> executor) : _executor(std::move(executor)) {}

  std::shared_ptr<NSXPCListener> anonymousListener() override;

  // How many listeners, and accepted connections, there are in the process.
  static std::size_t livingListeners();
  static std::size_t livingConnections();

 private:
  const std::shared_ptr<Executor> _executor;
};

// `endpoint` as a client process uses it; null for an endpoint of another transport.
std::shared_ptr<ServiceEndpoint> serviceEndpoint(
    const std::shared_ptr<NSXPCListenerEndpoint>& endpoint);

}  // namespace skein
