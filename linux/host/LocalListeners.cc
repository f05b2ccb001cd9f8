#include "linux/host/LocalListeners.h"

#include <atomic>
#include <utility>

#include "base/Mutex.h"
#include "linux/host/LocalConnection.h"

namespace skein {
namespace {

std::atomic<std::size_t> livingListenerCount{0};

class LocalListener;

class LocalEndpoint final : public NSXPCListenerEndpoint, public ServiceEndpoint {
 public:
  explicit LocalEndpoint(std::weak_ptr<LocalListener> listener) : _listener(std::move(listener)) {}
  void connect(Reply<std::shared_ptr<ServiceConnection>, NSErrorPtr> reply) override;

 private:
  const std::weak_ptr<LocalListener> _listener;
};

class LocalListener final : public NSXPCListener,
                            public std::enable_shared_from_this<LocalListener> {
 public:
  explicit LocalListener(std::shared_ptr<Executor> executor) : _executor(std::move(executor)) {
    ++livingListenerCount;
  }
  ~LocalListener() override { --livingListenerCount; }

  void setDelegate(std::weak_ptr<NSXPCListenerDelegate> delegate) override SKEIN_EXCLUDES(_mutex) {
    MutexLock lock(_mutex);
    _delegate = std::move(delegate);
  }
  std::shared_ptr<NSXPCListenerEndpoint> endpoint() override {
    return std::make_shared<LocalEndpoint>(weak_from_this());
  }
  void resume() override SKEIN_EXCLUDES(_mutex) {
    MutexLock lock(_mutex);
    _resumed = true;
  }
  void invalidate() override SKEIN_EXCLUDES(_mutex) {
    MutexLock lock(_mutex);
    _invalidated = true;
  }

  // Null when it is not taken: there is no delegate, it refuses, or the listener has ended.
  std::shared_ptr<ServiceConnection> accept() SKEIN_EXCLUDES(_mutex) {
    std::shared_ptr<NSXPCListenerDelegate> delegate;
    {
      MutexLock lock(_mutex);
      if (!_resumed || _invalidated) return nullptr;
      delegate = _delegate.lock();
    }
    if (!delegate) return nullptr;
    auto connection = std::make_shared<LocalConnection>(_executor);
    if (!delegate->listener_shouldAcceptNewConnection(shared_from_this(), connection)) {
      return nullptr;
    }
    return LocalConnection::transportFace(std::move(connection));
  }

 private:
  const std::shared_ptr<Executor> _executor;
  Mutex _mutex;
  std::weak_ptr<NSXPCListenerDelegate> _delegate SKEIN_GUARDED_BY(_mutex);
  bool _resumed SKEIN_GUARDED_BY(_mutex) = false;
  bool _invalidated SKEIN_GUARDED_BY(_mutex) = false;
};

void LocalEndpoint::connect(Reply<std::shared_ptr<ServiceConnection>, NSErrorPtr> reply) {
  const auto listener = _listener.lock();
  auto connection = listener ? listener->accept() : nullptr;
  NSErrorPtr error = connection ? nullptr : connectionHasEndedError();
  reply(std::move(connection), std::move(error));
}

}  // namespace

std::shared_ptr<NSXPCListener> LocalListeners::anonymousListener() {
  return std::make_shared<LocalListener>(_executor);
}

std::size_t LocalListeners::livingListeners() { return livingListenerCount; }
std::size_t LocalListeners::livingConnections() { return LocalConnection::living(); }

std::shared_ptr<ServiceEndpoint> serviceEndpoint(
    const std::shared_ptr<NSXPCListenerEndpoint>& endpoint) {
  return std::dynamic_pointer_cast<ServiceEndpoint>(endpoint);
}

}  // namespace skein
