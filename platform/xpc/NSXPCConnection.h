#pragma once

#include <functional>
#include <memory>
#include <string>

namespace skein {

// An object that a connection may export; which protocol it speaks the interface says.
class NSXPCExportedObject {
 public:
  virtual ~NSXPCExportedObject() = default;
};

// Which protocol an exported object speaks.
struct NSXPCInterface {
  std::string protocolName;

  static NSXPCInterface interfaceWithProtocol(std::string protocolName) {
    return {std::move(protocolName)};
  }
};

// One client process's way to one exported object. It is given to a listener's delegate,
// which configures it before it resumes it. Any thread; handlers run on a thread of the
// transport's, one at a time and each at most once, and are dropped after the last.
class NSXPCConnection {
 public:
  virtual ~NSXPCConnection() = default;

  virtual void setExportedInterface(NSXPCInterface interface) = 0;
  // The connection owns it until it is invalidated.
  virtual void setExportedObject(std::shared_ptr<NSXPCExportedObject> object) = 0;

  // Runs when the connection is of no more use: invalidate() was called, or the client
  // closed it. Then the exported object is let go of.
  virtual void setInvalidationHandler(std::function<void()> handler) = 0;
  // Runs when the client is gone without having closed it. The connection lives on, for
  // nothing: nobody comes back to it.
  virtual void setInterruptionHandler(std::function<void()> handler) = 0;

  // From now on the client's messages reach the exported object.
  virtual void resume() = 0;
  // Ends it; idempotent. No further message reaches the exported object.
  virtual void invalidate() = 0;
};

}  // namespace skein
