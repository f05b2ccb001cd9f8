#include "extension/operations/FavoriteRank.h"

namespace skein {

void setFavoriteRank(const ItemRequest& request, std::optional<std::int64_t> rank,
                     const NSFileProviderItemIdentifier& forItemIdentifier,
                     ItemCompletion completionHandler) {
  Log& log = request.log();
  const VLLogSection section(log, request.environment.logSections);
  VL_DEBUG(log, "[DEBUG] ┏%llx set favorite rank %@ for %@", section.number(), rank,
           forItemIdentifier);
  const NSURLPtr url = request.lookup->_URLForItemWithPersistentIdentifier(
      forItemIdentifier, /*resolvingVLAliases=*/false, /*attachPhysical=*/true);
  request.environment.fileManager.vl_setFavoriteRank(rank, url);
  completeWithNewItemAtURL(*request.lookup, url, completionHandler);
}

}  // namespace skein
