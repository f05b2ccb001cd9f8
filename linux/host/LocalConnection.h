#pragma once

#include <functional>
#include <memory>
#include <string>

#include "base/Mutex.h"
#include "base/SerialQueue.h"
#include "linux/protocol/ServiceEndpoints.h"
#include "platform/xpc/NSXPCConnection.h"

namespace skein {

// One client's connection: the extension configures its one face, the transport uses the
// other. The transport owns it; when it lets go without close(), the client is gone, and the
// interruption handler runs. Handlers run on the executor, one at a time. Any thread.
class LocalConnection final : public NSXPCConnection,
                              public std::enable_shared_from_this<LocalConnection> {
 public:
  // The transport's face. Its last reference is how the transport lets go.
  static std::shared_ptr<ServiceConnection> transportFace(std::shared_ptr<LocalConnection> own);

  explicit LocalConnection(std::shared_ptr<Executor> executor);
  ~LocalConnection() override;

  void setExportedInterface(NSXPCInterface interface) override SKEIN_EXCLUDES(_mutex);
  void setExportedObject(std::shared_ptr<NSXPCExportedObject> object) override
      SKEIN_EXCLUDES(_mutex);
  void setInvalidationHandler(std::function<void()> handler) override SKEIN_EXCLUDES(_mutex);
  void setInterruptionHandler(std::function<void()> handler) override SKEIN_EXCLUDES(_mutex);
  void resume() override SKEIN_EXCLUDES(_mutex);
  void invalidate() override SKEIN_EXCLUDES(_mutex);

  static std::size_t living();

 private:
  class TransportFace;

  // The client is gone: the interruption handler runs, unless the connection has ended.
  void interrupt() SKEIN_EXCLUDES(_mutex);
  // The exported object, when the exported interface names `protocolName`, from resume() to
  // invalidate(); else null.
  std::shared_ptr<NSXPCExportedObject> exported(const std::string& protocolName)
      SKEIN_EXCLUDES(_mutex);

  SerialQueue _handlers;
  Mutex _mutex;
  NSXPCInterface _interface SKEIN_GUARDED_BY(_mutex);
  std::shared_ptr<NSXPCExportedObject> _object SKEIN_GUARDED_BY(_mutex);
  std::function<void()> _invalidationHandler SKEIN_GUARDED_BY(_mutex);
  std::function<void()> _interruptionHandler SKEIN_GUARDED_BY(_mutex);
  bool _resumed SKEIN_GUARDED_BY(_mutex) = false;
  bool _invalidated SKEIN_GUARDED_BY(_mutex) = false;
};

}  // namespace skein
