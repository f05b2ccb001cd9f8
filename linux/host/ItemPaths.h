#pragma once

#include <optional>
#include <string>

#include "platform/fileprovider/NSFileProviderExtension.h"
#include "vellum/VLContainer.h"

namespace skein {

// Paths as people type them, which begin at the drive's root, against the extension's
// identifiers and URLs. Everything is found through the extension's own lookups, never by
// looking at the disk; an app container, which is listed at the root although it lies
// elsewhere, is found by its name. Synchronous, may ask vald.
class ItemPaths {
 public:
  // Both outlive it.
  ItemPaths(NSFileProviderExtension& extension, VLContainers& containers)
      : _extension(extension), _containers(containers) {}

  // The path without doubled and trailing separators. Nil, with an error, for a path that
  // does not begin at the root or has a component "." or "..".
  static std::optional<std::string> normalised(const std::string& path, NSErrorOut error);

  // Nil with an error that says why: no such item, nobody logged in, vald unreachable.
  std::optional<NSFileProviderItemIdentifier> identifierForPath(const std::string& path,
                                                                NSErrorOut error) const;
  // Where the path lies, whether or not something is there; null with an error as above.
  NSURLPtr urlForPath(const std::string& path, NSErrorOut error) const;
  // Nil for a URL outside the drive, and for null.
  std::optional<std::string> pathForURL(const NSURLPtr& url) const;
  // Nil with an error as above.
  std::optional<std::string> pathForIdentifier(const NSFileProviderItemIdentifier& identifier,
                                               NSErrorOut error) const;

 private:
  NSErrorPtr errorForMissing(const std::string& what) const;
  std::optional<std::string> pathInContainer(const std::string& path) const;

  NSFileProviderExtension& _extension;
  VLContainers& _containers;
};

}  // namespace skein
