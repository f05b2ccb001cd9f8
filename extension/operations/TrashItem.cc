#include "extension/operations/TrashItem.h"

namespace skein {

void trashItemWithIdentifier(const ItemRequest& request,
                             const NSFileProviderItemIdentifier& identifier,
                             ItemCompletion completionHandler) {
  Log& log = request.log();
  const VLLogSection section(log, request.environment.logSections);
  VL_DEBUG(log, "[DEBUG] ┏%llx trashing item %@", section.number(), identifier);
  const NSURLPtr url = request.lookup->_URLForItemWithPersistentIdentifier(
      identifier, /*resolvingVLAliases=*/false, /*attachPhysical=*/true);
  if (!url) {
    completeAsNonExistent(completionHandler, identifier);
    return;
  }

  NSURLPtr coordinatedURL;
  NSErrorPtr error;
  // Has run when the call returns.
  request.environment.fileOperations.fp_coordinatedDeleteWithHandler(
      url, [&](const NSURLPtr& coordinated, const NSErrorPtr& failure) {
        if (failure) {
          VL_DEBUG(log, "[DEBUG] failed to coordinate the deletion: %@", failure);
          error = failure;
        } else {
          coordinatedURL = coordinated;
        }
      });
  if (error) {
    completionHandler(nullptr, error);
    return;
  }

  VL_DEBUG(request.environment.fileProviderLog, "[DEBUG] trashing %@", coordinatedURL);
  NSURLPtr resultingURL;
  // The URL and the error say how it went; what is returned besides is not asked.
  request.environment.fileManager.vl_trashItemAtURL(coordinatedURL, &resultingURL, &error);
  NSFileProviderItemPtr item;
  if (resultingURL && !error) {
    item = request.lookup->_propertiesForNewItemAtURL(resultingURL, &error);
  }
  completionHandler(std::move(item), error);
}

}  // namespace skein
