#pragma once

#include <memory>
#include <optional>
#include <string>

#include "base/SerialQueue.h"
#include "extension/Contents.h"
#include "extension/ItemIdentity.h"
#include "extension/operations/ItemRequest.h"
#include "platform/fileprovider/NSFileProviderExtension.h"
#include "platform/foundation/NSOperation.h"
#include "support/Environment.h"
#include "thumbnails/ContainerThumbnails.h"
#include "thumbnails/ThumbnailBatch.h"

namespace skein {

// The extension's principal class: what a host instantiates by name and calls from its
// own threads, several operations at once. Every operation is one line that hands it to
// the room that does it; operations that are not named here behave as the platform's. What it
// calls itself, it has from its private bases.
class VLFileProviderExtension final : public NSFileProviderExtension,
                                      private ItemIdentity,
                                      private ContainerThumbnails,
                                      public std::enable_shared_from_this<VLFileProviderExtension> {
 public:
  // init
  // Null, with nothing created or registered, when the superclass refuses `attributes`.
  // Observes account changes from the end of this call until the object's destruction.
  // `environment` outlives the object.
  static std::shared_ptr<VLFileProviderExtension> init(
      std::shared_ptr<const NSExtensionAttributes> attributes, Environment& environment);
  // dealloc
  ~VLFileProviderExtension() override;

  NSURLPtr URLForItemWithPersistentIdentifier(
      const NSFileProviderItemIdentifier& identifier) override;
  std::optional<NSFileProviderItemIdentifier> persistentIdentifierForItemAtURL(
      const NSURLPtr& url) override;
  NSFileProviderItemPtr itemForIdentifier(const NSFileProviderItemIdentifier& identifier,
                                          NSErrorOut error) override;
  std::shared_ptr<NSFileProviderEnumerator> enumeratorForContainerItemIdentifier(
      const NSFileProviderItemIdentifier& identifier, NSErrorOut error) override;
  NSErrorPtr fileProviderErrorFromFSError(const NSErrorPtr& error) override;

  void providePlaceholderAtURL(const NSURLPtr& url, ErrorCompletion completionHandler) override;
  void startProvidingItemAtURL(const NSURLPtr& url, std::uint64_t readingOptions,
                               ErrorCompletion completionHandler) override;
  void startProvidingItemAtURL(const NSURLPtr& url, ErrorCompletion completionHandler) override;
  void stopProvidingItemAtURL(const NSURLPtr& url) override;
  void itemChangedAtURL(const NSURLPtr& url) override;

  void importDocumentAtURL(const NSURLPtr& url,
                           const NSFileProviderItemIdentifier& toParentItemIdentifier,
                           ItemCompletion completionHandler) override;
  void createDirectoryWithName(const std::string& name,
                               const NSFileProviderItemIdentifier& inParentItemIdentifier,
                               ItemCompletion completionHandler) override;
  void renameItemWithIdentifier(const NSFileProviderItemIdentifier& identifier,
                                const std::string& toName,
                                ItemCompletion completionHandler) override;
  void reparentItemWithIdentifier(const NSFileProviderItemIdentifier& identifier,
                                  const NSFileProviderItemIdentifier& toParentItemWithIdentifier,
                                  std::optional<std::string> newName,
                                  ItemCompletion completionHandler) override;
  void trashItemWithIdentifier(const NSFileProviderItemIdentifier& identifier,
                               ItemCompletion completionHandler) override;
  void untrashItemWithIdentifier(const NSFileProviderItemIdentifier& identifier,
                                 std::optional<NSFileProviderItemIdentifier> toParentItemIdentifier,
                                 ItemCompletion completionHandler) override;
  void deleteItemWithIdentifier(const NSFileProviderItemIdentifier& identifier,
                                ErrorCompletion completionHandler) override;
  void setLastUsedDate(std::optional<NSDate> date,
                       const NSFileProviderItemIdentifier& forItemIdentifier,
                       ItemCompletion completionHandler) override;
  void setTagData(std::optional<NSData> tagData,
                  const NSFileProviderItemIdentifier& forItemIdentifier,
                  ItemCompletion completionHandler) override;
  void setFavoriteRank(std::optional<std::int64_t> rank,
                       const NSFileProviderItemIdentifier& forItemIdentifier,
                       ItemCompletion completionHandler) override;
  void _defaultApplicationContainerForBundleIdentifier(std::optional<std::string> bundleIdentifier,
                                                       ItemCompletion completionHandler) override;
  NSFileProviderServiceSources supportedServiceSourcesForItemIdentifier(
      const NSFileProviderItemIdentifier& identifier, NSErrorOut error) override;

  std::shared_ptr<NSProgress> fetchThumbnailsForItemIdentifiers(
      const std::vector<NSFileProviderItemIdentifier>& identifiers, NSSize requestedSize,
      ThumbnailHandler perThumbnailCompletionHandler, ErrorCompletion completionHandler) override;
  std::shared_ptr<NSProgress> fetchThumbnailsForItemIdentifiersWithType(
      const std::vector<NSFileProviderItemIdentifier>& identifiers, NSSize requestedSize,
      ThumbnailWithTypeHandler perThumbnailCompletionHandlerWithType,
      ErrorCompletion completionHandler) override;

 private:
  explicit VLFileProviderExtension(Environment& environment);

  // Somebody logged in or out: the root is looked at anew. On the poster's thread; touches
  // neither caches nor queues.
  void _accountDidChange();

  // The lookups and the contents, held together with this object: what an asynchronous
  // operation keeps until it has answered.
  std::shared_ptr<VLItemLookup> _lookup() { return {shared_from_this(), this}; }
  ItemRequest _itemRequest() { return {_lookup(), _environment}; }
  ThumbnailRequest _thumbnailRequest() { return {_lookup(), *this, _environment, _queue}; }

  Environment& _environment;

  // Released from the last to the first. Work that is under way holds this object, so none is
  // left by then.
  std::unique_ptr<Contents> _contents;  // with _downloadOperationByPath
  std::shared_ptr<NSOperationQueue> _operationQueue;
  std::shared_ptr<SerialQueue> _queue;
};

}  // namespace skein
