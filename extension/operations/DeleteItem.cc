#include "extension/operations/DeleteItem.h"

#include "support/NSError+VLFPAdditions.h"

namespace skein {
namespace {

bool isNoSuchFile(const NSErrorPtr& error) {
  return error && error->domain() == NSCocoaErrorDomain && error->code() == NSFileNoSuchFileError;
}

}  // namespace

void deleteItemWithIdentifier(const ItemRequest& request,
                              const NSFileProviderItemIdentifier& identifier,
                              ErrorCompletion completionHandler) {
  Log& log = request.log();
  VLFileOperations& fileOperations = request.environment.fileOperations;
  const VLLogSection section(log, request.environment.logSections);
  VL_DEBUG(log, "[DEBUG] ┏%llx deleting item %@", section.number(), identifier);
  const NSURLPtr url = request.lookup->_URLForItemWithPersistentIdentifier(
      identifier, /*resolvingVLAliases=*/false, /*attachPhysical=*/true);
  if (!url) {
    completionHandler(fileProviderErrorForNonExistentItemWithIdentifier(identifier));
    return;
  }

  fileOperations.fp_deleteWithCompletionHandler(
      url, [&log, &fileOperations, url,
            completionHandler = std::move(completionHandler)](const NSErrorPtr& error) mutable {
        if (isNoSuchFile(error)) {
          // Without one there is nothing to send the retry to, and the first error stands.
          if (const NSURLPtr physicalURL = fileOperations.vl_physicalURL(url)) {
            VL_DEBUG(log, "[DEBUG] couldn't delete %@, retrying with physical url %@", url,
                     physicalURL);
            fileOperations.fp_deleteWithCompletionHandler(
                physicalURL, [completionHandler = std::move(completionHandler)](
                                 const NSErrorPtr& retryError) mutable {
                  completionHandler(vl_fileProviderError(retryError));
                });
            return;
          }
        }
        completionHandler(vl_fileProviderError(error));
      });
}

}  // namespace skein
