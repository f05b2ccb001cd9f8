#include "linux/host/DriveRequests.h"

namespace skein {

void DriveRequests::findIdentifier(HostTarget target, Reply<std::string, NSErrorPtr> reply) {
  withDrive<std::string>(std::move(reply), [self = shared_from_this(), target = std::move(target)](
                                               const Timed<std::string>& timed) {
    NSErrorPtr error;
    auto identifier = self->resolve(target, &error);
    (*timed)(std::move(identifier).value_or(""), std::move(error));
  });
}

std::optional<NSFileProviderItemIdentifier> DriveRequests::resolve(const HostTarget& target,
                                                                   NSErrorOut error) const {
  if (target.kind == HostTarget::Kind::Identifier) return target.text;
  return _paths.identifierForPath(target.text, error);
}

HostItem DriveRequests::place(NSFileProviderItemPtr item) const {
  HostItem placed;
  if (!item) return placed;
  const NSURLPtr url = extension().URLForItemWithPersistentIdentifier(item->itemIdentifier());
  if (url) placed.url = url->absoluteString();
  // By the folder, as the URL of an alias is its target's.
  const auto folder = _paths.pathForIdentifier(item->parentItemIdentifier(), nullptr);
  if (item->itemIdentifier() == NSFileProviderRootContainerItemIdentifier) {
    placed.path = "/";
  } else if (folder && !item->isTrashed()) {
    placed.path = (*folder == "/" ? "" : *folder) + '/' + item->filename();
  } else {
    placed.path = _paths.pathForURL(url).value_or("");
  }
  placed.item = std::move(item);
  return placed;
}

}  // namespace skein
