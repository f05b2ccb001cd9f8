// The services of an item as a client process reaches them. The same interfaces stand on
// both sides of the socket: skein-host implements them, the client's proxies do too.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "base/UniqueFunction.h"
#include "linux/protocol/HostTypes.h"
#include "vellum/VLFileProviderQuireCollaboration.h"
#include "vellum/VLSharingServiceV1.h"

namespace skein {

// A client's way to one exported object. It ends with close(). Letting go of it without
// that is what a dying client does, and tells the service so. Any thread.
class ServiceConnection {
 public:
  virtual ~ServiceConnection() = default;

  // What is exported: one of the two, the other is null; neither once it has ended. On the
  // client's side each reply comes once, on the executor; an ended connection replies
  // NSXPCConnectionInvalid, a lost one VLVellumErrorDaemonUnreachable. Progresses there are
  // never null, and cancelling one before the service has told of its own is remembered.
  virtual std::shared_ptr<VLSharingServiceV1> sharing() = 0;
  virtual std::shared_ptr<VLFileProviderQuireCollaboration> collaboration() = 0;

  // Idempotent. Requests under way are cancelled.
  virtual void close() = 0;
};

// One service of one item. Whoever holds it may connect, and reaches nothing else.
class ServiceEndpoint {
 public:
  virtual ~ServiceEndpoint() = default;
  // NSXPCConnectionInvalid once the listener behind it has ended.
  virtual void connect(Reply<std::shared_ptr<ServiceConnection>, NSErrorPtr> reply) = 0;
};

// Asynchronous: each reply runs once, on any thread but the caller's.
class HostServices {
 public:
  virtual ~HostServices() = default;

  // The names of what the item offers, in the extension's order; perhaps none.
  virtual void serviceSources(HostTarget target,
                              Reply<std::vector<std::string>, NSErrorPtr> reply) = 0;
  // A fresh endpoint. NSFeatureUnsupportedError when the item offers no such service.
  virtual void endpoint(HostTarget target, std::string serviceName,
                        Reply<std::shared_ptr<ServiceEndpoint>, NSErrorPtr> reply) = 0;
};

// NSXPCConnectionInvalid, for what is asked of a connection or an endpoint that has ended.
inline NSErrorPtr connectionHasEndedError() {
  return NSError::errorWithDomain(
      NSCocoaErrorDomain, NSXPCConnectionInvalid,
      {{NSLocalizedDescriptionKey,
        std::string("The connection to the item's service has ended. Ask for a new endpoint.")}});
}

}  // namespace skein
