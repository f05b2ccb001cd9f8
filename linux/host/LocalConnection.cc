#include "linux/host/LocalConnection.h"

#include <atomic>
#include <utility>

namespace skein {
namespace {

std::atomic<std::size_t> livingCount{0};

}  // namespace

class LocalConnection::TransportFace final : public ServiceConnection {
 public:
  explicit TransportFace(std::shared_ptr<LocalConnection> own) : _own(std::move(own)) {}
  ~TransportFace() override { _own->interrupt(); }

  std::shared_ptr<VLSharingServiceV1> sharing() override {
    return std::dynamic_pointer_cast<VLSharingServiceV1>(
        _own->exported(getSharingServiceInterface().protocolName));
  }
  std::shared_ptr<VLFileProviderQuireCollaboration> collaboration() override {
    return std::dynamic_pointer_cast<VLFileProviderQuireCollaboration>(
        _own->exported(VLQuireCollaborationProtocolName));
  }
  void close() override { _own->invalidate(); }

 private:
  const std::shared_ptr<LocalConnection> _own;
};

std::shared_ptr<ServiceConnection> LocalConnection::transportFace(
    std::shared_ptr<LocalConnection> own) {
  return std::make_shared<TransportFace>(std::move(own));
}

LocalConnection::LocalConnection(std::shared_ptr<Executor> executor)
    : _handlers("service-connection", std::move(executor)) {
  ++livingCount;
}

LocalConnection::~LocalConnection() { --livingCount; }

std::size_t LocalConnection::living() { return livingCount; }

void LocalConnection::setExportedInterface(NSXPCInterface interface) {
  MutexLock lock(_mutex);
  _interface = std::move(interface);
}

void LocalConnection::setExportedObject(std::shared_ptr<NSXPCExportedObject> object) {
  MutexLock lock(_mutex);
  if (!_invalidated) _object.swap(object);
}

void LocalConnection::setInvalidationHandler(std::function<void()> handler) {
  MutexLock lock(_mutex);
  _invalidationHandler.swap(handler);
}

void LocalConnection::setInterruptionHandler(std::function<void()> handler) {
  MutexLock lock(_mutex);
  _interruptionHandler.swap(handler);
}

void LocalConnection::resume() {
  MutexLock lock(_mutex);
  _resumed = true;
}

void LocalConnection::invalidate() {
  std::function<void()> handler;
  std::function<void()> unused;
  std::shared_ptr<NSXPCExportedObject> leaving;
  {
    MutexLock lock(_mutex);
    if (std::exchange(_invalidated, true)) return;
    handler.swap(_invalidationHandler);
    unused.swap(_interruptionHandler);
    leaving.swap(_object);
  }
  // Their destructors are the extension's code: they run in the handlers' turn as well.
  _handlers.async([handler = std::move(handler), unused = std::move(unused),
                   leaving = std::move(leaving)]() mutable {
    if (handler) handler();
  });
}

void LocalConnection::interrupt() {
  std::function<void()> handler;
  {
    MutexLock lock(_mutex);
    if (_invalidated) return;
    handler.swap(_interruptionHandler);
  }
  // It holds the connection weakly, so this holds it until then.
  if (handler) {
    _handlers.async([self = shared_from_this(), handler = std::move(handler)] { handler(); });
  }
}

std::shared_ptr<NSXPCExportedObject> LocalConnection::exported(const std::string& protocolName) {
  MutexLock lock(_mutex);
  return _resumed && _interface.protocolName == protocolName ? _object : nullptr;
}

}  // namespace skein
