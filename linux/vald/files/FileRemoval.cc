// Removing for good: out of sight in one step, then deleted.
#include <cerrno>
#include <system_error>

#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"
#include "linux/vald/files/FileOperations.h"
#include "linux/vald/files/TreeRemoval.h"

namespace skein::vald {

FileResult FileOperations::remove(const std::string& path, const FileRequest& request) {
  StorePlace place;
  Hold hold;
  if (NSErrorPtr error = take(path, {path}, place, hold)) return {{}, error};
  if (NSErrorPtr error = obstacleToRemoval(place.folder, place.name, place.path())) {
    return {{}, error};
  }
  bool again = false;
  NSErrorPtr error = removeAside(place, request, again);
  if (again) error = removeAside(place, request, again);
  return {{}, error};
}

NSErrorPtr FileOperations::removeAside(const StorePlace& place, const FileRequest& request,
                                       bool& again) {
  again = false;
  const std::string path = place.path();
  StagingPlace aside;
  if (NSErrorPtr error = _staging.place(kRemovalPrefix, place, aside)) return error;
  OperationScope scope(*_journal, OperationKind::Remove, request, path, {}, aside.path);
  if (NSErrorPtr error = scope.begin()) return error;

  int failure =
      _files.renameWithoutReplacing(place.folder.get(), place.name, aside.folder.get(), aside.name);
  if (failure == EXDEV && aside.outside) {
    _staging.refuseOutside(place);
    scope.discard();
    again = true;
    return fileError(failure, "can't remove", path);
  }
  // Gone for good before the first part of it is deleted: a power cut shall not bring
  // half a tree back.
  if (failure == 0 && (failure = syncFolders(place.folder, &aside.folder)) != 0) {
    if (_files.renameWithoutReplacing(aside.folder.get(), aside.name, place.folder.get(),
                                      place.name) != 0) {
      scope.leaveOpen();
    }
  }
  if (failure != 0) return fileError(failure, "can't remove", path);

  // From here on it is removed; what cannot be deleted now is deleted at the next start.
  failure = removeTree(_files, aside.folder, aside.name);
  if (const int forgetting = removeTrashInfo(place)) failure = forgetting;
  if (failure != 0) {
    VL_ERROR(_log,
             "[ERROR] removed %@, but can't delete all of %@ (%@); the next start tries again",
             path, aside.path, std::generic_category().message(failure));
    scope.leaveOpen();
    return nullptr;
  }
  scope.done();
  return nullptr;
}

}  // namespace skein::vald
