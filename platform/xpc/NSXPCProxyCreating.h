#pragma once

#include <functional>
#include <memory>

#include "platform/foundation/NSError.h"

namespace skein {

// Something in another process that messages are sent to through proxies. Any thread.
template <class RemoteObject>
class NSXPCProxyCreating {
 public:
  virtual ~NSXPCProxyCreating() = default;

  // remoteObjectProxyWithErrorHandler: never null. The handler runs once for each message
  // that gets no reply because the connection failed, on a reply thread.
  virtual std::shared_ptr<RemoteObject> remoteObjectProxyWithErrorHandler(
      std::function<void(NSErrorPtr)> errorHandler) = 0;
};

}  // namespace skein
