// Removing for good: out of sight in one step, then deleted.
#include <cerrno>
#include <system_error>

#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"
#include "linux/vald/files/FileOperations.h"
#include "linux/vald/files/TreeRemoval.h"

namespace skein::vald {

namespace {

FileResult cancelledRemoval(const StorePlace& place, const std::string& name) {
  const bool isTaken = name != place.name;
  const std::string now = joinPath(place.folderPath(), name);
  return {isTaken ? now : "",
          fileErrorWithWords(NSUserCancelledError, ECANCELED,
                             "the removal was cancelled; " +
                                 std::string(isTaken ? "another item has the name now, so this one "
                                                       "is "
                                                     : "nothing is gone from ") +
                                 "\"" + printable(now) + "\"",
                             now)};
}

}  // namespace

FileResult FileOperations::remove(const std::string& path, const FileRequest& request) {
  StorePlace place;
  Hold hold;
  if (NSErrorPtr error = take(path, {path}, request, place, hold)) return {{}, error};
  const auto goesOn = [&] { return !request.progress || request.progress({}); };
  if (NSErrorPtr error = obstacleToRemoval(place.folder, place.name, place.path(), goesOn)) {
    return {{}, error};
  }
  bool again = false;
  FileResult result = removeAside(place, request, again);
  if (again) result = removeAside(place, request, again);
  return result;
}

FileResult FileOperations::removeAside(const StorePlace& place, const FileRequest& request,
                                       bool& again) {
  again = false;
  const std::string path = place.path();
  struct stat status {};
  const bool isFolder = place.folder.status(place.name, status) == 0 && S_ISDIR(status.st_mode);
  const auto aside = std::make_shared<StagingPlace>();
  if (NSErrorPtr error = _staging.place(kRemovalPrefix, place, *aside)) return {{}, error};
  const auto scope = std::make_shared<OperationScope>(*_journal, OperationKind::Remove, request,
                                                      path, std::string(), aside->path);
  if (NSErrorPtr error = scope->begin()) return {{}, error};

  int failure = _files.renameWithoutReplacing(place.folder.get(), place.name, aside->folder.get(),
                                              aside->name);
  if (failure == EXDEV && aside->outside) {
    _staging.refuseOutside(place);
    scope->discard();
    again = true;
    return {{}, fileError(failure, "can't remove", path)};
  }
  if (failure != 0) return {{}, fileError(failure, "can't remove", path)};
  std::string name;
  // Aside for good before the first part of it is deleted: a power cut shall not bring
  // half a tree back.
  failure = isAsked(request, aside->folder, aside->name) ? syncFolders(place.folder, &aside->folder)
                                                         : ESTALE;
  if (failure != 0) {
    if (putBackRemoved(*aside, place, name) != 0) scope->leaveOpen();
    return {{}, fileError(failure, "can't remove", path)};
  }
  if (request.removed && !request.removed()) {
    failure = putBackRemoved(*aside, place, name);
    if (failure == 0) return cancelledRemoval(place, name);
    VL_ERROR(_log, "[ERROR] can't put %@ back (%@), so it is removed", path,
             std::generic_category().message(failure));
  }

  if (NSErrorPtr error = scope->decide()) {
    if (putBackRemoved(*aside, place, name) != 0) scope->leaveOpen();
    return {{}, error};
  }
  // From here on it is removed; what cannot be deleted now is deleted at the next start.
  scope->leaveOpen();
  const int forgetting = removeTrashInfo(place);
  Task rest = [this, aside, scope, path, forgetting] {
    int problem = removeTree(_files, aside->folder, aside->name);
    if (problem == 0) problem = forgetting;
    if (problem == 0) return scope->done();
    VL_ERROR(_log,
             "[ERROR] removed %@, but can't delete all of %@ (%@); the next start tries again",
             path, aside->path, std::generic_category().message(problem));
  };
  if (isFolder && request.deleteLater) {
    request.deleteLater(std::move(rest));
  } else {
    rest();
  }
  return {};
}

int FileOperations::putBackRemoved(const StagingPlace& aside, const StorePlace& place,
                                   std::string& name) {
  name = aside.name;
  const int failure = putBack(aside.folder, name, place);
  // A disk that refuses this may forget in a power cut that it is back; it is, all the same.
  if (failure == 0) syncFolders(place.folder, &aside.folder);
  return failure;
}

}  // namespace skein::vald
