// vald's local cloud, as one connection sees it. Include this in few files: it costs seconds
// to compile.
#pragma once

#include <utility>

#include "linux/protocol/CloudCodec.h"
#include "linux/protocol/DaemonService.h"

namespace skein {

// The part of vald's object that has to do with the cloud. Lives on the loop's thread.
class CloudObject : public virtual wire::Cloud::Server {
 public:
  explicit CloudObject(DaemonServicePtr service) : _service(std::move(service)) {}

  kj::Promise<void> setConditions(SetConditionsContext context) override;
  kj::Promise<void> cloudStatus(CloudStatusContext context) override;
  kj::Promise<void> setKeeping(SetKeepingContext context) override;
  kj::Promise<void> collect(CollectContext context) override;
  kj::Promise<void> verify(VerifyContext context) override;

 private:
  LocalCloud& cloud() const { return _service->server->daemon->cloud(); }

  const DaemonServicePtr _service;
};

}  // namespace skein
