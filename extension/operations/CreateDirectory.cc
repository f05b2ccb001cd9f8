#include "extension/operations/CreateDirectory.h"

#include "extension/ItemIdentity.h"

namespace skein {

void createDirectoryWithName(const ItemRequest& request, const std::string& name,
                             const NSFileProviderItemIdentifier& inParentItemIdentifier,
                             ItemCompletion completionHandler) {
  Log& log = request.log();
  const VLLogSection section(log, request.environment.logSections);
  VL_DEBUG(log, "[DEBUG] ┏%llx creating directory %@ under %@", section.number(), name,
           inParentItemIdentifier);
  const NSURLPtr parent =
      request.lookup->URLForItemWithPersistentIdentifier(inParentItemIdentifier);
  if (!parent) {
    completeAsNonExistent(completionHandler, inParentItemIdentifier);
    return;
  }

  request.environment.fileOperations.fp_createSubFolder(
      parent, name,
      [&log, lookup = request.lookup, completionHandler = std::move(completionHandler)](
          const NSURLPtr& newURL, const NSErrorPtr& error) mutable {
        VL_DEBUG(log, "[DEBUG] got new URL %@; %@", newURL, error);
        if (const NSErrorPtr refusal = fileProviderErrorFromFSError(error, *lookup)) {
          completionHandler(nullptr, refusal);
          return;
        }
        completeWithNewItemAtURL(*lookup, newURL, completionHandler);
      });
}

}  // namespace skein
