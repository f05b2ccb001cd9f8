#include "services/ServiceSource.h"

namespace skein {

std::shared_ptr<NSXPCListenerEndpoint> ServiceSource::makeListenerEndpointAndReturnError(
    NSErrorOut /*error*/) {
  const auto listener = _environment.xpcListeners.anonymousListener();
  listener->setDelegate(weak_from_this());
  auto endpoint = listener->endpoint();
  listener->resume();
  MutexLock lock(_mutex);
  _listeners.addObject(listener);
  return endpoint;
}

bool ServiceSource::listener_shouldAcceptNewConnection(
    const std::shared_ptr<NSXPCListener>& listener,
    const std::shared_ptr<NSXPCConnection>& newConnection) {
  newConnection->setExportedInterface(_exportedInterface());
  newConnection->setExportedObject(_makeExportedObject());
  {
    MutexLock lock(_mutex);
    _listeners.removeObject(listener);
  }
  // The handlers outlive the source, so they hold it.
  newConnection->setInvalidationHandler([self = shared_from_this(), listener] {
    self->_logInvalidated(self->_environment.log);
    listener->invalidate();
  });
  newConnection->setInterruptionHandler(
      [self = shared_from_this(), weak = std::weak_ptr(newConnection)] {
        self->_logInterrupted(self->_environment.log);
        if (const auto connection = weak.lock()) connection->invalidate();
      });
  newConnection->resume();
  return true;
}

}  // namespace skein
