#include "services/VLFileProviderQuireCollaborationServiceSource.h"

#include "services/VLFileProviderQuireCollaborationProxy.h"

namespace skein {

std::string VLFileProviderQuireCollaborationServiceSource::serviceName() const {
  return VLQuireCollaborationServiceName;
}

NSXPCInterface VLFileProviderQuireCollaborationServiceSource::_exportedInterface() const {
  return NSXPCInterface::interfaceWithProtocol(VLQuireCollaborationProtocolName);
}

std::shared_ptr<NSXPCExportedObject>
VLFileProviderQuireCollaborationServiceSource::_makeExportedObject() const {
  return std::make_shared<VLFileProviderQuireCollaborationProxy>(
      _fileProviderExtension, _itemIdentifier, _operationQueue, _environment);
}

void VLFileProviderQuireCollaborationServiceSource::_logInvalidated(Log& log) const {
  VL_DEBUG(log, "[DEBUG] collaboration service source connection invalidated");
}

void VLFileProviderQuireCollaborationServiceSource::_logInterrupted(Log& log) const {
  VL_DEBUG(log, "[DEBUG] collaboration service source connection interrupted");
}

}  // namespace skein
