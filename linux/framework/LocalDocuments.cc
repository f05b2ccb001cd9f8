#include "linux/framework/LocalDocuments.h"

#include <sys/stat.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <string_view>
#include <utility>

#include "linux/framework/DocumentURLScope.h"
#include "linux/protocol/DocumentURL.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

bool isAtOrBelow(std::string_view path, std::string_view folder) {
  if (!path.starts_with(folder)) return false;
  return folder == "/" || path.size() == folder.size() || path[folder.size()] == '/';
}

bool leadsElsewhere(const std::string& path) {
  const std::string closed = path + '/';
  return closed.find("/./") != std::string::npos || closed.find("/../") != std::string::npos;
}

NSErrorPtr noSuchFile(const NSURLPtr& url, int code) {
  NSErrorUserInfo userInfo{
      {NSLocalizedDescriptionKey, url->path() + " leads to no file: " + std::strerror(code) + "."},
      {NSURLErrorKey, url},
      {NSUnderlyingErrorKey, vl_errorWithPOSIXCode(code, std::strerror(code))}};
  return NSError::errorWithDomain(NSCocoaErrorDomain, NSFileNoSuchFileError, std::move(userInfo));
}

}  // namespace

LocalDocuments::LocalDocuments(DaemonAccess access, std::shared_ptr<DriveState> state)
    : _access(std::move(access)), _state(std::move(state)) {}

NSURLPtr LocalDocuments::vl_documentURLFromFileObjectID(const VLFileObjectID& fileObjectID,
                                                        NSErrorOut error) {
  if (NSURLPtr known = DocumentURLScope::find(fileObjectID)) return known;
  auto [url, problem] = askDaemon<NSURLPtr>(_access, [&](LocalDaemon& daemon, auto reply) {
    daemon.URLForFileObjectID(fileObjectID, std::move(reply));
  });
  if (!url && problem) error.store(std::move(problem));
  return url ? documentURL(url->path(), fileObjectID) : nullptr;
}

bool LocalDocuments::vl_isInSyncedLocation(const NSURLPtr& url) {
  if (!url || leadsElsewhere(url->path())) return false;
  const auto containers = _state->containers();
  for (const auto& [id, container] : *containers) {
    const NSURLPtr& folder = container->documentsURL();
    if (folder && isAtOrBelow(url->path(), folder->path())) return true;
  }
  return false;
}

bool LocalDocuments::vl_isExternalDocumentReference(const NSURLPtr& url) {
  struct stat status {};
  return url && lstat(url->path().c_str(), &status) == 0 && S_ISLNK(status.st_mode);
}

NSURLPtr LocalDocuments::vl_URLByResolvingExternalDocumentReferenceWithError(const NSURLPtr& url,
                                                                             NSErrorOut error) {
  if (!url) return nullptr;
  const std::unique_ptr<char, decltype(&std::free)> target(realpath(url->path().c_str(), nullptr),
                                                           &std::free);
  if (target == nullptr) {
    error.store(noSuchFile(url, errno));
    return nullptr;
  }
  return NSURL::fileURLWithPath(target.get());
}

void LocalDocuments::vl_addPhysicalProperty(const NSURLPtr& url) {
  if (url) url->attachPhysicalProperty();
}

std::optional<std::string> LocalDocuments::vl_containerIDIfIsDocumentsContainerURL(
    const NSURLPtr& url) {
  if (!url) return std::nullopt;
  const auto containers = _state->containers();
  for (const auto& [id, container] : *containers) {
    // The default container's folder is the drive's root, a folder like any other.
    if (id != VLUbiquitousDefaultContainerID && isEqualURL(container->documentsURL(), url)) {
      return id;
    }
  }
  return std::nullopt;
}

}  // namespace skein
