#include "extension/ItemIdentity.h"

#include "platform/fileprovider/NSFileProviderError.h"
#include "support/ErrorLogging.h"
#include "support/NSError+VLFPAdditions.h"
#include "vellum/VLErrors.h"

namespace skein {

bool ItemIdentity::_isInSyncedLocation(const NSURLPtr& url) const {
  return url && _environment.documents.vl_isInSyncedLocation(url);
}

NSURLPtr ItemIdentity::URLForItemWithPersistentIdentifier(
    const NSFileProviderItemIdentifier& identifier) {
  return _URLForItemWithPersistentIdentifier(identifier, true);
}

NSURLPtr ItemIdentity::_URLForItemWithPersistentIdentifier(
    const NSFileProviderItemIdentifier& identifier, bool resolvingVLAliases, bool attachPhysical) {
  Log& log = _environment.log;
  VLDocuments& documents = _environment.documents;
  const VLLogSection section(log, _environment.logSections);
  VL_DEBUG(log, "[DEBUG] ┏%llx asked url for %@", section.number(), identifier);

  if (identifier == NSFileProviderRootContainerItemIdentifier) {
    NSURLPtr root = _environment.rootURL.get(_environment.containers, *_environment.executor);
    VL_DEBUG(log, "[DEBUG] returning %@", root);
    return root;
  }

  NSURLPtr url;
  NSErrorPtr error;
  if (const auto fileObjectID = VLFileObjectID::fileObjectIDWithString(identifier)) {
    url = documents.vl_documentURLFromFileObjectID(*fileObjectID, &error);
  }
  if (resolvingVLAliases && url && documents.vl_isExternalDocumentReference(url)) {
    VL_DEBUG(log, "[DEBUG] we have a bookmark, returning its target");
    error = nullptr;
    url = documents.vl_URLByResolvingExternalDocumentReferenceWithError(url, &error);
  }
  // Says what was resolved, ahead of the test below: a URL outside the synced location is
  // named here although the caller gets none.
  if (url) {
    VL_DEBUG(log, "[DEBUG] returning %@", url);
  } else {
    VL_ERROR(log, "[ERROR] returning nil, there was an error: %@", error);
  }
  if (!_isInSyncedLocation(url)) return nullptr;
  if (attachPhysical) documents.vl_addPhysicalProperty(url);
  return url;
}

std::optional<NSFileProviderItemIdentifier> ItemIdentity::persistentIdentifierForItemAtURL(
    const NSURLPtr& url) {
  if (!_isInSyncedLocation(url)) return std::nullopt;

  Log& log = _environment.log;
  const VLLogSection section(log, _environment.logSections);
  VL_DEBUG(log, "[DEBUG] ┏%llx asked identifier for %@", section.number(), url);

  NSErrorPtr error;
  const NSFileProviderItemPtr item = _propertiesForItemAtURL(url, &error);
  std::optional<NSFileProviderItemIdentifier> identifier;
  // The error decides, not the item: an item beside an error is not used, and no item
  // without an error is a silent nil.
  if (error) {
    VL_DEBUG(log, "[DEBUG] couldn't get item identifier at %@: %@", url, error);
  } else if (item) {
    identifier = item->itemIdentifier();
  }
  VL_DEBUG(log, "[DEBUG] returning %@", identifier);
  return identifier;
}

bool ItemIdentity::_isLoggedInOrError(NSErrorOut error) {
  constexpr char kMethod[] = "-[VLFileProviderExtension _isLoggedInOrError:]";
  Log& log = _environment.log;

  NSErrorPtr accountError;
  const auto account = _environment.accounts.currentCachedLoggedInAccountWithError(&accountError);
  if (accountError) {
    vl_reportError(log, kMethod, error, vl_fileProviderError(accountError));
    return false;
  }
  // An account without an identifier for this app cannot be served: it counts as nobody.
  if (account && account->perAppAccountIdentifier()) return true;

  vl_reportError(
      log, kMethod, error,
      NSError::errorWithDomain(NSFileProviderErrorDomain, NSFileProviderErrorNotAuthenticated,
                               {{NSUnderlyingErrorKey, vlc_errorLoggedOut()}}));
  return false;
}

NSFileProviderItemPtr ItemIdentity::itemForIdentifier(
    const NSFileProviderItemIdentifier& identifier, NSErrorOut error) {
  Log& log = _environment.log;
  const VLLogSection section(log, _environment.logSections);
  VL_DEBUG(log, "[DEBUG] ┏%llx asked properties for %@", section.number(), identifier);

  if (!_isLoggedInOrError(error)) return nullptr;
  if (const NSURLPtr url = URLForItemWithPersistentIdentifier(identifier)) {
    NSFileProviderItemPtr item = _propertiesForItemAtURL(url, error);
    VL_DEBUG(log, "[DEBUG] returning %@", item);
    return item;
  }
  vl_reportError(log, "-[VLFileProviderExtension itemForIdentifier:error:]", error,
                 fileProviderErrorForNonExistentItemWithIdentifier(identifier));
  return nullptr;
}

NSFileProviderItemPtr ItemIdentity::_propertiesForItemAtURL(const NSURLPtr& url, NSErrorOut error) {
  return _propertiesForItemAtURL(url, false, error);
}

NSFileProviderItemPtr ItemIdentity::_propertiesForNewItemAtURL(const NSURLPtr& url,
                                                               NSErrorOut error) {
  return _propertiesForItemAtURL(url, true, error);
}

NSFileProviderItemPtr ItemIdentity::_propertiesForItemAtURL(const NSURLPtr& url, bool forceScan,
                                                            NSErrorOut error) {
  if (!_isInSyncedLocation(url)) {
    error.store(NSError::errorWithDomain(NSFileProviderErrorDomain, NSFileProviderErrorNoSuchItem));
    return nullptr;
  }

  Log& log = _environment.log;
  const VLLogSection section(log, _environment.logSections);
  VL_DEBUG(log, "[DEBUG] ┏%llx asked properties for %@", section.number(), url);

  NSFileProviderItemPtr item;
  const auto containerID = _environment.documents.vl_containerIDIfIsDocumentsContainerURL(url);
  if (containerID && *containerID != VLUbiquitousDocumentsContainerID &&
      *containerID != VLUbiquitousDesktopContainerID) {
    const VLContainersByID table = _environment.containers.allContainersByContainerID();
    const auto found = table.find(*containerID);
    item = _environment.queryItems.containerItemForContainer(
        found != table.end() ? found->second : nullptr, forceScan);
  } else {
    item = _environment.queryItems.askDaemonQueryItemForURL(url, forceScan, error);
  }
  VL_DEBUG(log, "[DEBUG] returning %@", item);
  // Whatever the slot holds is translated, also what the caller had in it before.
  if (error.stored()) error.store(vl_fileProviderError(error.stored()));
  return item;
}

NSErrorPtr fileProviderErrorFromFSError(const NSErrorPtr& error, VLItemLookup& lookup) {
  if (!error || error->domain() != NSCocoaErrorDomain ||
      error->code() != NSFileWriteFileExistsError) {
    return error;
  }
  const NSURLPtr url = fp_collidingURL(error);
  if (!url) return error;
  NSFileProviderItemPtr item = lookup._propertiesForItemAtURL(url, nullptr);
  if (!item) return error;
  return fileProviderErrorForCollisionWithItem(std::move(item));
}

}  // namespace skein
