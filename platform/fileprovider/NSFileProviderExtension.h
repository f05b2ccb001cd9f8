#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <variant>
#include <vector>

#include "base/Completion.h"
#include "platform/fileprovider/NSFileProviderEnumerating.h"
#include "platform/fileprovider/NSFileProviderItem.h"
#include "platform/fileprovider/NSFileProviderServiceSource.h"
#include "platform/foundation/NSError.h"
#include "platform/foundation/NSProgress.h"
#include "platform/foundation/NSSize.h"
#include "platform/foundation/NSURL.h"

namespace skein {

// What the extension's attributes file says, as NSExtensionMain read it.
struct NSExtensionAttributes {
  std::string principalClass;
  std::map<std::string, std::string> values;
};

// The operations a host may ask of a File Provider extension. The host calls them on
// its own threads, several at once. A completion handler is called exactly once, on
// any thread, unless the operation says otherwise; an empty one is allowed.
//
// What stands here is the platform's default behaviour. Lookups of URLs and identifiers
// answer nil; fileProviderErrorFromFSError answers the error that it got;
// stopProvidingItemAtURL and itemChangedAtURL do nothing. All others answer
// NSFeatureUnsupportedError in NSCocoaErrorDomain, beside nil where they answer a value.
class NSFileProviderExtension {
 public:
  using ItemCompletion = Completion<NSFileProviderItemPtr, NSErrorPtr>;
  using ErrorCompletion = Completion<NSErrorPtr>;
  // Identifier, image data, content type, error. Called once per item that is answered.
  using ThumbnailWithTypeHandler =
      std::function<void(const NSFileProviderItemIdentifier&, std::optional<NSData>,
                         std::optional<std::string>, NSErrorPtr)>;
  // Identifier, image data, and a third value that is an error or a content type.
  using ThumbnailHandler =
      std::function<void(const NSFileProviderItemIdentifier&, std::optional<NSData>,
                         std::variant<std::monostate, NSErrorPtr, std::string>)>;

  virtual ~NSFileProviderExtension() = default;

  // Lookups, synchronous.
  virtual NSURLPtr URLForItemWithPersistentIdentifier(
      const NSFileProviderItemIdentifier& identifier);
  virtual std::optional<NSFileProviderItemIdentifier> persistentIdentifierForItemAtURL(
      const NSURLPtr& url);
  // itemForIdentifier:error:
  virtual NSFileProviderItemPtr itemForIdentifier(const NSFileProviderItemIdentifier& identifier,
                                                  NSErrorOut error);
  // enumeratorForContainerItemIdentifier:error:
  virtual std::shared_ptr<NSFileProviderEnumerator> enumeratorForContainerItemIdentifier(
      const NSFileProviderItemIdentifier& identifier, NSErrorOut error);
  virtual NSErrorPtr fileProviderErrorFromFSError(const NSErrorPtr& error);

  // Contents.
  // providePlaceholderAtURL:completionHandler:
  virtual void providePlaceholderAtURL(const NSURLPtr& url, ErrorCompletion completionHandler);
  // startProvidingItemAtURL:readingOptions:completionHandler:
  virtual void startProvidingItemAtURL(const NSURLPtr& url, std::uint64_t readingOptions,
                                       ErrorCompletion completionHandler);
  // startProvidingItemAtURL:completionHandler:
  virtual void startProvidingItemAtURL(const NSURLPtr& url, ErrorCompletion completionHandler);
  virtual void stopProvidingItemAtURL(const NSURLPtr& url);
  virtual void itemChangedAtURL(const NSURLPtr& url);

  // Item operations.
  // importDocumentAtURL:toParentItemIdentifier:completionHandler:
  virtual void importDocumentAtURL(const NSURLPtr& url,
                                   const NSFileProviderItemIdentifier& toParentItemIdentifier,
                                   ItemCompletion completionHandler);
  // createDirectoryWithName:inParentItemIdentifier:completionHandler:
  virtual void createDirectoryWithName(const std::string& name,
                                       const NSFileProviderItemIdentifier& inParentItemIdentifier,
                                       ItemCompletion completionHandler);
  // renameItemWithIdentifier:toName:completionHandler:
  virtual void renameItemWithIdentifier(const NSFileProviderItemIdentifier& identifier,
                                        const std::string& toName,
                                        ItemCompletion completionHandler);
  // reparentItemWithIdentifier:toParentItemWithIdentifier:newName:completionHandler:
  virtual void reparentItemWithIdentifier(
      const NSFileProviderItemIdentifier& identifier,
      const NSFileProviderItemIdentifier& toParentItemWithIdentifier,
      std::optional<std::string> newName, ItemCompletion completionHandler);
  // trashItemWithIdentifier:completionHandler:
  virtual void trashItemWithIdentifier(const NSFileProviderItemIdentifier& identifier,
                                       ItemCompletion completionHandler);
  // untrashItemWithIdentifier:toParentItemIdentifier:completionHandler:
  virtual void untrashItemWithIdentifier(
      const NSFileProviderItemIdentifier& identifier,
      std::optional<NSFileProviderItemIdentifier> toParentItemIdentifier,
      ItemCompletion completionHandler);
  // deleteItemWithIdentifier:completionHandler:
  virtual void deleteItemWithIdentifier(const NSFileProviderItemIdentifier& identifier,
                                        ErrorCompletion completionHandler);
  // setLastUsedDate:forItemIdentifier:completionHandler:
  virtual void setLastUsedDate(std::optional<NSDate> date,
                               const NSFileProviderItemIdentifier& forItemIdentifier,
                               ItemCompletion completionHandler);
  // setTagData:forItemIdentifier:completionHandler:
  virtual void setTagData(std::optional<NSData> tagData,
                          const NSFileProviderItemIdentifier& forItemIdentifier,
                          ItemCompletion completionHandler);
  // setFavoriteRank:forItemIdentifier:completionHandler:
  virtual void setFavoriteRank(std::optional<std::int64_t> rank,
                               const NSFileProviderItemIdentifier& forItemIdentifier,
                               ItemCompletion completionHandler);

  // _defaultApplicationContainerForBundleIdentifier:completionHandler:
  virtual void _defaultApplicationContainerForBundleIdentifier(
      std::optional<std::string> bundleIdentifier, ItemCompletion completionHandler);

  // Thumbnails. Both answer at once with a progress that cancels the batch; never null.
  // fetchThumbnailsForItemIdentifiers:requestedSize:perThumbnailCompletionHandler:completionHandler:
  virtual std::shared_ptr<NSProgress> fetchThumbnailsForItemIdentifiers(
      const std::vector<NSFileProviderItemIdentifier>& identifiers, NSSize requestedSize,
      ThumbnailHandler perThumbnailCompletionHandler, ErrorCompletion completionHandler);
  // fetchThumbnailsForItemIdentifiers:requestedSize:perThumbnailCompletionHandlerWithType:completionHandler:
  virtual std::shared_ptr<NSProgress> fetchThumbnailsForItemIdentifiersWithType(
      const std::vector<NSFileProviderItemIdentifier>& identifiers, NSSize requestedSize,
      ThumbnailWithTypeHandler perThumbnailCompletionHandlerWithType,
      ErrorCompletion completionHandler);

  // supportedServiceSourcesForItemIdentifier:error: synchronous.
  virtual NSFileProviderServiceSources supportedServiceSourcesForItemIdentifier(
      const NSFileProviderItemIdentifier& identifier, NSErrorOut error);

 protected:
  // The superclass's half of construction. False without attributes: an extension that
  // no host started has nothing to serve, and its own construction must answer nil.
  bool init(std::shared_ptr<const NSExtensionAttributes> attributes);

 private:
  std::shared_ptr<const NSExtensionAttributes> _attributes;
};

}  // namespace skein
