#include "extension/operations/DefaultApplicationContainer.h"

#include <set>
#include <vector>

#include "extension/operations/CreateDirectory.h"
#include "support/NSError+VLFPAdditions.h"
#include "vellum/VLEntitlements.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

constexpr char kFilesApp[] = "com.tessel.Binder";

std::vector<std::string> entitledContainers(const LSBundleProxy& bundle) {
  const std::set<std::string> keys = {
      VLApplicationIdentifierEntitlement, VLSkeinServicesEntitlement,
      VLSkeinContainerIdentifiersEntitlement, VLUbiquityContainerIdentifiersEntitlement};
  return VLEntitledContainerIdentifiers(bundle.entitlementValuesForKeys(keys));
}

// Asks vald where the container is, and answers with that folder's item.
void completeWithContainer(const ItemRequest& request, const std::string& containerID,
                           ItemCompletion completionHandler) {
  // Either the reply or the connection's failure answers.
  const auto completion = std::move(completionHandler).share();
  const auto daemon = request.environment.daemonConnection.remoteObjectProxyWithErrorHandler(
      [completion](const NSErrorPtr& error) {
        (*completion)(nullptr, vl_fileProviderError(error));
      });
  daemon->getContainerURLForID(
      containerID, /*recreateDocumentsIfNeeded=*/true,
      [lookup = request.lookup, completion](const NSURLPtr& url,
                                            const std::optional<std::string>& /*displayName*/,
                                            bool /*recreated*/, const NSErrorPtr& error) {
        if (error) {
          (*completion)(nullptr, vl_fileProviderError(error));
          return;
        }
        // An existing item: the daemon has just looked at it.
        NSErrorPtr lookupError;
        NSFileProviderItemPtr item = lookup->_propertiesForItemAtURL(url, &lookupError);
        (*completion)(std::move(item), std::move(lookupError));
      });
}

}  // namespace

void _defaultApplicationContainerForBundleIdentifier(
    const ItemRequest& request, const std::optional<std::string>& bundleIdentifier,
    ItemCompletion completionHandler) {
  Log& log = request.log();
  const VLLogSection section(log, request.environment.logSections);
  VL_DEBUG(log, "[DEBUG] ┏%llx lookup for default location of %@", section.number(),
           bundleIdentifier);
  if (!bundleIdentifier || *bundleIdentifier == kFilesApp) {
    VL_DEBUG(log, "[DEBUG] creating default Documents folder");
    createDirectoryWithName(request, VLUbiquitousDocumentsFolderName,
                            NSFileProviderRootContainerItemIdentifier,
                            std::move(completionHandler));
    return;
  }

  const auto bundle = request.environment.bundles.bundleProxyForIdentifier(*bundleIdentifier);
  if (!bundle) {
    VL_ERROR(log, "[ERROR] can't find bundle with id '%@'", bundleIdentifier);
    completionHandler(nullptr, vl_fileProviderError(vlc_errorInvalidParameter("bundleIdentifier",
                                                                              *bundleIdentifier)));
    return;
  }
  const std::vector<std::string> containerIDs = entitledContainers(*bundle);
  if (containerIDs.empty()) {
    // An app may well have nothing to do with the drive, so this is no error to the log.
    VL_DEBUG(log, "[DEBUG] bundle '%@' is not entitled to used Skein Drive", bundleIdentifier);
    completionHandler(nullptr, vl_fileProviderError(NSError::errorWithDomain(
                                   VLVellumErrorDomain, VLVellumErrorNotEntitled)));
    return;
  }
  completeWithContainer(request, containerIDs.front(), std::move(completionHandler));
}

}  // namespace skein
