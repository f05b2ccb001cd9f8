#pragma once

#include "services/ServiceSource.h"

namespace skein {

// Offers the collaboration service of one document: a VLFileProviderQuireCollaborationProxy
// for each connection.
class VLFileProviderQuireCollaborationServiceSource final : public ServiceSource {
 public:
  using ServiceSource::ServiceSource;

  std::string serviceName() const override;

 protected:
  NSXPCInterface exportedInterface() const override;
  std::shared_ptr<NSXPCExportedObject> makeExportedObject(const ServiceItem& item) override;
  void logInvalidated(Log& log) const override;
  void logInterrupted(Log& log) const override;
};

}  // namespace skein
