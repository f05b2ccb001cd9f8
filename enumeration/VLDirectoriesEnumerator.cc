#include "enumeration/VLDirectoriesEnumerator.h"

#include <utility>

#include "support/NSData+Additions.h"
#include "support/NSError+VLFPAdditions.h"

namespace skein {
namespace {

constexpr std::uint64_t kFoldersPerPage = 200;

}  // namespace

void VLDirectoriesEnumerator::enumerateItemsForObserver(
    std::shared_ptr<NSFileProviderEnumerationObserver> observer,
    std::optional<NSFileProviderPage> startingAtPage) {
  const std::uint8_t sortOrder = vl_pageTokenSortOrder(startingAtPage);
  // A failed connection is told as it is, untranslated: it is no answer of the daemon's.
  const auto daemon = _environment.daemonConnection.remoteObjectProxyWithErrorHandler(
      [observer](NSErrorPtr error) { observer->finishEnumeratingWithError(std::move(error)); });
  daemon->enumerateAllFoldersWithSortOrder(
      sortOrder, vl_pageTokenOffset(startingAtPage), kFoldersPerPage,
      [&log = _environment.log, observer, sortOrder](
          const NSFileProviderItems& items, std::uint64_t nextOffset, const NSErrorPtr& error) {
        if (error) {
          VL_ERROR(log, "[ERROR] there was an error when listing items: %@", error);
          observer->finishEnumeratingWithError(vl_fileProviderError(error));
          return;
        }
        observer->didEnumerateItems(items);
        observer->finishEnumeratingUpToPage(vl_pageTokenFromSortOrder(sortOrder, nextOffset));
      });
}

}  // namespace skein
