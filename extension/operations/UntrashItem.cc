#include "extension/operations/UntrashItem.h"

#include "extension/ItemIdentity.h"
#include "support/NSError+VLFPAdditions.h"

namespace skein {
namespace {

// The folder that the trashed item at `url` was in, while there still is one.
NSURLPtr putBackFolder(const ItemRequest& request, const NSURLPtr& url) {
  const NSURLPtr putBackURL =
      request.environment.fileManager.vl_putBackURLForTrashedItemAtURL(url, nullptr);
  VL_DEBUG(request.log(), "[DEBUG] untrash with putback url: %@", putBackURL);
  if (!putBackURL) return nullptr;
  NSURLPtr folder = putBackURL->URLByDeletingLastPathComponent();
  if (!request.environment.fileOperations.checkResourceIsReachable(folder, nullptr)) return nullptr;
  return folder;
}

// Null when there is nowhere to go.
NSURLPtr destinationFolder(
    const ItemRequest& request, const NSURLPtr& url,
    const std::optional<NSFileProviderItemIdentifier>& toParentItemIdentifier) {
  if (toParentItemIdentifier) {
    if (NSURLPtr folder =
            request.lookup->URLForItemWithPersistentIdentifier(*toParentItemIdentifier)) {
      return folder;
    }
  }
  if (NSURLPtr folder = putBackFolder(request, url)) return folder;
  VL_DEBUG(request.log(), "[DEBUG] couldn't use putback url, fallback to default container");
  const auto container = request.environment.fileOperations.vl_vellumContainer(url);
  return container ? container->documentsURL() : nullptr;
}

}  // namespace

void untrashItemWithIdentifier(const ItemRequest& request,
                               const NSFileProviderItemIdentifier& identifier,
                               std::optional<NSFileProviderItemIdentifier> toParentItemIdentifier,
                               ItemCompletion completionHandler) {
  Log& log = request.log();
  const VLLogSection section(log, request.environment.logSections);
  VL_DEBUG(log, "[DEBUG] ┏%llx untrashing item %@", section.number(), identifier);
  const NSURLPtr url = request.lookup->_URLForItemWithPersistentIdentifier(
      identifier, /*resolvingVLAliases=*/false, /*attachPhysical=*/true);
  if (!url) {
    completeAsNonExistent(completionHandler, identifier);
    return;
  }
  VL_DEBUG(log, "[DEBUG] untrashing from url: %@", url);
  const NSURLPtr destination = destinationFolder(request, url, toParentItemIdentifier);
  if (!destination) {
    completeAsNonExistent(completionHandler, toParentItemIdentifier);
    return;
  }
  VL_DEBUG(log, "[DEBUG] untrashing item to %@", destination);

  request.environment.fileOperations.fp_reparentUnderFolder_allowBouncing(
      url, destination, /*allowBouncing=*/true,
      [&log, lookup = request.lookup, completionHandler = std::move(completionHandler)](
          const NSURLPtr& newURL, const NSErrorPtr& error) mutable {
        if (error) {
          VL_ERROR(log, "[ERROR] error untrashing item to %@: %@", newURL, error);
        } else {
          VL_DEBUG(log, "[DEBUG] item was untrashed to %@", newURL);
        }
        if (const NSErrorPtr refusal = fileProviderErrorFromFSError(error, *lookup)) {
          completionHandler(nullptr, vl_fileProviderError(refusal));
          return;
        }
        completeWithNewItemAtURL(*lookup, newURL, completionHandler);
      });
}

}  // namespace skein
