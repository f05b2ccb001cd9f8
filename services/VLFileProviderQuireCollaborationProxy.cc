#include "services/VLFileProviderQuireCollaborationProxy.h"

#include <algorithm>
#include <span>
#include <utility>

namespace skein {
namespace {

constexpr std::uint64_t kProtocolVersion = 1;
constexpr std::uint64_t kCapabilities = 82;
constexpr char kFileProviderIdentifier[] = "com.tessel.Vellum";

// What a client must ask about before it calls.
constexpr std::string_view kLeftOut[] = {
    "setEnvironmentType:",
    "fetchPrivacyStateWithCompletionHandler:",
    "documentIsInUseWithTimeout:",
};

bool contains(std::span<const std::string_view> selectors, std::string_view selector) {
  return std::find(selectors.begin(), selectors.end(), selector) != selectors.end();
}

template <class Operation>
std::function<void()> cancelling(const std::shared_ptr<Operation>& operation) {
  return [weak = std::weak_ptr(operation)] {
    if (const auto living = weak.lock()) living->cancel();
  };
}

}  // namespace

bool VLFileProviderQuireCollaborationProxy::respondsToSelector(std::string_view selector) const {
  return contains(VLFileProviderQuireCollaborationSelectors, selector) &&
         !contains(kLeftOut, selector);
}

VLFileProviderQuireCollaborationProxy::Progress
VLFileProviderQuireCollaborationProxy::_newProgressWithCancellationHandler(
    std::function<void()> handler) {
  auto progress = NSProgress::progressWithTotalUnitCount(0);
  progress->setCancellationHandler(std::move(handler));
  return progress;
}

void VLFileProviderQuireCollaborationProxy::fetchVersionAndCapabilitiesWithCompletionHandler(
    Completion<std::uint64_t, std::uint64_t, NSErrorPtr> handler) {
  handler(kProtocolVersion, kCapabilities, nullptr);
}

VLFileProviderQuireCollaborationProxy::Progress
VLFileProviderQuireCollaborationProxy::fetchCollaborationTokenWithCompletionHandler(
    Completion<Text, Text, Text, std::optional<NSDate>, NSErrorPtr> handler) {
  const NSURLPtr url = _fileProviderExtension->URLForItemWithPersistentIdentifier(_itemIdentifier);
  const auto operation = _environment.sharingOperations.copyShareTokenOperation(url);
  operation->setShareAndBaseTokenCompletionBlock(
      [handler = std::move(handler)](const Text& shareToken, const Text& baseToken,
                                     const NSErrorPtr& error) mutable {
        if (error) {
          handler(std::nullopt, std::nullopt, std::nullopt, std::nullopt, error);
        } else {
          // The base token first: clients know the two the other way round than the framework.
          handler(kFileProviderIdentifier, baseToken, shareToken, NSDateDistantFuture(), nullptr);
        }
      });
  _operationQueue->addOperation(operation);
  return _newProgressWithCancellationHandler(cancelling(operation));
}

VLFileProviderQuireCollaborationProxy::Progress
VLFileProviderQuireCollaborationProxy::fetchLatestRevisionWithCompletionHandler(
    Completion<NSErrorPtr> handler) {
  const NSURLPtr url = _fileProviderExtension->URLForItemWithPersistentIdentifier(_itemIdentifier);
  VL_DEBUG(_environment.log, "[DEBUG] fetchLatestRevisionWithCompletionHandler: %@, %@",
           _itemIdentifier, url);
  const auto operation = _environment.operations.fileProvidingOperation(url, 0);
  operation->setWantsCurrentVersion(true);
  operation->setFileProvidingCompletion(
      [handler = std::move(handler)](NSErrorPtr error) mutable { handler(std::move(error)); });
  _operationQueue->addOperation(operation);
  return _newProgressWithCancellationHandler(cancelling(operation));
}

VLFileProviderQuireCollaborationProxy::Progress
VLFileProviderQuireCollaborationProxy::refreshSharingStateWithCompletionHandler(
    Completion<NSErrorPtr> handler) {
  const auto answer = std::move(handler).share();
  _environment.daemonConnection
      .remoteObjectProxyWithErrorHandler(
          [answer](NSErrorPtr error) { (*answer)(std::move(error)); })
      ->refreshSharingStateForItemIdentifier(_itemIdentifier, [&log = _environment.log,
                                                               identifier = _itemIdentifier,
                                                               answer](const NSErrorPtr& error) {
        if (error) {
          VL_DEBUG(log, "[DEBUG] error refreshing state for item identifier %@: %@", identifier,
                   error);
        } else {
          VL_DEBUG(log, "[DEBUG] finished refreshing state for item identifier: %@", identifier);
        }
        (*answer)(error);
      });
  return NSProgress::progressWithTotalUnitCount(0);
}

void VLFileProviderQuireCollaborationProxy::fetchFileProviderIdentifierWithCompletionHandler(
    Completion<Text, NSErrorPtr> handler) {
  handler(kFileProviderIdentifier, nullptr);
}

void VLFileProviderQuireCollaborationProxy::fetchURLForSharingFileWithCompletionHandler(
    Completion<NSURLPtr, NSErrorPtr> handler) {
  handler(nullptr, nullptr);
}

void VLFileProviderQuireCollaborationProxy::_fetchShareOptions(
    Completion<bool, Text, NSErrorPtr> handler) {
  const auto answer = std::move(handler).share();
  _environment.daemonConnection
      .remoteObjectProxyWithErrorHandler(
          [answer](NSErrorPtr error) { (*answer)(false, std::nullopt, std::move(error)); })
      ->getShareOptionsOfItemIdentifier(
          _itemIdentifier,
          [answer](std::int64_t ways, std::int64_t /*publicPermission*/, std::int64_t ownWays,
                   const Text& folderName, const NSErrorPtr& error) {
            // The values stand for themselves, also beside an error.
            (*answer)((ways & ~ownWays) != 0, folderName, error);
          });
}

VLFileProviderQuireCollaborationProxy::Progress
VLFileProviderQuireCollaborationProxy::fetchFolderSharingStateWithCompletionHandler(
    Completion<bool, NSErrorPtr> handler) {
  _fetchShareOptions([handler = std::move(handler)](bool shared, const Text& /*folderName*/,
                                                    NSErrorPtr error) mutable {
    handler(shared, std::move(error));
  });
  return nullptr;
}

VLFileProviderQuireCollaborationProxy::Progress
VLFileProviderQuireCollaborationProxy::fetchSharedFolderInfoWithCompletionHandler(
    Completion<bool, Text, NSErrorPtr> handler) {
  _fetchShareOptions(std::move(handler));
  return nullptr;
}

}  // namespace skein
