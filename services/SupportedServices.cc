#include "services/SupportedServices.h"

#include "services/VLFileProviderQuireCollaborationServiceSource.h"
#include "services/VLSharingClient.h"
#include "vellum/VLDaemonSyncProxy.h"

namespace skein {
namespace {

// A read that fails stands for NO: better a service that then answers with an error than
// none for a document that may well be shared.
bool isAliasFile(const ServiceItem& item) {
  Log& log = item.environment.log;
  const NSURLPtr url =
      item.fileProviderExtension->URLForItemWithPersistentIdentifier(item.itemIdentifier);
  NSErrorPtr error;
  const std::optional<bool> isAlias =
      url ? item.environment.resourceValues.getPromisedItemResourceValue(url, NSURLIsAliasFileKey,
                                                                         &error)
          : std::nullopt;
  if (!isAlias) {
    VL_ERROR(log, "[ERROR] Failed to get alias file key at %@ - %@", url, error);
    return false;
  }
  if (*isAlias) {
    VL_DEBUG(log, "[DEBUG] Not allowing sharing of %@ because it's a rover bookmark", url);
  }
  return *isAlias;
}

// An error, a lost connection too, stands for NO.
bool isShareable(const ServiceItem& item) {
  const auto objectID = VLFileObjectID::fileObjectIDWithString(item.itemIdentifier);
  VLDaemonSyncProxy<> proxy(item.environment.daemonConnection, item.environment.executor);
  proxy->checkIfItemIsShareableWithInode(
      objectID ? objectID->rawID() : 0,
      [answer = proxy.answer()](bool isShareable, NSErrorPtr error) {
        answer->setBoolResult(isShareable, std::move(error));
      });
  return proxy.result().value_or(false);
}

}  // namespace

NSFileProviderServiceSources supportedServiceSourcesForItemIdentifier(
    const NSFileProviderItemIdentifier& identifier,
    const std::shared_ptr<VLItemLookup>& fileProviderExtension,
    const std::shared_ptr<NSOperationQueue>& operationQueue, Environment& environment) {
  const ServiceItem item{fileProviderExtension, identifier, operationQueue, environment};
  NSFileProviderServiceSources sources;
  // The reserved identifiers begin with neither letter.
  if (identifier.starts_with('d')) {
    if (isAliasFile(item)) return sources;
    sources.push_back(std::make_shared<VLFileProviderQuireCollaborationServiceSource>(item));
    sources.push_back(std::make_shared<VLSharingClient>(item));
  } else if (identifier.starts_with('i')) {
    if (isShareable(item)) sources.push_back(std::make_shared<VLSharingClient>(item));
  }
  return sources;
}

}  // namespace skein
