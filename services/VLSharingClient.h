#pragma once

#include "services/ServiceSource.h"

namespace skein {

// Offers the sharing service of one item: a VLSharingProxy for each connection.
class VLSharingClient final : public ServiceSource {
 public:
  using ServiceSource::ServiceSource;

  std::string serviceName() const override;

 protected:
  NSXPCInterface _exportedInterface() const override;
  std::shared_ptr<NSXPCExportedObject> _makeExportedObject() const override;
  void _logInvalidated(Log& log) const override;
  void _logInterrupted(Log& log) const override;
};

}  // namespace skein
