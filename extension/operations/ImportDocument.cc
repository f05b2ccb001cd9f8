#include "extension/operations/ImportDocument.h"

#include "extension/ItemIdentity.h"

namespace skein {

void importDocumentAtURL(const ItemRequest& request, const NSURLPtr& url,
                         const NSFileProviderItemIdentifier& toParentItemIdentifier,
                         ItemCompletion completionHandler) {
  Log& log = request.log();
  // Resolved ahead of the section, whose first line shows the folder itself.
  const NSURLPtr folder =
      request.lookup->URLForItemWithPersistentIdentifier(toParentItemIdentifier);
  const VLLogSection section(log, request.environment.logSections);
  VL_DEBUG(log, "[DEBUG] ┏%llx importing document at %@ to %@", section.number(), url, folder);
  if (!folder) {
    completeAsNonExistent(completionHandler, toParentItemIdentifier);
    return;
  }

  request.environment.fileOperations.fp_importUnderFolder(
      url, folder,
      [&log, lookup = request.lookup, completionHandler = std::move(completionHandler)](
          const NSURLPtr& newURL, const NSErrorPtr& error) mutable {
        VL_DEBUG(log, "[DEBUG] got new URL %@; %@", newURL, error);
        if (const NSErrorPtr refusal = fileProviderErrorFromFSError(error, *lookup)) {
          completionHandler(nullptr, refusal);
          return;
        }
        NSErrorPtr lookupError;
        const NSFileProviderItemPtr item = lookup->_propertiesForNewItemAtURL(newURL, &lookupError);
        if (!item) {
          VL_DEBUG(log, "[DEBUG] couldn't find item after importing it: %@", lookupError);
        }
        completionHandler(item, nullptr);
      });
}

}  // namespace skein
