#include "linux/host/ItemPaths.h"

#include <string_view>

#include "platform/fileprovider/NSFileProviderError.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

bool isOwnContainer(const std::string& containerID) {
  return containerID == VLUbiquitousDefaultContainerID ||
         containerID == VLUbiquitousDocumentsContainerID ||
         containerID == VLUbiquitousDesktopContainerID;
}

// What follows `folder` in `path`, separator included; empty for the folder itself.
std::optional<std::string> below(const std::string& path, const std::string& folder) {
  if (folder == "/") return path == "/" ? "" : path;
  if (!path.starts_with(folder)) return std::nullopt;
  if (path.size() > folder.size() && path[folder.size()] != '/') return std::nullopt;
  return path.substr(folder.size());
}

}  // namespace

std::optional<std::string> ItemPaths::normalised(const std::string& path, NSErrorOut error) {
  std::string result;
  bool allowed = path.starts_with('/') && path.find('\0') == std::string::npos;
  for (std::size_t at = 0; allowed && at < path.size();) {
    const std::size_t start = path.find_first_not_of('/', at);
    if (start == std::string::npos) break;
    const std::size_t end = std::min(path.find('/', start), path.size());
    const std::string_view component = std::string_view(path).substr(start, end - start);
    allowed = component != "." && component != "..";
    result += '/';
    result += component;
    at = end;
  }
  if (!allowed) {
    error.store(vlc_errorInvalidParameter("path", path));
    return std::nullopt;
  }
  return result.empty() ? "/" : result;
}

std::optional<NSFileProviderItemIdentifier> ItemPaths::identifierForPath(const std::string& path,
                                                                         NSErrorOut error) const {
  const auto wanted = normalised(path, error);
  if (!wanted) return std::nullopt;
  if (*wanted == "/") return NSFileProviderRootContainerItemIdentifier;
  const NSURLPtr root =
      _extension.URLForItemWithPersistentIdentifier(NSFileProviderRootContainerItemIdentifier);
  if (root) {
    const std::string base = root->path() == "/" ? "" : root->path();
    auto identifier =
        _extension.persistentIdentifierForItemAtURL(NSURL::fileURLWithPath(base + *wanted));
    if (identifier) return identifier;
    if (const auto elsewhere = pathInContainer(*wanted)) {
      auto inContainer =
          _extension.persistentIdentifierForItemAtURL(NSURL::fileURLWithPath(*elsewhere));
      if (inContainer) return inContainer;
    }
  }
  error.store(errorForMissing(*wanted));
  return std::nullopt;
}

NSURLPtr ItemPaths::urlForPath(const std::string& path, NSErrorOut error) const {
  const auto wanted = normalised(path, error);
  if (!wanted) return nullptr;
  if (const auto elsewhere = pathInContainer(*wanted)) return NSURL::fileURLWithPath(*elsewhere);
  NSURLPtr root =
      _extension.URLForItemWithPersistentIdentifier(NSFileProviderRootContainerItemIdentifier);
  if (!root) {
    error.store(errorForMissing(*wanted));
    return nullptr;
  }
  if (*wanted == "/") return root;
  return NSURL::fileURLWithPath((root->path() == "/" ? "" : root->path()) + *wanted);
}

std::optional<std::string> ItemPaths::pathInContainer(const std::string& path) const {
  for (const auto& [containerID, container] : _containers.allContainersByContainerID()) {
    if (isOwnContainer(containerID) || !container->documentsURL()) continue;
    if (const auto rest = below(path, '/' + container->displayName())) {
      return container->documentsURL()->path() + *rest;
    }
  }
  return std::nullopt;
}

std::optional<std::string> ItemPaths::pathForURL(const NSURLPtr& url) const {
  if (!url) return std::nullopt;
  const NSURLPtr root =
      _extension.URLForItemWithPersistentIdentifier(NSFileProviderRootContainerItemIdentifier);
  if (!root) return std::nullopt;
  if (auto rest = below(url->path(), root->path())) return rest->empty() ? "/" : *rest;
  for (const auto& [containerID, container] : _containers.allContainersByContainerID()) {
    if (isOwnContainer(containerID) || !container->documentsURL()) continue;
    if (const auto rest = below(url->path(), container->documentsURL()->path())) {
      return '/' + container->displayName() + *rest;
    }
  }
  return std::nullopt;
}

std::optional<std::string> ItemPaths::pathForIdentifier(
    const NSFileProviderItemIdentifier& identifier, NSErrorOut error) const {
  if (auto path = pathForURL(_extension.URLForItemWithPersistentIdentifier(identifier))) {
    return path;
  }
  error.store(errorForMissing(identifier));
  return std::nullopt;
}

// The lookups answer nil without saying why. Asking for the root's item tells whether
// there is a drive to look in at all.
NSErrorPtr ItemPaths::errorForMissing(const std::string& what) const {
  NSErrorPtr error;
  _extension.itemForIdentifier(NSFileProviderRootContainerItemIdentifier, &error);
  if (error) return error;
  return NSError::errorWithDomain(NSFileProviderErrorDomain, NSFileProviderErrorNoSuchItem,
                                  {{NSLocalizedDescriptionKey, "There is no item " + what}});
}

}  // namespace skein
