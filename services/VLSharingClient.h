#pragma once

#include "services/ServiceSource.h"

namespace skein {

// Offers the sharing service of one item: a VLSharingProxy for each connection.
class VLSharingClient final : public ServiceSource {
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
