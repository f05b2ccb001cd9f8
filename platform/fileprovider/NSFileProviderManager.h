#pragma once

#include "base/Completion.h"
#include "platform/fileprovider/NSFileProviderItem.h"
#include "platform/foundation/NSError.h"

namespace skein {

// The extension's way to tell the host that a container has news.
class NSFileProviderManager {
 public:
  virtual ~NSFileProviderManager() = default;

  // signalEnumeratorForContainerItemIdentifier:completionHandler:
  // Asynchronous and coalescing. `completionHandler` runs on any thread, with an error
  // for a container that the host does not know; it may be empty. May be called from
  // any thread, with any lock held.
  virtual void signalEnumeratorForContainerItemIdentifier(
      const NSFileProviderItemIdentifier& identifier, Completion<NSErrorPtr> completionHandler) = 0;
};

}  // namespace skein
