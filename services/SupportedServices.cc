#include "services/SupportedServices.h"

#include "services/VLFileProviderQuireCollaborationServiceSource.h"
#include "services/VLSharingClient.h"
#include "vellum/VLDaemonSyncProxy.h"

namespace skein {
namespace {

// A read that fails stands for NO: better a service that then answers with an error than
// none for a document that may well be shared.
bool isAliasFile(const NSFileProviderItemIdentifier& identifier,
                 VLItemLookup& fileProviderExtension, Environment& environment) {
  Log& log = environment.log;
  const NSURLPtr url = fileProviderExtension.URLForItemWithPersistentIdentifier(identifier);
  NSErrorPtr error;
  const std::optional<bool> isAlias = url ? environment.resourceValues.getPromisedItemResourceValue(
                                                url, NSURLIsAliasFileKey, &error)
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
bool isShareable(const NSFileProviderItemIdentifier& identifier, Environment& environment) {
  const auto objectID = VLFileObjectID::fileObjectIDWithString(identifier);
  VLDaemonSyncProxy<> proxy(environment.daemonConnection, environment.executor);
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
  NSFileProviderServiceSources sources;
  const auto sharing = [&] {
    return std::make_shared<VLSharingClient>(fileProviderExtension, identifier, operationQueue,
                                             environment);
  };
  // The reserved identifiers begin with neither letter.
  if (identifier.starts_with('d')) {
    if (isAliasFile(identifier, *fileProviderExtension, environment)) return sources;
    sources.push_back(std::make_shared<VLFileProviderQuireCollaborationServiceSource>(
        fileProviderExtension, identifier, operationQueue, environment));
    sources.push_back(sharing());
  } else if (identifier.starts_with('i')) {
    if (isShareable(identifier, environment)) sources.push_back(sharing());
  }
  return sources;
}

}  // namespace skein
