// The trash at a root's top, as every desktop lays it out, so that other tools see what
// we trash and we what they do.
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"
#include "linux/vald/files/FileOperations.h"
#include "linux/vald/files/TrashInfo.h"

namespace skein::vald {
namespace {

constexpr unsigned kMostTrashNames = 100'000;
constexpr off_t kLongestInfo = 64 << 10;

// A folder of the trash: made when missing; never a link, and nobody else's.
int openOwnFolder(FileLayer& files, const DirectoryHandle& in, const std::string& name,
                  DirectoryHandle& folder) {
  int failure = files.makeFolder(in.get(), name, 0700);
  if (failure != 0 && failure != EEXIST) return failure;
  if ((failure = in.openFolder(name, folder)) != 0) return failure;
  struct stat status {};
  if ((failure = folder.status(status)) != 0) return failure;
  return status.st_uid == ::geteuid() ? 0 : EACCES;
}

int readInfo(const DirectoryHandle& folder, const std::string& name, std::string& text) {
  FileDescriptor file;
  struct stat status {};
  int failure = folder.openFile(name, file);
  if (failure == 0 && ::fstat(file.get(), &status) != 0) failure = errno;
  if (failure == 0 && (!S_ISREG(status.st_mode) || status.st_size > kLongestInfo)) failure = EINVAL;
  if (failure != 0) return failure;
  text.resize(static_cast<std::size_t>(status.st_size));
  const ssize_t got = ::pread(file.get(), text.data(), text.size(), 0);
  if (got < 0) return errno;
  text.resize(static_cast<std::size_t>(got));
  return 0;
}

}  // namespace

NSErrorPtr FileOperations::openTrash(const OpenRoot& root, DirectoryHandle& files,
                                     DirectoryHandle& info) {
  const std::string name = trashFolderName(::geteuid());
  DirectoryHandle trash;
  int failure = openOwnFolder(_files, root.folder, name, trash);
  if (failure == 0) failure = openOwnFolder(_files, trash, "files", files);
  if (failure == 0) failure = openOwnFolder(_files, trash, "info", info);
  return failure == 0 ? nullptr
                      : fileError(failure, "can't open the trash", joinPath(root.path, name));
}

FileResult FileOperations::trash(const std::string& path, const FileRequest& request) {
  StorePlace place;
  Hold hold;
  if (NSErrorPtr error = take(path, {path}, request, place, hold)) return {{}, error};
  if (trashedPath(place.relative)) {
    return {{},
            fileErrorWithWords(NSFileWriteNoPermissionError, EACCES,
                               "\"" + printable(path) + "\" is in the trash already", path)};
  }
  FileResult result = trashAt(place, request);
  // On a full disk the trash's note of it needs what is kept for the journal's.
  struct stat folder {};
  while (result.error && result.error->code() == NSFileWriteOutOfSpaceError &&
         place.folder.status(folder) == 0 && place.folder.exists(place.name) &&
         _journal->makeRoom(folder.st_dev)) {
    result = trashAt(place, request);
  }
  return result;
}

FileResult FileOperations::trashAt(const StorePlace& place, const FileRequest& request) {
  DirectoryHandle files;
  DirectoryHandle info;
  if (NSErrorPtr error = openTrash(*place.root, files, info)) return {{}, error};
  for (unsigned number = 1; number <= kMostTrashNames; ++number) {
    const std::string name = numberedName(place.name, number, '.', std::strlen(kTrashInfoSuffix));
    if (files.exists(name) || info.exists(name + kTrashInfoSuffix)) continue;
    bool taken = false;
    NSErrorPtr error = trashAs(place, name, files, info, request, taken);
    if (taken) continue;
    if (error) return {{}, error};
    const std::string folder = joinPath(place.root->path, trashFolderName(::geteuid()));
    return {joinPath(joinPath(folder, "files"), name), nullptr};
  }
  return {{},
          fileError(EEXIST, "there are too many of the same name in the trash for", place.path())};
}

NSErrorPtr FileOperations::trashAs(const StorePlace& place, const std::string& name,
                                   const DirectoryHandle& trashed, const DirectoryHandle& info,
                                   const FileRequest& request, bool& taken) {
  const std::string path = place.path();
  const std::string infoName = name + kTrashInfoSuffix;
  const std::string folder = joinPath(place.root->path, trashFolderName(::geteuid()));
  OperationScope scope(*_journal, OperationKind::Trash, request, path,
                       joinPath(joinPath(folder, "files"), name));
  if (NSErrorPtr error = scope.begin()) return error;

  // The info first, and new: it reserves the name among all tools.
  FileDescriptor file;
  int failure = _files.createFile(info.get(), infoName, 0600, file);
  if (failure == EEXIST) {
    taken = true;
    scope.discard();
    return nullptr;
  }
  if (failure != 0) return fileError(failure, "can't trash", path);
  const std::time_t now = std::chrono::system_clock::to_time_t(
      std::chrono::time_point_cast<std::chrono::system_clock::duration>(scope.entry().when));
  failure = _files.write(file.get(), trashInfoText({place.relative, localDeletionDate(now)}));
  if (failure == 0) failure = _files.sync(file.get());
  if (failure == 0) failure = _files.sync(info.get());
  if (failure == 0) {
    failure = _files.renameWithoutReplacing(place.folder.get(), place.name, trashed.get(), name);
    taken = failure == EEXIST;
  }
  if (failure == 0) {
    failure = isAsked(request, trashed, name) ? syncFolders(trashed, &place.folder) : ESTALE;
    if (failure == 0) {
      scope.done();
      return nullptr;
    }
    std::string now = name;
    if (putBack(trashed, now, place) != 0) {
      scope.leaveOpen();
      return fileError(failure, "trashed, but perhaps not for good,", path);
    }
  }
  if (taken) scope.discard();
  if (_files.unlink(info.get(), infoName) != 0) scope.leaveOpen();
  return fileError(failure, "can't trash", path);
}

int FileOperations::readTrashInfo(const StorePlace& place, const TrashedPath& trashed,
                                  std::optional<TrashInfo>& info) const {
  DirectoryHandle folder;
  std::string text;
  int failure = place.root->folder.openFolder(joinPath(trashed.trash, "info"), folder);
  if (failure == 0) failure = readInfo(folder, trashed.name + kTrashInfoSuffix, text);
  if (failure == 0) info = parseTrashInfo(text);
  return failure;
}

std::optional<TrashInfo> FileOperations::trashInfo(const std::string& path) const {
  StorePlace place;
  std::optional<TrashInfo> info;
  if (_roots.locate(path, place)) return info;
  const auto trashed = trashedPath(place.relative);
  if (trashed && !trashed->name.empty()) readTrashInfo(place, *trashed, info);
  return info;
}

FileResult FileOperations::putBackPath(const std::string& path) const {
  StorePlace place;
  if (NSErrorPtr error = _roots.locate(path, place)) return {{}, error};
  const auto trashed = trashedPath(place.relative);
  if (!trashed || trashed->name.empty()) {
    return {{},
            fileErrorWithWords(NSFileNoSuchFileError, ENOENT,
                               "\"" + printable(path) + "\" is not in the trash", path)};
  }
  std::optional<TrashInfo> known;
  if (const int failure = readTrashInfo(place, *trashed, known)) {
    return {{}, fileError(failure, "the trash doesn't know the origin of", path)};
  }
  std::string before;
  if (known) {
    before = known->path.front() == '/' ? known->path : joinPath(place.root->path, known->path);
    if (!trashed->below.empty()) before = joinPath(before, trashed->below);
  }
  // Another tool's info may say anything: only places in the store are believed.
  StorePlace origin;
  bool plain = known && _roots.contains(before);
  for (const std::string& name : pathComponents(before)) {
    plain = plain && name != "." && name != "..";
  }
  if (!plain) {
    return {{},
            fileErrorWithWords(NSFileNoSuchFileError, EINVAL,
                               "the trash doesn't know the origin of \"" + printable(path) +
                                   "\"; choose a folder for it",
                               path)};
  }
  return {before, nullptr};
}

int FileOperations::removeTrashInfo(const StorePlace& place) {
  const auto trashed = trashedPath(place.relative);
  if (!trashed || trashed->name.empty() || !trashed->below.empty()) return 0;
  if (place.folder.exists(place.name)) return 0;
  DirectoryHandle info;
  int failure = place.root->folder.openFolder(joinPath(trashed->trash, "info"), info);
  if (failure == 0) failure = _files.unlink(info.get(), trashed->name + kTrashInfoSuffix);
  if (failure == 0) failure = _files.sync(info.get());
  return failure == ENOENT ? 0 : failure;
}

std::optional<OperationState> FileOperations::recoverTrash(const OperationEntry& entry) {
  if (exists(entry.destination)) return OperationState::Done;
  StorePlace from;
  StorePlace to;
  if (_roots.locate(entry.path, from) || _roots.locate(entry.destination, to)) return std::nullopt;
  const auto trashed = trashedPath(to.relative);
  if (!trashed) return std::nullopt;
  DirectoryHandle info;
  std::string text;
  int failure = to.root->folder.openFolder(joinPath(trashed->trash, "info"), info);
  const std::string infoName = trashed->name + kTrashInfoSuffix;
  if (failure == 0) failure = readInfo(info, infoName, text);
  if (failure == ENOENT) return OperationState::Undone;
  if (failure != 0) return std::nullopt;
  // Only what this operation wrote, whole or in part: the name may be another tool's now.
  const std::string ours = "[Trash Info]\nPath=" + percentEncoded(from.relative) + "\n";
  if (!ours.starts_with(text) && !text.starts_with(ours)) return OperationState::Undone;
  failure = _files.unlink(info.get(), infoName);
  return failure == 0 || failure == ENOENT ? std::optional(OperationState::Undone) : std::nullopt;
}

std::optional<OperationState> FileOperations::recoverPutBack(const OperationEntry& entry) {
  StorePlace trashed;
  if (_roots.locate(entry.path, trashed)) return std::nullopt;
  if (trashed.folder.exists(trashed.name)) return OperationState::Undone;
  if (!exists(entry.destination)) return OperationState::Undone;
  return removeTrashInfo(trashed) == 0 ? std::optional(OperationState::Done) : std::nullopt;
}

}  // namespace skein::vald
