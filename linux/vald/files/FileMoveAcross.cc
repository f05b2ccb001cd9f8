// Moving between volumes. The copy is whole, on the disk and compared before the source leaves its
// place; the source is out of sight, on the disk too, before the copy appears; and nothing of it
// is deleted before the copy's place is on the disk. So a crash finds one of them whole:
//
//   the copy is staged            the source goes back, or is there; the copy is deleted
//   the copy is in its place      the source, out of sight, is what is left over, and deleted
#include <cerrno>
#include <system_error>

#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"
#include "linux/vald/files/FileOperations.h"
#include "linux/vald/files/TreeRemoval.h"

namespace skein::vald {

NSErrorPtr FileOperations::moveAcross(const StorePlace& from, const StorePlace& to,
                                      OperationKind kind, const FileRequest& request, bool& taken,
                                      bool& again) {
  const char* const doing = "can't move";
  const std::string path = from.path();
  const std::function<bool()> goesOn = [&] { return !request.progress || request.progress({}); };
  again = false;
  // It takes long to find that out by copying.
  if (to.folder.exists(to.name)) return fileError(EEXIST, doing, to.path());
  if (NSErrorPtr error = obstacleToRemoval(from.folder, from.name, path, goesOn)) return error;
  TreeCopy copy(_files, request.progress, TreeCopy::Purpose::Move);
  if (NSErrorPtr error = copy.measure(from.folder, from.name, path)) return error;
  StagingPlace staged;
  if (NSErrorPtr error = _staging.place(kImportPrefix, to, staged)) return error;
  OperationScope scope(*_journal, kind, request, path, to.path(), staged.path);
  if (NSErrorPtr error = scope.begin()) return error;

  NSErrorPtr error = copy.copy(from.folder, from.name, path, staged.folder, staged.name);
  if (!error) error = copy.sync(staged.folder, staged.name, path);
  TreeComparison comparison(goesOn);
  if (!error) error = comparison.compare(from.folder, from.name, path, staged.folder, staged.name);
  if (error) {
    discardStaged(staged, scope);
    return error;
  }

  std::string aside = Staging::sourceName(staged.path);
  if (request.leaves) request.leaves(to.path());
  int failure =
      _files.renameWithoutReplacing(from.folder.get(), from.name, from.folder.get(), aside);
  if (failure != 0) {
    // A rename of two steps may have come half of the way, and not back.
    if (from.folder.exists(aside)) {
      scope.leaveOpen();
    } else {
      discardStaged(staged, scope);
    }
    return fileError(failure, doing, path);
  }
  failure = isAsked(request, from.folder, aside) ? _files.sync(from.folder.get()) : ESTALE;
  if (failure == 0) failure = comparison.refusalOfSource(from.folder, aside);
  if (failure == 0 && !goesOn()) failure = ECANCELED;
  if (failure == 0) {
    failure =
        _files.renameWithoutReplacing(staged.folder.get(), staged.name, to.folder.get(), to.name);
    taken = failure == EEXIST;
    again = failure == EXDEV && staged.outside;
    if (again) _staging.refuseOutside(to);
    if (failure == 0 && (failure = _files.sync(to.folder.get())) != 0 &&
        _files.renameWithoutReplacing(to.folder.get(), to.name, staged.folder.get(), staged.name) !=
            0) {
      if (request.moved) request.moved(to.path(), true);
      scope.leaveOpen();
      return fileError(failure, "moved, but perhaps not for good,", to.path());
    }
  }
  if (failure != 0) {
    // Only when the source is surely back its copy goes.
    if (putBack(from.folder, aside, from) != 0 || _files.sync(from.folder.get()) != 0) {
      scope.leaveOpen();
      return fileError(failure, "can't move, and the next start puts back what is missing,", path);
    }
    if (taken || again) scope.discard();
    discardStaged(staged, scope);
    return fileError(failure, doing, taken ? to.path() : path);
  }

  if (request.moved) request.moved(to.path(), true);
  failure = removeTree(_files, from.folder, aside);
  if (failure == 0 && kind == OperationKind::PutBack) failure = removeTrashInfo(from);
  if (failure == 0) {
    scope.done();
  } else {
    scope.leaveOpen();
    VL_ERROR(_log, "[ERROR] moved %@, but can't delete %@ beside it (%@); the next start does",
             path, aside, std::generic_category().message(failure));
  }
  return nullptr;
}

std::optional<OperationState> FileOperations::recoverMoveAcross(const OperationEntry& entry) {
  StagingPlace staged;
  StorePlace from;
  StorePlace to;
  // While a volume is away nothing can be told.
  if (_staging.find(entry.aside, _roots, staged) || _roots.locate(entry.path, from) ||
      _roots.locate(entry.destination, to)) {
    return std::nullopt;
  }
  std::string aside = Staging::sourceName(entry.aside);
  const bool isCopyStaged = staged.folder.exists(staged.name);
  struct stat status {};
  struct stat other {};
  if (from.folder.status(aside, status) != 0) {
    if (!isCopyStaged) {
      const bool isMoved = !from.folder.exists(from.name) && to.folder.exists(to.name);
      if (!isMoved) return OperationState::Undone;
      return removeTrashInfo(from) == 0 ? std::optional(OperationState::Done) : std::nullopt;
    }
  } else if (isCopyStaged || !to.folder.exists(to.name)) {
    // A rename of two steps may have left the source both names.
    const bool isBoth = from.folder.status(from.name, other) == 0 &&
                        other.st_ino == status.st_ino && other.st_dev == status.st_dev;
    int failure =
        isBoth ? _files.unlink(from.folder.get(), aside) : putBack(from.folder, aside, from);
    if (failure == 0) failure = _files.sync(from.folder.get());
    if (failure != 0) return std::nullopt;
  } else {
    if (removeTree(_files, from.folder, aside) != 0 || removeTrashInfo(from) != 0) {
      return std::nullopt;
    }
    return OperationState::Done;
  }
  return removeTree(_files, staged.folder, staged.name) == 0 ? std::optional(OperationState::Undone)
                                                             : std::nullopt;
}

}  // namespace skein::vald
