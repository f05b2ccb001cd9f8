#include "platform/fileprovider/NSFileProviderExtension.h"

#include <utility>

namespace skein {
namespace {

NSErrorPtr notSupported() {
  return NSError::errorWithDomain(
      NSCocoaErrorDomain, NSFeatureUnsupportedError,
      {{NSLocalizedDescriptionKey,
        std::string("The operation is not supported by this extension.")}});
}

}  // namespace

bool NSFileProviderExtension::init(std::shared_ptr<const NSExtensionAttributes> attributes) {
  _attributes = std::move(attributes);
  return _attributes != nullptr;
}

NSURLPtr NSFileProviderExtension::URLForItemWithPersistentIdentifier(
    const NSFileProviderItemIdentifier&) {
  return nullptr;
}

std::optional<NSFileProviderItemIdentifier>
NSFileProviderExtension::persistentIdentifierForItemAtURL(const NSURLPtr&) {
  return std::nullopt;
}

NSFileProviderItemPtr NSFileProviderExtension::itemForIdentifier(
    const NSFileProviderItemIdentifier&, NSErrorOut error) {
  error.store(notSupported());
  return nullptr;
}

std::shared_ptr<NSFileProviderEnumerator>
NSFileProviderExtension::enumeratorForContainerItemIdentifier(const NSFileProviderItemIdentifier&,
                                                              NSErrorOut error) {
  error.store(notSupported());
  return nullptr;
}

NSErrorPtr NSFileProviderExtension::fileProviderErrorFromFSError(const NSErrorPtr& error) {
  return error;
}

void NSFileProviderExtension::providePlaceholderAtURL(const NSURLPtr&,
                                                      ErrorCompletion completionHandler) {
  completionHandler(notSupported());
}

void NSFileProviderExtension::startProvidingItemAtURL(const NSURLPtr&, std::uint64_t,
                                                      ErrorCompletion completionHandler) {
  completionHandler(notSupported());
}

void NSFileProviderExtension::startProvidingItemAtURL(const NSURLPtr&,
                                                      ErrorCompletion completionHandler) {
  completionHandler(notSupported());
}

void NSFileProviderExtension::stopProvidingItemAtURL(const NSURLPtr&) {}

void NSFileProviderExtension::itemChangedAtURL(const NSURLPtr&) {}

void NSFileProviderExtension::importDocumentAtURL(const NSURLPtr&,
                                                  const NSFileProviderItemIdentifier&,
                                                  ItemCompletion completionHandler) {
  completionHandler(nullptr, notSupported());
}

void NSFileProviderExtension::createDirectoryWithName(const std::string&,
                                                      const NSFileProviderItemIdentifier&,
                                                      ItemCompletion completionHandler) {
  completionHandler(nullptr, notSupported());
}

void NSFileProviderExtension::renameItemWithIdentifier(const NSFileProviderItemIdentifier&,
                                                       const std::string&,
                                                       ItemCompletion completionHandler) {
  completionHandler(nullptr, notSupported());
}

void NSFileProviderExtension::reparentItemWithIdentifier(const NSFileProviderItemIdentifier&,
                                                         const NSFileProviderItemIdentifier&,
                                                         std::optional<std::string>,
                                                         ItemCompletion completionHandler) {
  completionHandler(nullptr, notSupported());
}

void NSFileProviderExtension::trashItemWithIdentifier(const NSFileProviderItemIdentifier&,
                                                      ItemCompletion completionHandler) {
  completionHandler(nullptr, notSupported());
}

void NSFileProviderExtension::untrashItemWithIdentifier(const NSFileProviderItemIdentifier&,
                                                        std::optional<NSFileProviderItemIdentifier>,
                                                        ItemCompletion completionHandler) {
  completionHandler(nullptr, notSupported());
}

void NSFileProviderExtension::deleteItemWithIdentifier(const NSFileProviderItemIdentifier&,
                                                       ErrorCompletion completionHandler) {
  completionHandler(notSupported());
}

void NSFileProviderExtension::setLastUsedDate(std::optional<NSDate>,
                                              const NSFileProviderItemIdentifier&,
                                              ItemCompletion completionHandler) {
  completionHandler(nullptr, notSupported());
}

void NSFileProviderExtension::setTagData(std::optional<NSData>, const NSFileProviderItemIdentifier&,
                                         ItemCompletion completionHandler) {
  completionHandler(nullptr, notSupported());
}

void NSFileProviderExtension::setFavoriteRank(std::optional<std::int64_t>,
                                              const NSFileProviderItemIdentifier&,
                                              ItemCompletion completionHandler) {
  completionHandler(nullptr, notSupported());
}

void NSFileProviderExtension::_defaultApplicationContainerForBundleIdentifier(
    std::optional<std::string>, ItemCompletion completionHandler) {
  completionHandler(nullptr, notSupported());
}

std::shared_ptr<NSProgress> NSFileProviderExtension::fetchThumbnailsForItemIdentifiers(
    const std::vector<NSFileProviderItemIdentifier>&, NSSize, ThumbnailHandler,
    ErrorCompletion completionHandler) {
  completionHandler(notSupported());
  return NSProgress::progressWithTotalUnitCount(0);
}

std::shared_ptr<NSProgress> NSFileProviderExtension::fetchThumbnailsForItemIdentifiersWithType(
    const std::vector<NSFileProviderItemIdentifier>&, NSSize, ThumbnailWithTypeHandler,
    ErrorCompletion completionHandler) {
  completionHandler(notSupported());
  return NSProgress::progressWithTotalUnitCount(0);
}

NSFileProviderServiceSources NSFileProviderExtension::supportedServiceSourcesForItemIdentifier(
    const NSFileProviderItemIdentifier&, NSErrorOut error) {
  error.store(notSupported());
  return {};
}

}  // namespace skein
