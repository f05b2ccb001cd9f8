#include "linux/framework/LocalResourceValues.h"

#include <utility>

namespace skein {

VLQueryItemPtr LocalResourceValues::itemAt(const NSURLPtr& url, NSErrorOut error) {
  if (!url) return nullptr;
  auto [item, problem] = askDaemon<VLQueryItemPtr>(_access, [&](LocalDaemon& daemon, auto reply) {
    daemon.queryItemForURL(url, false, std::move(reply));
  });
  if (!item) error.store(std::move(problem));
  return item;
}

std::optional<bool> LocalResourceValues::getResourceValue(const NSURLPtr& url,
                                                          std::string_view forKey,
                                                          NSErrorOut error) {
  if (forKey != NSURLIsAliasFileKey && forKey != NSURLUbiquitousItemIsSharedKey) {
    return std::nullopt;
  }
  const VLQueryItemPtr item = itemAt(url, error);
  if (!item) return std::nullopt;
  if (forKey == NSURLUbiquitousItemIsSharedKey) return item->isShared();
  return item->properties().kind == VLQueryItem::Kind::Alias;
}

std::optional<bool> LocalResourceValues::getPromisedItemResourceValue(const NSURLPtr& url,
                                                                      std::string_view forKey,
                                                                      NSErrorOut error) {
  return getResourceValue(url, forKey, error);
}

std::optional<std::string> LocalResourceValues::vl_typeIdentifierWithError(const NSURLPtr& url,
                                                                           NSErrorOut error) {
  const VLQueryItemPtr item = itemAt(url, error);
  return item ? item->typeIdentifier() : std::nullopt;
}

}  // namespace skein
