#include "platform/fileprovider/NSFileProviderError.h"

namespace skein {

NSErrorPtr fileProviderErrorForNonExistentItemWithIdentifier(
    const std::optional<NSFileProviderItemIdentifier>& identifier) {
  NSErrorUserInfo userInfo;
  if (identifier) userInfo[NSFileProviderErrorNonExistentItemIdentifierKey] = *identifier;
  return NSError::errorWithDomain(NSFileProviderErrorDomain, NSFileProviderErrorNoSuchItem,
                                  std::move(userInfo));
}

NSErrorPtr fileProviderErrorForCollisionWithItem(NSFileProviderItemPtr item) {
  return NSError::errorWithDomain(NSFileProviderErrorDomain, NSFileProviderErrorFilenameCollision,
                                  {{NSFileProviderErrorCollidingItemKey, std::move(item)}});
}

NSURLPtr fp_collidingURL(const NSErrorPtr& error) {
  if (!error) return nullptr;
  const auto found = error->userInfo().find(NSURLErrorKey);
  if (found == error->userInfo().end()) return nullptr;
  const auto* url = std::get_if<NSURLPtr>(&found->second);
  return url != nullptr ? *url : nullptr;
}

}  // namespace skein
