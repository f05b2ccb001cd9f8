// Renaming and moving, and the rule that says which moves there are.
#include <algorithm>
#include <cerrno>

#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"
#include "linux/vald/files/FileOperations.h"
#include "linux/vald/files/TrashInfo.h"

namespace skein::vald {
namespace {

constexpr unsigned kMostBounces = 10'000;

NSErrorPtr refused(const std::string& words, const std::string& path) {
  return fileErrorWithWords(NSFileWriteNoPermissionError, EACCES,
                            "can't move \"" + printable(path) + "\": " + words, path);
}

// Whether a rename cannot go from one to the other.
bool isAcross(const StorePlace& from, const StorePlace& to) {
  struct stat one {};
  struct stat other {};
  return from.folder.mountOf() != to.folder.mountOf() ||
         (from.folder.status(one) == 0 && to.folder.status(other) == 0 &&
          one.st_dev != other.st_dev);
}

bool isOnRootsVolume(const StorePlace& place) {
  struct stat root {};
  struct stat folder {};
  return place.root->folder.status(root) == 0 && place.folder.status(folder) == 0 &&
         root.st_dev == folder.st_dev;
}

bool isOneFile(const StorePlace& one, const StorePlace& other) {
  struct stat first {};
  struct stat second {};
  return one.folder.status(one.name, first) == 0 && other.folder.status(other.name, second) == 0 &&
         first.st_dev == second.st_dev && first.st_ino == second.st_ino;
}

}  // namespace

NSErrorPtr FileOperations::refusalOfMove(const StorePlace& from, const std::string& folder,
                                         const std::string& name, StorePlace& to,
                                         std::uint64_t& capability) const {
  capability = 0;
  const std::string path = from.path();
  const auto trashed = trashedPath(from.relative);
  if (from.isRoot()) return refused("it is the drive's own folder", path);
  if (trashed && trashed->name.empty()) return refused("it belongs to the trash itself", path);
  if (!_roots.contains(folder)) return refused("the folder is not in the drive", path);
  if (isAtOrBelow(folder, path)) return refused("a folder can't go into itself", path);
  if (NSErrorPtr error = _roots.locate(folder, name, to)) return error;
  if (trashedPath(to.relative)) {
    return refused("into the trash things go by trashing them alone", path);
  }
  struct stat status {};
  if (const int failure = from.folder.status(from.name, status)) {
    return fileError(failure, "can't find", path);
  }
  if (from.folder.mountOf(from.name) != from.folder.mountOf()) {
    return refused("a volume is mounted there", path);
  }
  if (isAcross(from, to) && !(isOnRootsVolume(from) && isOnRootsVolume(to))) {
    return refused("a volume that is mounted in the drive is no part of it", path);
  }
  if (trashed) {
    capability = kMayMoveOutOfTrash;
  } else if (from.root != to.root) {
    capability = kMayMoveToAnotherRoot;
  } else {
    capability = from.folderRelative == to.folderRelative ? kMayRename : kMayMoveToAnotherFolder;
  }
  return nullptr;
}

std::uint64_t FileOperations::capabilityToMove(const std::string& path, const std::string& to,
                                               NSErrorOut error) const {
  StorePlace from;
  StorePlace place;
  std::uint64_t capability = 0;
  NSErrorPtr failure = _roots.locate(path, from);
  if (!failure) {
    failure = refusalOfMove(from, parentOfPath(to), nameOfPath(to), place, capability);
  }
  if (failure) error.store(failure);
  return capability;
}

bool FileOperations::crossesVolumes(const std::string& path, const std::string& folder) const {
  StorePlace from;
  StorePlace to;
  return !_roots.locate(path, from) && !_roots.locate(joinPath(folder, nameOfPath(path)), to) &&
         isAcross(from, to);
}

FileResult FileOperations::rename(const std::string& path, const std::string& newName,
                                  const FileRequest& request) {
  StorePlace from;
  Hold hold;
  // The name first: what cannot be is refused before anything is waited for.
  if (NSErrorPtr error = refusalOfName(newName, false)) return {{}, error};
  const std::string newPath = joinPath(parentOfPath(path), newName);
  if (NSErrorPtr error = take(path, {path, newPath}, request, from, hold)) return {{}, error};
  if (trashedPath(from.relative)) {
    return {{}, refused("it is in the trash; put it back first", path)};
  }
  return moveTo(from, from.folderPath(), newName, false, OperationKind::Rename, request);
}

FileResult FileOperations::move(const std::string& path, const std::string& folder,
                                const std::optional<std::string>& newName, bool bounce,
                                const FileRequest& request) {
  if (newName) {
    if (NSErrorPtr error = refusalOfName(*newName, false)) return {{}, error};
  }
  std::string name = newName.value_or(nameOfPath(path));
  StorePlace from;
  Hold hold;
  if (NSErrorPtr error = take(path, {path, joinPath(folder, name)}, request, from, hold)) {
    return {{}, error};
  }
  OperationKind kind = OperationKind::Move;
  const auto trashed = trashedPath(from.relative);
  if (trashed && trashed->below.empty()) {
    kind = OperationKind::PutBack;
    // In the trash it may have had to be called otherwise.
    const FileResult before = putBackPath(from.path());
    if (!newName && !before.error) name = nameOfPath(before.path);
  }
  return moveTo(from, folder, name, bounce, kind, request);
}

FileResult FileOperations::moveTo(const StorePlace& from, const std::string& folder,
                                  const std::string& name, bool bounce, OperationKind kind,
                                  const FileRequest& request) {
  StorePlace to;
  NSErrorPtr error;
  for (unsigned number = 1; number <= (bounce ? kMostBounces : 1); ++number) {
    std::uint64_t capability = 0;
    error = refusalOfMove(from, folder, numberedName(name, number, ' '), to, capability);
    if (error) return {{}, error};
    if (from.path() == to.path()) return {to.path(), nullptr};
    bool taken = to.folder.exists(to.name) ? bounce : isTakenByAnother(from, to);
    if (!taken && isAcross(from, to)) {
      bool again = false;
      error = moveAcross(from, to, kind, request, taken, again);
      if (again) error = moveAcross(from, to, kind, request, taken, again);
    } else if (!taken) {
      error = moveOnce(from, to, kind, request, taken);
    }
    if (!taken) break;
    error = fileError(EEXIST, "can't move it to", to.path());
  }
  return error ? FileResult{{}, error} : FileResult{to.path(), nullptr};
}

bool FileOperations::isTakenByAnother(const StorePlace& from, const StorePlace& to) const {
  if (!isTaken(to)) return false;
  const auto names = _options.otherNames(to.name);
  return from.folderPath() != to.folderPath() ||
         std::find(names.begin(), names.end(), from.name) == names.end();
}

int FileOperations::renameItem(const StorePlace& from, const StorePlace& to) {
  const int failure =
      _files.renameWithoutReplacing(from.folder.get(), from.name, to.folder.get(), to.name);
  if (failure != EEXIST || from.folderRelative != to.folderRelative || from.root != to.root) {
    return failure;
  }
  // Where case is folded, a new spelling of the same name finds the item itself.
  if (!isOneFile(from, to) || to.folder.lists(to.name)) return failure;
  return _files.renameOver(from.folder.get(), from.name, to.folder.get(), to.name);
}

NSErrorPtr FileOperations::moveOnce(const StorePlace& from, const StorePlace& to,
                                    OperationKind kind, const FileRequest& request, bool& taken) {
  const char* const doing = kind == OperationKind::Rename ? "can't rename" : "can't move";
  OperationScope scope(*_journal, kind, request, from.path(), to.path());
  if (NSErrorPtr error = scope.begin()) return error;
  int failure = renameItem(from, to);
  if (failure == EEXIST) {
    taken = true;
    scope.discard();
    return fileError(EEXIST, doing, to.path());
  }
  if (failure != 0) {
    // A rename of two steps may have come half of the way, and not back.
    if (isOneFile(from, to)) scope.leaveOpen();
    return fileError(failure, doing, from.path());
  }
  if (isAsked(request, to.folder, to.name)) {
    if (request.moved) request.moved(to.path(), false);
    failure = syncFolders(to.folder, &from.folder);
  } else {
    failure = ESTALE;
  }
  if (failure != 0) {
    std::string name = to.name;
    if (putBack(to.folder, name, from) == 0) return fileError(failure, doing, from.path());
    scope.leaveOpen();
    return fileError(failure, "moved, but perhaps not for good,", to.path());
  }
  scope.done();
  if (kind == OperationKind::PutBack && removeTrashInfo(from) != 0) {
    // It is back; that the trash forgets it is finished at the next start.
    scope.leaveOpen();
  }
  return nullptr;
}

}  // namespace skein::vald
