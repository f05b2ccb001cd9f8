#include "services/VLSharingClient.h"

#include "services/VLSharingProxy.h"
#include "vellum/VLSharingServiceV1.h"

namespace skein {

std::string VLSharingClient::serviceName() const { return VLSharingServiceName; }

NSXPCInterface VLSharingClient::exportedInterface() const { return getSharingServiceInterface(); }

std::shared_ptr<NSXPCExportedObject> VLSharingClient::makeExportedObject(const ServiceItem& item) {
  return std::make_shared<VLSharingProxy>(item);
}

void VLSharingClient::logInvalidated(Log& log) const {
  VL_DEBUG(log, "[DEBUG] sharing service source connection invalidated");
}

void VLSharingClient::logInterrupted(Log& log) const {
  VL_DEBUG(log, "[DEBUG] sharing service source connection interrupted");
}

}  // namespace skein
