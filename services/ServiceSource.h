#pragma once

#include <memory>
#include <set>
#include <string>

#include "base/Mutex.h"
#include "platform/fileprovider/NSFileProviderItem.h"
#include "platform/fileprovider/NSFileProviderServiceSource.h"
#include "platform/foundation/NSOperation.h"
#include "support/Environment.h"
#include "support/VLItemLookup.h"

namespace skein {

// What a service works with: the item that it is for, and the extension that offers it.
struct ServiceItem {
  // The principal class's lookups; to hold them is to hold the principal object.
  std::shared_ptr<VLItemLookup> fileProviderExtension;
  NSFileProviderItemIdentifier itemIdentifier;
  std::shared_ptr<NSOperationQueue> operationQueue;
  Environment& environment;
};

// One service of one item: hands out endpoints, and exports an object of its own to each
// client that connects to one.
//
// An endpoint is for one client. Its listener lives in _listeners until its first
// connection is accepted; from then on that connection's invalidation handler alone keeps
// it, and invalidates it. Until then further connections are accepted as well. Any thread.
class ServiceSource : public NSFileProviderServiceSource,
                      public NSXPCListenerDelegate,
                      public std::enable_shared_from_this<ServiceSource> {
 public:
  // initWithFileProviderExtension:itemIdentifier:operationQueue:
  explicit ServiceSource(ServiceItem item) : _item(std::move(item)) {}

  // makeListenerEndpointAndReturnError: never null, stores no error.
  std::shared_ptr<NSXPCListenerEndpoint> makeListenerEndpointAndReturnError(
      NSErrorOut error) override SKEIN_EXCLUDES(_mutex);

  // listener:shouldAcceptNewConnection: always YES.
  bool listener_shouldAcceptNewConnection(
      const std::shared_ptr<NSXPCListener>& listener,
      const std::shared_ptr<NSXPCConnection>& newConnection) override SKEIN_EXCLUDES(_mutex);

 protected:
  virtual NSXPCInterface exportedInterface() const = 0;
  virtual std::shared_ptr<NSXPCExportedObject> makeExportedObject(const ServiceItem& item) = 0;
  virtual void logInvalidated(Log& log) const = 0;
  virtual void logInterrupted(Log& log) const = 0;

 private:
  const ServiceItem _item;
  Mutex _mutex;
  std::set<std::shared_ptr<NSXPCListener>> _listeners SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein
