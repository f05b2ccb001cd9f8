#include "enumeration/VLWorkingSetEnumerator.h"

#include <string_view>
#include <utility>

#include "platform/fileprovider/NSFileProviderError.h"
#include "support/NSError+VLFPAdditions.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

constexpr std::uint64_t kChangesPerBatch = 200;

// What the observer is told of a daemon's error. "Not authenticated" is told plainly, with
// no underlying error: the host only asks the person to log in.
NSErrorPtr observerError(const NSErrorPtr& error) {
  if (error->domain() == VLVellumErrorDomain && error->code() == VLVellumErrorNotAuthenticated) {
    return vl_fileProviderError(
        NSError::errorWithDomain(NSFileProviderErrorDomain, NSFileProviderErrorNotAuthenticated));
  }
  return vl_fileProviderError(error);
}

}  // namespace

const NSFileProviderSyncAnchor& VLWorkingSetEnumerator::initialSyncAnchor() {
  static const NSFileProviderSyncAnchor anchor{std::string_view("initialSyncAnchor")};
  return anchor;
}

void VLWorkingSetEnumerator::enumerateItemsForObserver(
    std::shared_ptr<NSFileProviderEnumerationObserver> observer,
    std::optional<NSFileProviderPage>) {
  // A failed connection is told as it is, untranslated: it is no answer of the daemon's.
  const auto daemon = _environment.daemonConnection.remoteObjectProxyWithErrorHandler(
      [observer](NSErrorPtr error) { observer->finishEnumeratingWithError(std::move(error)); });
  // Asked only to see that the daemon answers; its rank is not used.
  daemon->currentNotifRankWithReply(
      [observer, &manager = _environment.providerManager](std::uint64_t, const NSErrorPtr& error) {
        if (error) {
          observer->finishEnumeratingWithError(observerError(error));
          return;
        }
        // The end comes first: a signal during the listing would be taken for part of it.
        observer->finishEnumeratingUpToPage(std::nullopt);
        manager.signalEnumeratorForContainerItemIdentifier(
            NSFileProviderWorkingSetContainerItemIdentifier, [](const NSErrorPtr&) {});
      });
}

void VLWorkingSetEnumerator::enumerateChangesForObserver(
    std::shared_ptr<NSFileProviderChangeObserver> observer,
    std::optional<NSFileProviderSyncAnchor> fromSyncAnchor) {
  const auto daemon = _environment.daemonConnection.remoteObjectProxyWithErrorHandler(
      [observer](NSErrorPtr error) { observer->finishEnumeratingWithError(std::move(error)); });
  const std::optional<NSData> changeToken =
      fromSyncAnchor == initialSyncAnchor() ? std::nullopt : fromSyncAnchor;
  daemon->enumerateWorkingSetChangesFromChangeToken(
      changeToken, kChangesPerBatch,
      [observer, fromSyncAnchor](const NSFileProviderItems& updated,
                                 const std::vector<VLFileObjectID>& deleted,
                                 const std::optional<NSData>& newToken, const NSErrorPtr& error) {
        if (error) {
          observer->finishEnumeratingWithError(observerError(error));
          return;
        }
        std::vector<NSFileProviderItemIdentifier> identifiers;
        identifiers.reserve(deleted.size());
        for (const VLFileObjectID& id : deleted) identifiers.push_back(id.asString());
        observer->didUpdateItems(updated);
        observer->didDeleteItemsWithIdentifiers(identifiers);
        // Compared with the request's own anchor, so that the answer to the initial anchor
        // always promises more.
        observer->finishEnumeratingChangesUpToSyncAnchor(newToken.value_or(NSData()),
                                                         newToken != fromSyncAnchor);
      });
}

void VLWorkingSetEnumerator::currentSyncAnchorWithCompletionHandler(
    UniqueFunction<void(std::optional<NSFileProviderSyncAnchor>)> completionHandler) {
  if (completionHandler) completionHandler(initialSyncAnchor());
}

}  // namespace skein
