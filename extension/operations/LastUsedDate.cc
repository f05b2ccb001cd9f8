#include "extension/operations/LastUsedDate.h"

namespace skein {

void setLastUsedDate(const ItemRequest& request, std::optional<NSDate> date,
                     const NSFileProviderItemIdentifier& forItemIdentifier,
                     ItemCompletion completionHandler) {
  Log& log = request.log();
  const VLLogSection section(log, request.environment.logSections);
  VL_DEBUG(log, "[DEBUG] ┏%llx set last used date %@ for %@", section.number(), date,
           forItemIdentifier);
  // No physical property, unlike for the favourite rank: the date is the logical item's.
  const NSURLPtr url = request.lookup->_URLForItemWithPersistentIdentifier(
      forItemIdentifier, /*resolvingVLAliases=*/false);
  request.environment.fileManager.vl_setLastOpenDate(date, url);
  completeWithNewItemAtURL(*request.lookup, url, completionHandler);
}

}  // namespace skein
