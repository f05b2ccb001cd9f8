#include "services/VLFileProviderQuireCollaborationServiceSource.h"

#include "services/VLFileProviderQuireCollaborationProxy.h"

namespace skein {

std::string VLFileProviderQuireCollaborationServiceSource::serviceName() const {
  return VLQuireCollaborationServiceName;
}

NSXPCInterface VLFileProviderQuireCollaborationServiceSource::exportedInterface() const {
  return NSXPCInterface::interfaceWithProtocol(VLQuireCollaborationProtocolName);
}

std::shared_ptr<NSXPCExportedObject>
VLFileProviderQuireCollaborationServiceSource::makeExportedObject(const ServiceItem& item) {
  return std::make_shared<VLFileProviderQuireCollaborationProxy>(item);
}

void VLFileProviderQuireCollaborationServiceSource::logInvalidated(Log& log) const {
  VL_DEBUG(log, "[DEBUG] collaboration service source connection invalidated");
}

void VLFileProviderQuireCollaborationServiceSource::logInterrupted(Log& log) const {
  VL_DEBUG(log, "[DEBUG] collaboration service source connection interrupted");
}

}  // namespace skein
