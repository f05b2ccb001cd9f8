#include "services/VLSharingClient.h"

#include "services/VLSharingProxy.h"
#include "vellum/VLSharingServiceV1.h"

namespace skein {

std::string VLSharingClient::serviceName() const { return VLSharingServiceName; }

NSXPCInterface VLSharingClient::_exportedInterface() const { return getSharingServiceInterface(); }

std::shared_ptr<NSXPCExportedObject> VLSharingClient::_makeExportedObject() const {
  return std::make_shared<VLSharingProxy>(_fileProviderExtension, _itemIdentifier, _operationQueue,
                                          _environment);
}

void VLSharingClient::_logInvalidated(Log& log) const {
  VL_DEBUG(log, "[DEBUG] sharing service source connection invalidated");
}

void VLSharingClient::_logInterrupted(Log& log) const {
  VL_DEBUG(log, "[DEBUG] sharing service source connection interrupted");
}

}  // namespace skein
