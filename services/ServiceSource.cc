#include "services/ServiceSource.h"

namespace skein {

std::shared_ptr<NSXPCListenerEndpoint> ServiceSource::makeListenerEndpointAndReturnError(
    NSErrorOut /*error*/) {
  const auto listener = _item.environment.xpcListeners.anonymousListener();
  listener->setDelegate(weak_from_this());
  auto endpoint = listener->endpoint();
  listener->resume();
  MutexLock lock(_mutex);
  _listeners.insert(listener);
  return endpoint;
}

bool ServiceSource::listener_shouldAcceptNewConnection(
    const std::shared_ptr<NSXPCListener>& listener,
    const std::shared_ptr<NSXPCConnection>& newConnection) {
  newConnection->setExportedInterface(exportedInterface());
  newConnection->setExportedObject(makeExportedObject(_item));
  {
    MutexLock lock(_mutex);
    _listeners.erase(listener);
  }
  // The handlers outlive the source, so they hold it.
  newConnection->setInvalidationHandler([self = shared_from_this(), listener] {
    self->logInvalidated(self->_item.environment.log);
    listener->invalidate();
  });
  newConnection->setInterruptionHandler(
      [self = shared_from_this(), weak = std::weak_ptr(newConnection)] {
        self->logInterrupted(self->_item.environment.log);
        if (const auto connection = weak.lock()) connection->invalidate();
      });
  newConnection->resume();
  return true;
}

}  // namespace skein
