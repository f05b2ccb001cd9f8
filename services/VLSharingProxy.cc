#include "services/VLSharingProxy.h"

#include <cstdio>
#include <utility>

#include "platform/fileprovider/NSFileProviderError.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

// ENOTSUP where clients were written; the number is what they know, whatever it means here.
constexpr int kNotSupported = 45;

bool isFolderShare(const CKSharePtr& share) {
  const std::string* type = share ? share->objectForKey(CKShareTypeKey) : nullptr;
  return type != nullptr && *type == "folder";
}

std::shared_ptr<NSProgress> cancellableProgress(std::int64_t totalUnitCount) {
  auto progress = NSProgress::progressWithTotalUnitCount(totalUnitCount);
  progress->setCancellable(true);
  return progress;
}

// The operation is its queue's; the progress, which its client may keep for long, must not
// keep it as well.
template <class Operation>
std::function<void()> cancelling(const std::shared_ptr<Operation>& operation) {
  return [weak = std::weak_ptr(operation)] {
    if (const auto living = weak.lock()) living->cancel();
  };
}

// The item has no share on the server yet.
bool isMissingShare(const NSErrorPtr& error) {
  return vlc_checkErrorsFromCloudKit(error, [](const NSErrorPtr& one) {
    return vlc_isCloudKitUnknownItemError(one) ||
           vl_isVellumErrorCode(one, VLVellumErrorUnknownShare);
  });
}

}  // namespace

std::string description(const VLSharingProxy& proxy) {
  char text[48];
  std::snprintf(text, sizeof text, "<VLSharingProxy: %p>", static_cast<const void*>(&proxy));
  return text;
}

VLLogSection VLSharingProxy::_openSection(const char* method) const {
  Log& log = _environment.log;
  VLLogSection section(log, _environment.logSections, VLLogSectionLevel::Info);
  VL_INFO(log, "[INFO] ┏%llx %@ %s %@", section.number(), *this, method, _itemIdentifier);
  return section;
}

NSURLPtr VLSharingProxy::_url() const {
  return _fileProviderExtension->URLForItemWithPersistentIdentifier(_itemIdentifier);
}

CKSharePtr VLSharingProxy::_currentCachedShare() const {
  MutexLock lock(_mutex);
  return _cachedShare;
}

void VLSharingProxy::_setCachedShare(CKSharePtr share) {
  MutexLock lock(_mutex);
  _cachedShare.swap(share);
}

bool VLSharingProxy::_isShared(NSErrorOut error) const {
  const NSURLPtr itemURL = _url();
  if (!itemURL) {
    error.store(fileProviderErrorForNonExistentItemWithIdentifier(_itemIdentifier));
    return false;
  }
  return _environment.resourceValues
      .getResourceValue(itemURL, NSURLUbiquitousItemIsSharedKey, error)
      .value_or(false);
}

void VLSharingProxy::fetchSharingInfo(Completion<bool, VLFileProviderItemPtr, NSErrorPtr> reply) {
  const auto section = _openSection("-[VLSharingProxy fetchSharingInfo:]");
  NSErrorPtr error;
  const bool shared = _isShared(&error);
  const VLFileProviderItemPtr item;
  VL_DEBUG(_environment.log, "[DEBUG] %@: reply(%d, %@, %@)", *this, int{shared}, item, error);
  reply(shared, item, error);
}

VLSharingProxy::Progress VLSharingProxy::preflightCheckIfCurrentlyShareableWithCompletion(
    Completion<bool, VLFileProviderItemPtr, Items, Items, NSErrorPtr> completion) {
  const auto section =
      _openSection("-[VLSharingProxy preflightCheckIfCurrentlyShareableWithCompletion:]");
  NSErrorPtr error;
  const bool shared = _isShared(&error);
  const VLFileProviderItemPtr item;
  const Items none;
  VL_DEBUG(_environment.log, "[DEBUG] %@: reply(%d, %@, %@, %@, %@)", *this, int{shared}, item,
           none, none, error);
  completion(shared, item, none, none, error);
  return nullptr;
}

VLSharingProxy::Progress VLSharingProxy::fetchParticipantListAndPublicPermission(
    Completion<Participants, std::int64_t, NSErrorPtr> reply) {
  const auto section = _openSection("-[VLSharingProxy fetchParticipantListAndPublicPermission:]");
  return fetchShareWithCompletion([self = shared_from_this(), reply = std::move(reply)](
                                      const CKSharePtr& share, const NSErrorPtr& error) mutable {
    Participants participants;
    if (share) participants = share->participants;
    const std::int64_t permission = share ? share->publicPermission : 0;
    VL_DEBUG(self->_environment.log, "[DEBUG] %@: reply(%@, %ld, %@)", *self, participants,
             permission, error);
    reply(std::move(participants), permission, error);
  });
}

void VLSharingProxy::startPreparingForShareWhenForcing(bool /*forcing*/) {
  _openSection("-[VLSharingProxy startPreparingForShareWhenForcing:]");
}

VLSharingProxy::Progress VLSharingProxy::fetchShareWithCompletion(
    Completion<CKSharePtr, NSErrorPtr> completion) {
  const auto section = _openSection("-[VLSharingProxy fetchShareWithCompletion:]");
  auto reply = [self = shared_from_this(), completion = std::move(completion)](
                   const CKSharePtr& share, const NSErrorPtr& error) mutable {
    VL_DEBUG(self->_environment.log, "[DEBUG] %@: reply(%@, %@)", *self, share, error);
    completion(share, error);
  };
  if (const CKSharePtr cached = _currentCachedShare()) {
    reply(cached, nullptr);
    return nullptr;
  }

  const NSURLPtr itemURL = _url();
  auto progress = cancellableProgress(1);
  const auto operation = _environment.sharingOperations.shareCopyOperation(itemURL);
  operation->setRootShareCopyCompletionBlock(
      [self = shared_from_this(), itemURL, reply = std::move(reply)](
          const CKSharePtr& share, const std::optional<std::string>& inheritedFrom,
          const NSErrorPtr& error) mutable {
        // A share that comes from a folder above is that folder's to change or remove.
        if (!inheritedFrom) self->_setCachedShare(share);
        if (isMissingShare(error)) {
          // A beginning, which the client may save; not cached, as the server knows nothing
          // of it.
          NSErrorPtr problem;
          const CKSharePtr made =
              self->_environment.sharingOperations.VLSharingCreateShareForItemAtURL(itemURL,
                                                                                    &problem);
          reply(made, problem);
        } else if (error) {
          reply(nullptr, error);
        } else {
          reply(share, nullptr);
        }
      });
  progress->setCancellationHandler(cancelling(operation));
  _operationQueue->addOperation(operation);
  return progress;
}

VLSharingProxy::Progress VLSharingProxy::fetchShareURLWithCompletion(
    Completion<NSURLPtr, NSErrorPtr> completion) {
  const auto section = _openSection("-[VLSharingProxy fetchShareURLWithCompletion:]");
  auto reply = [self = shared_from_this(), completion = std::move(completion)](
                   const NSURLPtr& shareURL, const NSErrorPtr& error) mutable {
    VL_DEBUG(self->_environment.log, "[DEBUG] %@: reply(%@, %@)", *self, shareURL, error);
    completion(shareURL, error);
  };
  const NSURLPtr itemURL = _url();
  NSErrorPtr error;
  const auto type = _environment.resourceValues.vl_typeIdentifierWithError(itemURL, &error);
  if (!type) {
    reply(nullptr, error);
    return nullptr;
  }

  auto progress = cancellableProgress(1);
  const auto operation = _environment.sharingOperations.shareCopyShareURLOperation(itemURL, *type);
  operation->setCopyShareURLCompletionBlock(
      [progress, reply = std::move(reply)](const NSURLPtr& shareURL,
                                           const NSErrorPtr& problem) mutable {
        progress->setCompletedUnitCount(1);
        reply(shareURL, problem);
      });
  progress->setCancellationHandler(cancelling(operation));
  _operationQueue->addOperation(operation);
  return progress;
}

VLSharingProxy::Progress VLSharingProxy::saveShare(CKSharePtr share,
                                                   Completion<CKSharePtr, NSErrorPtr> completion) {
  const auto section = _openSection("-[VLSharingProxy saveShare:completion:]");
  auto reply = [self = shared_from_this(), completion = std::move(completion)](
                   const CKSharePtr& saved, const NSErrorPtr& error) mutable {
    VL_DEBUG(self->_environment.log, "[DEBUG] %@: reply(%@, %@)", *self, saved, error);
    completion(saved, error);
  };
  // Folders are shared elsewhere, never through this service.
  if (isFolderShare(share)) {
    reply(nullptr, vl_errorWithPOSIXCode(kNotSupported));
    return nullptr;
  }

  _setCachedShare(share);
  const auto operation = _environment.sharingOperations.shareSaveOperation(std::move(share));
  auto progress = cancellableProgress(1);
  operation->setShareSaveCompletionBlock(
      [self = shared_from_this(), progress, reply = std::move(reply)](
          const CKSharePtr& saved, const NSErrorPtr& error) mutable {
        progress->setCompletedUnitCount(1);
        // As it comes: after a failure the next fetch asks the server.
        self->_setCachedShare(saved);
        reply(saved, error);
      });
  progress->setCancellationHandler(cancelling(operation));
  _operationQueue->addOperation(operation);
  return progress;
}

VLSharingProxy::Progress VLSharingProxy::unshareWithCompletion(Completion<NSErrorPtr> completion) {
  const auto section = _openSection("-[VLSharingProxy unshareWithCompletion:]");
  auto progress = cancellableProgress(2);
  Completion<NSErrorPtr> reply = [self = shared_from_this(),
                                  completion = std::move(completion)](NSErrorPtr error) mutable {
    VL_DEBUG(self->_environment.log, "[DEBUG] %@: reply(%@)", *self, error);
    completion(std::move(error));
  };
  const auto fetch =
      fetchShareWithCompletion([self = shared_from_this(), progress, reply = std::move(reply)](
                                   const CKSharePtr& share, const NSErrorPtr& error) mutable {
        if (error) {
          reply(error);
        } else {
          self->_removeShare(share, progress, std::move(reply));
        }
      });
  // From the first unit on it is the removal that a cancellation ends.
  progress->setCancellationHandlerWhileCountIsZero([fetch] {
    if (fetch) fetch->cancel();
  });
  return progress;
}

void VLSharingProxy::_removeShare(const CKSharePtr& share,
                                  const std::shared_ptr<NSProgress>& progress,
                                  Completion<NSErrorPtr> reply) {
  if (!share || !share->isKnownToServer) {
    reply(nullptr);  // nothing to remove
    return;
  }
  // A document inside a shared folder meets the folder's share, which is not its own to
  // remove. (Saving one is refused for folders too: that is done elsewhere.)
  if (isFolderShare(share) && !_itemIdentifier.starts_with('i')) {
    reply(vl_errorWithPOSIXCode(kNotSupported));
    return;
  }
  _setCachedShare(nullptr);
  progress->setCompletedUnitCount(1);
  const auto operation = _environment.sharingOperations.shareDestroyOperation(share);
  operation->setShareDestroyCompletionBlock(
      [progress, reply = std::move(reply)](NSErrorPtr error) mutable {
        reply(std::move(error));
        progress->setCompletedUnitCount(2);
      });
  progress->setCancellationHandler(cancelling(operation));
  _operationQueue->addOperation(operation);
}

}  // namespace skein
