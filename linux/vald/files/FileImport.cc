// Bringing a document, or a tree of them, into the store.
#include <cerrno>
#include <filesystem>
#include <system_error>

#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"
#include "linux/vald/files/FileOperations.h"
#include "linux/vald/files/TreeRemoval.h"

namespace skein::vald {
namespace {

// Whether the destination lies in what is brought in, links resolved: such a copy would
// hold itself.
bool holdsDestination(const std::string& source, const std::string& folder) {
  std::error_code failed;
  const auto from = std::filesystem::canonical(source, failed);
  if (failed) return false;
  const auto to = std::filesystem::canonical(folder, failed);
  return !failed && isAtOrBelow(to.native(), from.native());
}

}  // namespace

FileResult FileOperations::importDocument(const std::string& source, const std::string& folder,
                                          const std::optional<std::string>& name,
                                          const FileRequest& request) {
  std::string path = source;
  while (path.size() > 1 && path.back() == '/') path.pop_back();
  const std::string sourceName = nameOfPath(path);
  if (path.empty() || path.front() != '/' || sourceName.empty() || sourceName == "." ||
      sourceName == ".." || path.find('\0') != std::string::npos) {
    return {{},
            fileErrorWithWords(NSFileWriteInvalidFileNameError, EINVAL,
                               "can't bring in \"" + printable(source) +
                                   "\": the absolute path of a file or folder is needed",
                               source)};
  }
  StorePlace place;
  Hold hold;
  if (NSErrorPtr error = takeNew(folder, name.value_or(sourceName), place, hold)) {
    return {{}, error};
  }
  DirectoryHandle from;
  const std::string parent = parentOfPath(path);
  if (const int failure = DirectoryHandle::openRoot(parent.empty() ? "/" : parent, from)) {
    return {{}, fileError(failure, "can't read", path)};
  }
  struct stat status {};
  if (from.status(sourceName, status) == 0 && S_ISDIR(status.st_mode) &&
      holdsDestination(path, folder)) {
    return {{},
            fileErrorWithWords(NSFileWriteNoPermissionError, EACCES,
                               "can't bring \"" + printable(path) +
                                   "\" into itself; choose a folder outside of it",
                               path)};
  }
  bool again = false;
  NSErrorPtr error = stageAndPlace(from, path, place, request, again);
  if (again) error = stageAndPlace(from, path, place, request, again);
  return error ? FileResult{{}, error} : FileResult{place.path(), nullptr};
}

NSErrorPtr FileOperations::stageAndPlace(const DirectoryHandle& from, const std::string& source,
                                         const StorePlace& place, const FileRequest& request,
                                         bool& again) {
  again = false;
  const std::string name = nameOfPath(source);
  TreeCopy copy(_files, request.progress);
  StagingPlace staged;
  if (NSErrorPtr error = copy.measure(from, name, source)) return error;
  if (NSErrorPtr error = _staging.place(kImportPrefix, place, staged)) return error;
  OperationScope scope(*_journal, OperationKind::Import, request, source, place.path(),
                       staged.path);
  if (NSErrorPtr error = scope.begin()) return error;

  NSErrorPtr error = copy.copy(from, name, source, staged.folder, staged.name);
  if (!error) error = copy.sync(staged.folder, staged.name, source);
  if (error) {
    discardStaged(staged, scope);
    return error;
  }
  int failure = _files.renameWithoutReplacing(staged.folder.get(), staged.name, place.folder.get(),
                                              place.name);
  if (failure == EXDEV && staged.outside) {
    _staging.refuseOutside(place);
    again = true;
  } else if (failure == 0 && (failure = _files.sync(place.folder.get())) != 0) {
    // Not known to be on the disk: back to where it can be taken away.
    if (_files.renameWithoutReplacing(place.folder.get(), place.name, staged.folder.get(),
                                      staged.name) != 0) {
      scope.leaveOpen();
      return fileError(failure, "brought in, but perhaps not for good,", place.path());
    }
  }
  if (failure == 0) {
    scope.done();
    return nullptr;
  }
  if (again) scope.discard();
  discardStaged(staged, scope);
  return fileError(failure, "can't bring in", failure == EEXIST ? place.path() : source);
}

void FileOperations::discardStaged(const StagingPlace& staged, OperationScope& scope) {
  const int failure = removeTree(_files, staged.folder, staged.name);
  if (failure == 0) return;
  VL_ERROR(_log, "[ERROR] can't remove %@ (%@); the next start tries again", staged.path,
           std::generic_category().message(failure));
  scope.leaveOpen();
}

}  // namespace skein::vald
