#include "extension/operations/ReparentItem.h"

#include <cstdint>

#include "extension/ItemIdentity.h"
#include "support/NSError+VLFPAdditions.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

// The bits of a move's capabilities that allow it, any of them.
constexpr std::uint64_t kAllowingBits = 0x15f9;
constexpr int kPermissionDenied = 13;

NSErrorPtr invalidMove() {
  return NSError::errorWithDomain(
      NSCocoaErrorDomain, NSFileWriteUnknownError,
      {{NSUnderlyingErrorKey,
        vl_errorWithPOSIXCode(kPermissionDenied, "The move between those locations is invalid")}});
}

}  // namespace

void reparentItemWithIdentifier(const ItemRequest& request,
                                const NSFileProviderItemIdentifier& identifier,
                                const NSFileProviderItemIdentifier& toParentItemWithIdentifier,
                                std::optional<std::string> newName,
                                ItemCompletion completionHandler) {
  Log& log = request.log();
  VLFileOperations& fileOperations = request.environment.fileOperations;
  const VLLogSection section(log, request.environment.logSections);
  VL_DEBUG(log, "[DEBUG] ┏%llx reparenting %@ under %@", section.number(), identifier,
           toParentItemWithIdentifier);
  const NSURLPtr url = request.lookup->_URLForItemWithPersistentIdentifier(
      identifier, /*resolvingVLAliases=*/false, /*attachPhysical=*/true);
  if (!url) {
    completeAsNonExistent(completionHandler, identifier);
    return;
  }
  const NSURLPtr folder =
      request.lookup->URLForItemWithPersistentIdentifier(toParentItemWithIdentifier);
  if (!folder) {
    completeAsNonExistent(completionHandler, toParentItemWithIdentifier);
    return;
  }
  VL_DEBUG(log, "[DEBUG] reparenting url %@ under %@", url, folder);

  // The move is judged under the name that the item has: a new name is the file system's
  // to refuse.
  const NSURLPtr prospectiveURL = folder->URLByAppendingPathComponent(url->lastPathComponent());
  NSErrorPtr error;
  const std::uint64_t capability =
      fileOperations.vl_capabilityToMoveToURL(url, prospectiveURL, &error);
  if ((capability & kAllowingBits) == 0) {
    if (!error) error = invalidMove();
    VL_ERROR(log, "[ERROR] can't move %@ to %@; %@", url, folder, error);
    completionHandler(nullptr, vl_fileProviderError(error));
    return;
  }

  // The check's error goes along: one that came with a move that is allowed all the same
  // stays in the slot of the lookup at the end.
  fileOperations.fp_reparentUnderFolder_withNewName(
      url, folder, std::move(newName),
      [&log, lookup = request.lookup, checkError = std::move(error),
       completionHandler = std::move(completionHandler)](const NSURLPtr& newURL,
                                                         const NSErrorPtr& moveError) mutable {
        VL_DEBUG(log, "[DEBUG] got new URL %@; %@", newURL, moveError);
        if (const NSErrorPtr refusal = fileProviderErrorFromFSError(moveError, *lookup)) {
          completionHandler(nullptr, vl_fileProviderError(refusal));
          return;
        }
        completeWithNewItemAtURL(*lookup, newURL, completionHandler, std::move(checkError));
      });
}

}  // namespace skein
