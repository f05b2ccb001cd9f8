#include "linux/framework/LocalFileOperations.h"

#include <unistd.h>

#include <cerrno>
#include <string_view>
#include <system_error>
#include <utility>

#include "linux/framework/FileCall.h"
#include "linux/framework/RequestProgress.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

// Whoever asked may look at it, and cancel it.
void followByRequest(std::shared_ptr<NSProgress> progress) {
  if (const auto current = RequestProgressScope::current()) current->follow(std::move(progress));
}

bool isAtOrBelow(const std::string& path, const std::string& folder) {
  if (!path.starts_with(folder)) return false;
  return folder == "/" || path.size() == folder.size() || path[folder.size()] == '/';
}

}  // namespace

LocalFileOperations::LocalFileOperations(DaemonAccess access, std::shared_ptr<DriveState> state)
    : _access(std::move(access)), _state(std::move(state)) {}

void LocalFileOperations::fp_importUnderFolder(const NSURLPtr& url, const NSURLPtr& folder,
                                               VLURLHandler completionHandler) {
  callFiles(_access, std::move(completionHandler),
            [&](LocalFiles& files, const RequestOrigin& origin, auto reply) {
              followByRequest(files.importDocument(url, folder, std::nullopt, origin, reply));
            });
}

void LocalFileOperations::fp_createSubFolder(const NSURLPtr& url, const std::string& name,
                                             VLURLHandler completionHandler) {
  callFiles(_access, std::move(completionHandler),
            [&](LocalFiles& files, const RequestOrigin& origin, auto reply) {
              files.createFolder(url, name, origin, reply);
            });
}

void LocalFileOperations::fp_renameWithNewName(const NSURLPtr& url, const std::string& newName,
                                               VLURLHandler completionHandler) {
  callFiles(_access, std::move(completionHandler),
            [&](LocalFiles& files, const RequestOrigin& origin, auto reply) {
              files.rename(url, newName, origin, reply);
            });
}

void LocalFileOperations::fp_reparentUnderFolder_withNewName(const NSURLPtr& url,
                                                             const NSURLPtr& folder,
                                                             std::optional<std::string> newName,
                                                             VLURLHandler completionHandler) {
  callFiles(_access, std::move(completionHandler),
            [&](LocalFiles& files, const RequestOrigin& origin, auto reply) {
              followByRequest(
                  files.move(url, folder, std::move(newName), /*bounce=*/false, origin, reply));
            });
}

void LocalFileOperations::fp_reparentUnderFolder_allowBouncing(const NSURLPtr& url,
                                                               const NSURLPtr& folder,
                                                               bool allowBouncing,
                                                               VLURLHandler completionHandler) {
  callFiles(_access, std::move(completionHandler),
            [&](LocalFiles& files, const RequestOrigin& origin, auto reply) {
              followByRequest(files.move(url, folder, std::nullopt, allowBouncing, origin, reply));
            });
}

void LocalFileOperations::fp_deleteWithCompletionHandler(
    const NSURLPtr& url, UniqueFunction<void(NSErrorPtr)> completionHandler) {
  callFiles(_access, std::move(completionHandler),
            [&](LocalFiles& files, const RequestOrigin& origin, auto reply) {
              followByRequest(files.remove(url, origin, reply));
            });
}

void LocalFileOperations::fp_coordinatedDeleteWithHandler(const NSURLPtr& url,
                                                          VLURLHandler handler) {
  auto [coordinated, error] =
      askFiles<NSURLPtr>(_access, [&](LocalFiles& files, const RequestOrigin&, auto reply) {
        files.coordinateDeletion(url, std::move(reply));
      });
  if (coordinated && url && url->isPhysical()) coordinated->attachPhysicalProperty();
  handler(std::move(coordinated), std::move(error));
}

std::uint64_t LocalFileOperations::vl_capabilityToMoveToURL(const NSURLPtr& url,
                                                            const NSURLPtr& toURL,
                                                            NSErrorOut error) {
  auto [capability, problem] =
      askFiles<std::uint64_t>(_access, [&](LocalFiles& files, const RequestOrigin&, auto reply) {
        files.capabilityToMove(url, toURL, std::move(reply));
      });
  if (problem) error.store(std::move(problem));
  return capability;
}

bool LocalFileOperations::vl_setTagNames(const NSURLPtr& url, const std::vector<std::string>& names,
                                         NSErrorOut error) {
  if (!url) return false;
  NSErrorPtr problem =
      askFilesForError(_access, [&](LocalFiles& files, const RequestOrigin&, auto reply) {
        files.setTagNames(url, names, std::move(reply));
      });
  if (!problem) return true;
  error.store(std::move(problem));
  return false;
}

LocalFileOperations::Physical LocalFileOperations::physical(const NSURLPtr& url) const {
  if (!url) return {};
  return askFiles<Physical>(_access,
                            [&](LocalFiles& files, const RequestOrigin&, auto reply) {
                              files.physicalURL(
                                  url, [reply = std::move(reply)](NSURLPtr there, bool isMarker,
                                                                  NSErrorPtr error) mutable {
                                    reply({std::move(there), isMarker}, std::move(error));
                                  });
                            })
      .first;
}

NSURLPtr LocalFileOperations::vl_physicalURL(const NSURLPtr& url) {
  NSURLPtr there = physical(url).url;
  if (there) there->attachPhysicalProperty();
  return there;
}

bool LocalFileOperations::vl_isPromiseURL(const NSURLPtr& url) { return physical(url).isMarker; }

std::shared_ptr<const VLContainer> LocalFileOperations::vl_vellumContainer(const NSURLPtr& url) {
  std::shared_ptr<const VLContainer> innermost;
  if (!url) return innermost;
  const auto containers = _state->containers();
  for (const auto& [id, container] : *containers) {
    const NSURLPtr& folder = container->documentsURL();
    if (!folder || !isAtOrBelow(url->path(), folder->path())) continue;
    if (!innermost || folder->path().size() > innermost->documentsURL()->path().size()) {
      innermost = container;
    }
  }
  return innermost;
}

bool LocalFileOperations::checkResourceIsReachable(const NSURLPtr& url, NSErrorOut error) {
  NSURLPtr there = url;
  if (url && url->isPhysical()) there = physical(url).url;
  int code = ENOENT;
  if (there) {
    if (::access(there->path().c_str(), F_OK) == 0) return true;
    code = errno;
  }
  error.store(vl_errorWithPOSIXCode(code, std::generic_category().message(code)));
  return false;
}

}  // namespace skein
