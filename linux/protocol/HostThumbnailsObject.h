#pragma once

#include "linux/protocol/HostPeer.h"
#include "linux/protocol/hostthumbnails.capnp.h"

namespace skein {

// The host's thumbnails, as one connection sees them: a part of the host's object. Lives on
// the loop's thread.
class HostThumbnailsObject : public virtual wire::HostThumbnails::Server {
 public:
  explicit HostThumbnailsObject(HostPeerPtr peer) : _peer(std::move(peer)) {}

  kj::Promise<void> fetchThumbnails(FetchThumbnailsContext context) override;

 private:
  const HostPeerPtr _peer;
};

}  // namespace skein
