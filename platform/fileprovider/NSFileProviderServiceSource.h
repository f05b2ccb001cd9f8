#pragma once

#include <memory>
#include <string>
#include <vector>

#include "platform/foundation/NSError.h"

namespace skein {

// A reference that a client process connects to, and through which it reaches one
// exported object and nothing else. What it holds is the transport's.
class NSXPCListenerEndpoint {
 public:
  virtual ~NSXPCListenerEndpoint() = default;
};

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
