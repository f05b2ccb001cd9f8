#include "enumeration/EnumeratorSelection.h"

#include "enumeration/VLDirectoriesEnumerator.h"
#include "enumeration/VLFileEnumerator.h"
#include "enumeration/VLWorkingSetEnumerator.h"
#include "platform/fileprovider/NSFileProviderError.h"
#include "support/ErrorLogging.h"

namespace skein {

std::shared_ptr<NSFileProviderEnumerator> enumeratorForContainerItemIdentifier(
    const NSFileProviderItemIdentifier& identifier, NSErrorOut error, VLItemLookup& lookup,
    Environment& environment) {
  Log& log = environment.log;
  const VLLogSection section(log, environment.logSections);
  VL_DEBUG(log, "[DEBUG] ┏%llx enumerator for %@", section.number(), identifier);

  if (!lookup._isLoggedInOrError(error)) return nullptr;
  if (identifier == NSFileProviderWorkingSetContainerItemIdentifier) {
    return std::make_shared<VLWorkingSetEnumerator>(environment);
  }
  if (identifier == NSFileProviderAllDirectoriesContainerItemIdentifier) {
    return std::make_shared<VLDirectoriesEnumerator>(environment);
  }
  // The root has no identifier of its own with the daemon: nil names it. An identifier
  // that does not parse is nil too, and the URL alone decides about it.
  std::optional<VLFileObjectID> fileObjectID;
  if (identifier != NSFileProviderRootContainerItemIdentifier) {
    fileObjectID = VLFileObjectID::fileObjectIDWithString(identifier);
  }
  if (NSURLPtr url = lookup.URLForItemWithPersistentIdentifier(identifier)) {
    return VLFileEnumerator::initWithFileObjectID(fileObjectID, std::move(url), identifier,
                                                  /*recursive=*/false, environment);
  }
  vl_reportError(log, "-[VLFileProviderExtension enumeratorForContainerItemIdentifier:error:]",
                 error, fileProviderErrorForNonExistentItemWithIdentifier(identifier));
  return nullptr;
}

}  // namespace skein
