#pragma once

#include <memory>

#include "base/Mutex.h"
#include "platform/fileprovider/NSFileProviderServiceSource.h"
#include "platform/foundation/NSHashTable.h"
#include "services/ServiceItem.h"

namespace skein {

// One service of one item: hands out endpoints, and exports an object of its own to each
// client that connects to one.
//
// An endpoint is for one client. Its listener lives in _listeners until its first
// connection is accepted; from then on that connection's invalidation handler alone keeps
// it, and invalidates it. Until then further connections are accepted as well. Any thread.
class ServiceSource : public NSFileProviderServiceSource,
                      public NSXPCListenerDelegate,
                      public ServiceItem,
                      public std::enable_shared_from_this<ServiceSource> {
 public:
  using ServiceItem::ServiceItem;

  // makeListenerEndpointAndReturnError: never null, stores no error.
  std::shared_ptr<NSXPCListenerEndpoint> makeListenerEndpointAndReturnError(
      NSErrorOut error) override SKEIN_EXCLUDES(_mutex);

  // listener:shouldAcceptNewConnection: always YES.
  bool listener_shouldAcceptNewConnection(
      const std::shared_ptr<NSXPCListener>& listener,
      const std::shared_ptr<NSXPCConnection>& newConnection) override SKEIN_EXCLUDES(_mutex);

 protected:
  virtual NSXPCInterface _exportedInterface() const = 0;
  virtual std::shared_ptr<NSXPCExportedObject> _makeExportedObject() const = 0;
  virtual void _logInvalidated(Log& log) const = 0;
  virtual void _logInterrupted(Log& log) const = 0;

 private:
  Mutex _mutex;
  NSHashTable<NSXPCListener> _listeners SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein
