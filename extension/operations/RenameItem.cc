#include "extension/operations/RenameItem.h"

#include "extension/ItemIdentity.h"
#include "support/NSError+VLFPAdditions.h"

namespace skein {

void renameItemWithIdentifier(const ItemRequest& request,
                              const NSFileProviderItemIdentifier& identifier,
                              const std::string& toName, ItemCompletion completionHandler) {
  Log& log = request.log();
  const VLLogSection section(log, request.environment.logSections);
  VL_DEBUG(log, "[DEBUG] ┏%llx renaming %@ to %@", section.number(), identifier, toName);
  const NSURLPtr url = request.lookup->_URLForItemWithPersistentIdentifier(
      identifier, /*resolvingVLAliases=*/true, /*attachPhysical=*/true);
  VL_DEBUG(log, "[DEBUG] source URL: %@", url);
  if (!url) {
    completeAsNonExistent(completionHandler, identifier);
    return;
  }

  request.environment.fileOperations.fp_renameWithNewName(
      url, toName,
      [&log, lookup = request.lookup, completionHandler = std::move(completionHandler)](
          const NSURLPtr& newURL, const NSErrorPtr& error) mutable {
        VL_DEBUG(log, "[DEBUG] got new URL %@; %@", newURL, error);
        if (const NSErrorPtr refusal = fileProviderErrorFromFSError(error, *lookup)) {
          completionHandler(nullptr, vl_fileProviderError(refusal));
          return;
        }
        completeWithNewItemAtURL(*lookup, newURL, completionHandler);
      });
}

}  // namespace skein
