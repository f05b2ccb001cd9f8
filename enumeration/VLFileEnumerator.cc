// Construction and listing; change tracking is in VLFileEnumerator+Changes.cc.
#include "enumeration/VLFileEnumerator.h"

#include <utility>

#include "support/NSData+Additions.h"
#include "support/NSError+VLFPAdditions.h"

namespace skein {
namespace {

constexpr std::uint64_t kItemsPerPage = 200;

}  // namespace

// One page's request, shared by the handlers of which one will end it.
struct VLFileEnumerator::ListingRequest {
  std::shared_ptr<NSFileProviderEnumerationObserver> observer;
  const std::optional<NSFileProviderPage> page;
  const std::uint8_t sortOrder;
  VLLogSection section;

  // Whichever handler ends the request: lets go of the observer, since the other handlers
  // may live longer, and closes the section.
  template <class Answer>
  void end(Answer&& answer) {
    const auto ended = std::exchange(observer, nullptr);
    // A second answer is the daemon's fault, and nobody is left to hear it.
    if (!ended) return;
    answer(*ended);
    section.close();
  }
  void endWithError(const NSErrorPtr& error) {
    end([&](auto& ended) { ended.finishEnumeratingWithError(vl_fileProviderError(error)); });
  }
};

std::shared_ptr<VLFileEnumerator> VLFileEnumerator::initWithFileObjectID(
    std::optional<VLFileObjectID> fileObjectID, NSURLPtr url,
    NSFileProviderItemIdentifier itemIdentifier, bool recursive, Environment& environment) {
  if (!url) {
    VL_ERROR(environment.log, "[ERROR] can't create a file enumeration without a url");
    return nullptr;
  }
  return std::shared_ptr<VLFileEnumerator>(new VLFileEnumerator(
      fileObjectID, std::move(url), std::move(itemIdentifier), recursive, environment));
}

VLFileEnumerator::VLFileEnumerator(std::optional<VLFileObjectID> fileObjectID, NSURLPtr url,
                                   NSFileProviderItemIdentifier itemIdentifier, bool recursive,
                                   Environment& environment)
    : _environment(environment),
      _itemIdentifier(std::move(itemIdentifier)),
      _fileObjectID(fileObjectID),
      _url(std::move(url)),
      _isRecursive(recursive),
      _queue("file-enumerator", environment.executor) {
  _drawUUID();
}

void VLFileEnumerator::enumerateItemsForObserver(
    std::shared_ptr<NSFileProviderEnumerationObserver> observer,
    std::optional<NSFileProviderPage> startingAtPage) {
  Log& log = _environment.log;
  const VLLogSection section(log, _environment.logSections);
  VL_DEBUG(log, "[DEBUG] ┏%llx listing items", section.number());
  // Also for the initial pages, whose offset is 0.
  if (startingAtPage) VL_DEBUG(log, "[DEBUG] from page %lu", vl_pageTokenOffset(startingAtPage));

  VLLogSection requestSection(log, _environment.logSections);
  VL_DEBUG(log, "[DEBUG] ┣%llx calling vald", requestSection.number());
  const std::uint8_t sortOrder = vl_pageTokenSortOrder(startingAtPage);
  const auto request = std::make_shared<ListingRequest>(ListingRequest{
      std::move(observer), std::move(startingAtPage), sortOrder, std::move(requestSection)});

  // What changes after this listing must be heard of, so the link comes first.
  setupNotificationReceivingIfNeededWithCompletion(
      [self = shared_from_this(), request](const NSErrorPtr& error) {
        if (error) {
          request->endWithError(error);
        } else {
          self->_listPage(request);
        }
      });
}

void VLFileEnumerator::_listPage(const std::shared_ptr<ListingRequest>& request) {
  const auto daemon = _environment.daemonConnection.remoteObjectProxyWithErrorHandler(
      [request](const NSErrorPtr& error) { request->endWithError(error); });
  daemon->enumerateItemsInFolder(
      _fileObjectID, request->sortOrder, vl_pageTokenOffset(request->page), kItemsPerPage,
      [&log = _environment.log, request](const NSFileProviderItems& items, std::uint64_t nextOffset,
                                         const NSErrorPtr& error) {
        VL_DEBUG(log, "[DEBUG] ┳%llx received next page %llu items=%@", request->section.number(),
                 nextOffset, items);
        if (error) {
          VL_ERROR(log, "[ERROR] there was an error when listing items: %@", error);
          request->endWithError(error);
          return;
        }
        request->end([&](auto& observer) {
          observer.didEnumerateItems(items);
          // The next offset alone decides: 0 ends the listing after a full page too.
          observer.finishEnumeratingUpToPage(
              vl_pageTokenFromSortOrder(request->sortOrder, nextOffset));
        });
      });
}

}  // namespace skein
