#include "extension/operations/TagData.h"

#include <string>
#include <vector>

#include "platform/fileprovider/FPTags.h"
#include "support/NSError+VLFPAdditions.h"

namespace skein {

void setTagData(const ItemRequest& request, const std::optional<NSData>& tagData,
                const NSFileProviderItemIdentifier& forItemIdentifier,
                ItemCompletion completionHandler) {
  Log& log = request.log();
  const VLLogSection section(log, request.environment.logSections);
  VL_DEBUG(log, "[DEBUG] ┏%llx set tag data (%lu bytes) for %@", section.number(),
           tagData ? tagData->length() : 0, forItemIdentifier);
  std::vector<std::string> names;
  for (FPTag& tag : FPGetTagsFromTagsData(tagData)) names.push_back(std::move(tag.label));
  const NSURLPtr url = request.lookup->_URLForItemWithPersistentIdentifier(
      forItemIdentifier, /*resolvingVLAliases=*/true, /*attachPhysical=*/true);

  NSErrorPtr error;
  if (request.environment.fileOperations.vl_setTagNames(url, names, &error)) {
    // The slot goes on with what the write left in it.
    completeWithNewItemAtURL(*request.lookup, url, completionHandler, std::move(error));
    return;
  }
  VL_ERROR(log, "[ERROR] can't set tags for %@; %@", url, error);
  // Here alone a caller without a handler is provided for.
  if (completionHandler) completionHandler(nullptr, vl_fileProviderError(error));
}

}  // namespace skein
