#pragma once

#include <memory>

#include "platform/xpc/NSXPCConnection.h"

namespace skein {

class NSXPCListener;

// A reference that a client process connects to, and through which it reaches one
// exported object and nothing else. What it holds is the transport's; it does not keep its
// listener.
class NSXPCListenerEndpoint {
 public:
  virtual ~NSXPCListenerEndpoint() = default;
};

class NSXPCListenerDelegate {
 public:
  virtual ~NSXPCListenerDelegate() = default;

  // listener:shouldAcceptNewConnection: called on a thread of the transport's, for several
  // connections at once. NO refuses it.
  virtual bool listener_shouldAcceptNewConnection(
      const std::shared_ptr<NSXPCListener>& listener,
      const std::shared_ptr<NSXPCConnection>& newConnection) = 0;
};

// Takes the connections that come to its endpoint, from resume() until invalidate() or the
// end of its last reference; connections that were accepted live on. Any thread.
class NSXPCListener {
 public:
  virtual ~NSXPCListener() = default;

  // Held weakly; without one every connection is refused.
  virtual void setDelegate(std::weak_ptr<NSXPCListenerDelegate> delegate) = 0;
  virtual std::shared_ptr<NSXPCListenerEndpoint> endpoint() = 0;
  virtual void resume() = 0;
  virtual void invalidate() = 0;
};

// The listener class's own method.
class NSXPCListeners {
 public:
  virtual ~NSXPCListeners() = default;
  // A listener that only the holders of its endpoint can reach. Never null.
  virtual std::shared_ptr<NSXPCListener> anonymousListener() = 0;
};

}  // namespace skein
