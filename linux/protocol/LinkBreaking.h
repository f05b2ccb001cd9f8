#pragma once

#include <functional>

#include "platform/foundation/NSError.h"

namespace skein {

// What vald's own update senders are besides VLItemNotificationSender (ask with a
// dynamic_cast): they can break. A receiver that fell too far behind would cost memory
// without end, and one whose account logged out may hear no more; their link is broken
// instead, and the receiver lists its folder afresh.
class LinkBreaking {
 public:
  virtual ~LinkBreaking() = default;

  // `handler` runs once, on one of the executor's threads and under no lock, when vald
  // breaks the link; its error is of VLVellumErrorDomain and belongs to every error
  // handler of the client's proxies of this sender. When the link is broken already, it
  // is posted at once. It never runs after invalidate() and nothing is pushed after it.
  // Replaces the handler set before; the sender holds it until it ran or the sender ended.
  virtual void setLinkBrokenHandler(std::function<void(NSErrorPtr)> handler) = 0;
};

}  // namespace skein
