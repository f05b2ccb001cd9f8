#pragma once

#include <functional>
#include <memory>

#include "linux/host/FileProviderHost.h"
#include "linux/protocol/ServiceEndpoints.h"

namespace skein {

// What client processes may ask of an item's services: the host finds the item, the
// extension offers what it offers. Every request is answered by the deadline.
//
// An endpoint holds its service source, as nothing else does, and binds what goes through
// it to the item: a share that a client sends is taken for that item's, whatever it was
// made of. An item that is not there, and a caller that is not logged in, are told by the
// item's lookup.
class ServiceRequests final : public HostServices,
                              public std::enable_shared_from_this<ServiceRequests> {
 public:
  // Answers the identifier that a target names; see DriveRequests.
  using FindIdentifier = std::function<void(HostTarget, Reply<std::string, NSErrorPtr>)>;

  ServiceRequests(std::shared_ptr<FileProviderHost> host, FindIdentifier findIdentifier)
      : _host(std::move(host)), _findIdentifier(std::move(findIdentifier)) {}

  void serviceSources(HostTarget target,
                      Reply<std::vector<std::string>, NSErrorPtr> reply) override;
  void endpoint(HostTarget target, std::string serviceName,
                Reply<std::shared_ptr<ServiceEndpoint>, NSErrorPtr> reply) override;

 private:
  using Sources = NSFileProviderServiceSources;
  // The item's identifier and what the extension offers for it.
  void findSources(HostTarget target, Reply<std::string, Sources, NSErrorPtr> reply);

  const std::shared_ptr<FileProviderHost> _host;
  const FindIdentifier _findIdentifier;
};

}  // namespace skein
