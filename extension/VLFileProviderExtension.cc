#include "extension/VLFileProviderExtension.h"

#include "enumeration/EnumeratorSelection.h"
#include "extension/operations/CreateDirectory.h"
#include "extension/operations/DefaultApplicationContainer.h"
#include "extension/operations/DeleteItem.h"
#include "extension/operations/FavoriteRank.h"
#include "extension/operations/ImportDocument.h"
#include "extension/operations/LastUsedDate.h"
#include "extension/operations/RenameItem.h"
#include "extension/operations/ReparentItem.h"
#include "extension/operations/TagData.h"
#include "extension/operations/TrashItem.h"
#include "extension/operations/UntrashItem.h"
#include "services/SupportedServices.h"

namespace skein {

VLFileProviderExtension::VLFileProviderExtension(Environment& environment)
    : ItemIdentity(environment), ContainerThumbnails(environment.log), _environment(environment) {}

std::shared_ptr<VLFileProviderExtension> VLFileProviderExtension::init(
    std::shared_ptr<const NSExtensionAttributes> attributes, Environment& environment) {
  std::shared_ptr<VLFileProviderExtension> self(new VLFileProviderExtension(environment));
  if (!self->NSFileProviderExtension::init(std::move(attributes))) return nullptr;

  self->_operationQueue = std::make_shared<NSOperationQueue>(environment.executor);
  self->_contents = std::make_unique<Contents>(environment);
  self->_queue = std::make_shared<SerialQueue>("fileprovider-portfolio", environment.executor);
  // Without this the process never hears of account changes, and the next line is in vain.
  environment.accounts.startAccountTokenChangeObserverIfNeeded();
  environment.notificationCenter.addObserver(self, &VLFileProviderExtension::_accountDidChange,
                                             VLAccountTokenDidChangeNotification);
  return self;
}

VLFileProviderExtension::~VLFileProviderExtension() {
  _environment.notificationCenter.removeObserver(this, VLAccountTokenDidChangeNotification);
}

void VLFileProviderExtension::_accountDidChange() {
  Log& log = _environment.log;
  VL_DEBUG(log,
           "[DEBUG] received account did update notification, signal changes to fileproviderd");
  _environment.providerManager.signalEnumeratorForContainerItemIdentifier(
      NSFileProviderRootContainerItemIdentifier, [&log](const NSErrorPtr& error) {
        if (!error) return;
        VL_ERROR(log, "[ERROR] failed to signal enumerator for root container: %@", error);
      });
}

// Lookups.

NSURLPtr VLFileProviderExtension::URLForItemWithPersistentIdentifier(
    const NSFileProviderItemIdentifier& identifier) {
  return ItemIdentity::URLForItemWithPersistentIdentifier(identifier);
}

std::optional<NSFileProviderItemIdentifier>
VLFileProviderExtension::persistentIdentifierForItemAtURL(const NSURLPtr& url) {
  return ItemIdentity::persistentIdentifierForItemAtURL(url);
}

NSFileProviderItemPtr VLFileProviderExtension::itemForIdentifier(
    const NSFileProviderItemIdentifier& identifier, NSErrorOut error) {
  return ItemIdentity::itemForIdentifier(identifier, error);
}

NSErrorPtr VLFileProviderExtension::fileProviderErrorFromFSError(const NSErrorPtr& error) {
  return skein::fileProviderErrorFromFSError(error, *this);
}

// Enumeration.

std::shared_ptr<NSFileProviderEnumerator>
VLFileProviderExtension::enumeratorForContainerItemIdentifier(
    const NSFileProviderItemIdentifier& identifier, NSErrorOut error) {
  return skein::enumeratorForContainerItemIdentifier(identifier, error, *this, _environment);
}

// Contents.

void VLFileProviderExtension::providePlaceholderAtURL(const NSURLPtr& /*url*/,
                                                      ErrorCompletion completionHandler) {
  Contents::providePlaceholder(std::move(completionHandler));
}

void VLFileProviderExtension::startProvidingItemAtURL(const NSURLPtr& url,
                                                      std::uint64_t readingOptions,
                                                      ErrorCompletion completionHandler) {
  Contents::startProvidingItemAtURL({shared_from_this(), _contents.get()}, url, readingOptions,
                                    *_operationQueue, std::move(completionHandler));
}

void VLFileProviderExtension::startProvidingItemAtURL(const NSURLPtr& url,
                                                      ErrorCompletion completionHandler) {
  startProvidingItemAtURL(url, /*readingOptions=*/0, std::move(completionHandler));
}

void VLFileProviderExtension::stopProvidingItemAtURL(const NSURLPtr& url) {
  _contents->stopProvidingItemAtURL(url);
}

void VLFileProviderExtension::itemChangedAtURL(const NSURLPtr& url) {
  _contents->itemChangedAtURL(url);
}

// Item operations.

void VLFileProviderExtension::importDocumentAtURL(
    const NSURLPtr& url, const NSFileProviderItemIdentifier& toParentItemIdentifier,
    ItemCompletion completionHandler) {
  skein::importDocumentAtURL(_itemRequest(), url, toParentItemIdentifier,
                             std::move(completionHandler));
}

void VLFileProviderExtension::createDirectoryWithName(
    const std::string& name, const NSFileProviderItemIdentifier& inParentItemIdentifier,
    ItemCompletion completionHandler) {
  skein::createDirectoryWithName(_itemRequest(), name, inParentItemIdentifier,
                                 std::move(completionHandler));
}

void VLFileProviderExtension::renameItemWithIdentifier(
    const NSFileProviderItemIdentifier& identifier, const std::string& toName,
    ItemCompletion completionHandler) {
  skein::renameItemWithIdentifier(_itemRequest(), identifier, toName, std::move(completionHandler));
}

void VLFileProviderExtension::reparentItemWithIdentifier(
    const NSFileProviderItemIdentifier& identifier,
    const NSFileProviderItemIdentifier& toParentItemWithIdentifier,
    std::optional<std::string> newName, ItemCompletion completionHandler) {
  skein::reparentItemWithIdentifier(_itemRequest(), identifier, toParentItemWithIdentifier,
                                    std::move(newName), std::move(completionHandler));
}

void VLFileProviderExtension::trashItemWithIdentifier(
    const NSFileProviderItemIdentifier& identifier, ItemCompletion completionHandler) {
  skein::trashItemWithIdentifier(_itemRequest(), identifier, std::move(completionHandler));
}

void VLFileProviderExtension::untrashItemWithIdentifier(
    const NSFileProviderItemIdentifier& identifier,
    std::optional<NSFileProviderItemIdentifier> toParentItemIdentifier,
    ItemCompletion completionHandler) {
  skein::untrashItemWithIdentifier(_itemRequest(), identifier, std::move(toParentItemIdentifier),
                                   std::move(completionHandler));
}

void VLFileProviderExtension::deleteItemWithIdentifier(
    const NSFileProviderItemIdentifier& identifier, ErrorCompletion completionHandler) {
  skein::deleteItemWithIdentifier(_itemRequest(), identifier, std::move(completionHandler));
}

void VLFileProviderExtension::setLastUsedDate(std::optional<NSDate> date,
                                              const NSFileProviderItemIdentifier& forItemIdentifier,
                                              ItemCompletion completionHandler) {
  skein::setLastUsedDate(_itemRequest(), date, forItemIdentifier, std::move(completionHandler));
}

void VLFileProviderExtension::setTagData(std::optional<NSData> tagData,
                                         const NSFileProviderItemIdentifier& forItemIdentifier,
                                         ItemCompletion completionHandler) {
  skein::setTagData(_itemRequest(), tagData, forItemIdentifier, std::move(completionHandler));
}

void VLFileProviderExtension::setFavoriteRank(std::optional<std::int64_t> rank,
                                              const NSFileProviderItemIdentifier& forItemIdentifier,
                                              ItemCompletion completionHandler) {
  skein::setFavoriteRank(_itemRequest(), rank, forItemIdentifier, std::move(completionHandler));
}

void VLFileProviderExtension::_defaultApplicationContainerForBundleIdentifier(
    std::optional<std::string> bundleIdentifier, ItemCompletion completionHandler) {
  skein::_defaultApplicationContainerForBundleIdentifier(_itemRequest(), bundleIdentifier,
                                                         std::move(completionHandler));
}

// Thumbnails.

std::shared_ptr<NSProgress> VLFileProviderExtension::fetchThumbnailsForItemIdentifiers(
    const std::vector<NSFileProviderItemIdentifier>& identifiers, NSSize requestedSize,
    ThumbnailHandler perThumbnailCompletionHandler, ErrorCompletion completionHandler) {
  return skein::fetchThumbnailsForItemIdentifiers(_thumbnailRequest(), identifiers, requestedSize,
                                                  std::move(perThumbnailCompletionHandler),
                                                  std::move(completionHandler));
}

std::shared_ptr<NSProgress> VLFileProviderExtension::fetchThumbnailsForItemIdentifiersWithType(
    const std::vector<NSFileProviderItemIdentifier>& identifiers, NSSize requestedSize,
    ThumbnailWithTypeHandler perThumbnailCompletionHandlerWithType,
    ErrorCompletion completionHandler) {
  return skein::fetchThumbnailsForItemIdentifiersWithType(
      _thumbnailRequest(), identifiers, requestedSize,
      std::move(perThumbnailCompletionHandlerWithType), std::move(completionHandler));
}

// Services.

NSFileProviderServiceSources VLFileProviderExtension::supportedServiceSourcesForItemIdentifier(
    const NSFileProviderItemIdentifier& identifier, NSErrorOut /*error*/) {
  return skein::supportedServiceSourcesForItemIdentifier(identifier, _lookup(), _operationQueue,
                                                         _environment);
}

}  // namespace skein
