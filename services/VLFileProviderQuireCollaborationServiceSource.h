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
  NSXPCInterface _exportedInterface() const override;
  std::shared_ptr<NSXPCExportedObject> _makeExportedObject() const override;
  void _logInvalidated(Log& log) const override;
  void _logInterrupted(Log& log) const override;
};

}  // namespace skein
