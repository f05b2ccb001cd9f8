#pragma once

#include <memory>
#include <string>
#include <vector>

#include "platform/foundation/NSError.h"
#include "platform/xpc/NSXPCListener.h"

namespace skein {

// One service that an item offers to client apps. Any thread.
class NSFileProviderServiceSource {
 public:
  virtual ~NSFileProviderServiceSource() = default;

  virtual std::string serviceName() const = 0;

  // makeListenerEndpointAndReturnError: a fresh endpoint, which the caller may hand to
  // another process; null with an error when there is none.
  virtual std::shared_ptr<NSXPCListenerEndpoint> makeListenerEndpointAndReturnError(
      NSErrorOut error) = 0;
};

using NSFileProviderServiceSources = std::vector<std::shared_ptr<NSFileProviderServiceSource>>;

}  // namespace skein
