#include "vellum/VLDaemonConnection.h"

namespace skein {

void VLDaemon::getContainerURLForID(
    const std::string& containerID, bool /*recreateDocumentsIfNeeded*/,
    Reply<NSURLPtr, std::optional<std::string>, bool, NSErrorPtr> reply) {
  reply(nullptr, std::nullopt, false,
        NSError::errorWithDomain(
            NSCocoaErrorDomain, NSFeatureUnsupportedError,
            {{NSLocalizedDescriptionKey,
              "This vald offers no lookup of a container's folder (" + containerID + ")."}}));
}

}  // namespace skein
