#include "linux/vald/files/FileOperations.h"

#include <sys/xattr.h>

#include <algorithm>
#include <cerrno>
#include <string_view>
#include <system_error>
#include <utility>

#include "linux/vald/files/DocumentHint.h"
#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"
#include "linux/vald/files/OwnFolders.h"
#include "linux/vald/files/TrashInfo.h"

namespace skein::vald {
namespace {

constexpr unsigned kMostNumberedNames = 10'000;

}  // namespace

std::unique_ptr<FileOperations> FileOperations::open(FileOperationsOptions options,
                                                     FileLayer& files, Log& log, NSErrorOut error) {
  std::unique_ptr<FileOperations> operations(new FileOperations(std::move(options), files, log));
  const FileOperationsOptions& own = operations->_options;
  NSErrorPtr failure = operations->_roots.set(own.roots);
  if (!failure) failure = operations->_staging.open(own.stateDirectory, files);
  if (!failure) {
    operations->_journal = OperationJournal::open(joinPath(own.stateDirectory, "operations.db"),
                                                  own.provenanceRetention, files, &failure);
  }
  if (!failure) failure = operations->recover();
  if (failure) {
    error.store(failure);
    return nullptr;
  }
  return operations;
}

FileOperations::FileOperations(FileOperationsOptions options, FileLayer& files, Log& log)
    : _options(std::move(options)), _files(files), _log(log) {}

std::chrono::steady_clock::time_point FileOperations::deadline() const {
  return std::chrono::steady_clock::now() + _options.lockDeadline;
}

NSErrorPtr FileOperations::claim(std::vector<std::string> paths,
                                 std::chrono::steady_clock::time_point until,
                                 FileCoordinator::Claim& claim) {
  const std::size_t own = paths.size();
  for (std::size_t at = 0; _options.otherNames && at < own; ++at) {
    const std::string folder = parentOfPath(paths[at]);
    for (const std::string& name : _options.otherNames(nameOfPath(paths[at]))) {
      paths.push_back(joinPath(folder, name));
    }
  }
  return _coordinator.claim(std::move(paths), until, claim);
}

bool FileOperations::isTaken(const StorePlace& place) const {
  if (place.folder.exists(place.name)) return true;
  if (!_options.otherNames) return false;
  const auto names = _options.otherNames(place.name);
  return std::any_of(names.begin(), names.end(),
                     [&](const std::string& name) { return place.folder.exists(name); });
}

NSErrorPtr FileOperations::coordinate(const std::string& path, std::shared_ptr<void>& held) {
  auto hold = std::make_shared<FileCoordinator::Claim>();
  if (NSErrorPtr error = claim({path}, deadline(), *hold)) return error;
  held = std::move(hold);
  return nullptr;
}

NSErrorPtr FileOperations::waitFor(const std::string& path) {
  Hold hold;
  StorePlace place;
  return take(path, {path}, {}, place, hold);
}

bool FileOperations::writeHint(const std::string& path, std::uint64_t document,
                               const std::optional<FileKey>& asked) {
  FileCoordinator::Claim held;
  StorePlace place;
  FileDescriptor entry;
  struct stat status {};
  if (claim({path}, deadline(), held) || _roots.locate(path, place) || place.isRoot() ||
      place.folder.status(place.name, status) != 0 || !S_ISREG(status.st_mode) ||
      place.folder.openEntry(place.name, entry) != 0) {
    return false;
  }
  FileKey key;
  if (readFileKey(entry.get(), {}, key) != 0 || (asked && !asked->names(key))) return false;
  const DocumentHint hint{document, key.inode, key.generation};
  const std::string own = descriptorPath(entry.get());
  const std::string text = hint.asText();
  char known[128];
  const ssize_t size = ::getxattr(own.c_str(), kHintAttribute, known, sizeof known);
  if (size >= 0 && text == std::string_view(known, static_cast<std::size_t>(size))) return false;
  if (const int failure = _files.setAttribute(own, kHintAttribute, text)) {
    VL_DEBUG(_log, "[DEBUG] %@ has no hint: %@", path, std::generic_category().message(failure));
    return false;
  }
  return true;
}

bool FileOperations::isAsked(const FileRequest& request, const DirectoryHandle& folder,
                             const std::string& name) {
  FileKey key;
  return !request.file || (readFileKey(folder.get(), name, key) == 0 && request.file->names(key));
}

int FileOperations::putBack(const DirectoryHandle& folder, std::string& name,
                            const StorePlace& place) {
  int failure = EEXIST;
  for (unsigned number = 1; failure == EEXIST && number <= kMostNumberedNames; ++number) {
    std::string before = numberedName(place.name, number, ' ');
    failure = _files.renameWithoutReplacing(folder.get(), name, place.folder.get(), before);
    if (failure == 0) name = std::move(before);
  }
  return failure;
}

NSErrorPtr FileOperations::take(const std::string& path, std::vector<std::string> paths,
                                const FileRequest& request, StorePlace& place, Hold& hold) {
  const auto until = deadline();
  if (NSErrorPtr error = claim(std::move(paths), until, hold.claim)) return error;
  if (NSErrorPtr error = _roots.locate(path, place)) return error;
  if (place.isRoot()) {
    return fileErrorWithWords(NSFileWriteNoPermissionError, EACCES,
                              "\"" + printable(path) + "\" is the drive's own folder", path);
  }
  const auto trashed = trashedPath(place.relative);
  if (trashed && trashed->name.empty()) {
    return fileErrorWithWords(NSFileWriteNoPermissionError, EACCES,
                              "\"" + printable(path) + "\" belongs to the trash itself", path);
  }
  if (holdsOwnFolder(place.path())) {
    return fileErrorWithWords(NSFileWriteNoPermissionError, EACCES,
                              "\"" + printable(path) +
                                  "\" holds this system's own files, such as the contents of "
                                  "evicted documents, so it stays where it is",
                              path);
  }
  struct stat status {};
  if (const int failure = place.folder.status(place.name, status)) {
    return fileError(failure, "can't find", path);
  }
  if (!isAsked(request, place.folder, place.name)) return fileError(ESTALE, "can't find", path);
  return hold.lock.acquire(place.folder, place.name, place.path(), until);
}

NSErrorPtr FileOperations::takeNew(const std::string& folder, const std::string& name,
                                   StorePlace& place, Hold& hold) {
  // Before anything is waited for or touched.
  if (NSErrorPtr error = _roots.locate(folder, name, place)) return error;
  if (trashedPath(place.relative)) {
    return fileErrorWithWords(NSFileWriteNoPermissionError, EACCES,
                              "\"" + printable(folder) + "\" is in the trash", folder);
  }
  if (NSErrorPtr error = claim({place.path()}, deadline(), hold.claim)) return error;
  if (NSErrorPtr error = _roots.locate(folder, name, place)) return error;
  return isTaken(place) ? fileError(EEXIST, "can't make", place.path()) : nullptr;
}

int FileOperations::syncFolders(const DirectoryHandle& folder, const DirectoryHandle* other) {
  if (const int failure = _files.sync(folder.get())) return failure;
  struct stat one {};
  struct stat two {};
  if (other == nullptr || folder.status(one) != 0 || other->status(two) != 0) return 0;
  if (one.st_dev == two.st_dev && one.st_ino == two.st_ino) return 0;
  return _files.sync(other->get());
}

FileResult FileOperations::createFolder(const std::string& folder, const std::string& name,
                                        const FileRequest& request) {
  StorePlace place;
  Hold hold;
  if (NSErrorPtr error = takeNew(folder, name, place, hold)) return {{}, error};
  const std::string path = place.path();
  OperationScope scope(*_journal, OperationKind::CreateFolder, request, {}, path);
  if (NSErrorPtr error = scope.begin()) return {{}, error};
  int failure = _files.makeFolder(place.folder.get(), name, 0777);
  if (failure == 0 && (failure = _files.sync(place.folder.get())) != 0) {
    if (_files.removeFolder(place.folder.get(), name) != 0) scope.leaveOpen();
  }
  if (failure != 0) return {{}, fileError(failure, "can't make the folder", path)};
  scope.done();
  return {path, nullptr};
}

FileResult FileOperations::makeAlias(const std::string& folder, const std::string& name,
                                     const std::string& target, const FileRequest& request) {
  if (target.empty() || target.front() != '/' || target.find('\0') != std::string::npos) {
    return {{},
            fileErrorWithWords(
                NSFileWriteInvalidFileNameError, EINVAL,
                "can't make an alias of \"" + printable(target) + "\": an absolute path is needed",
                {})};
  }
  StorePlace place;
  Hold hold;
  if (NSErrorPtr error = takeNew(folder, name, place, hold)) return {{}, error};
  const std::string path = place.path();
  OperationScope scope(*_journal, OperationKind::MakeAlias, request, target, path);
  if (NSErrorPtr error = scope.begin()) return {{}, error};
  int failure = _files.makeLink(target, place.folder.get(), name);
  if (failure == 0 && (failure = _files.sync(place.folder.get())) != 0) {
    if (_files.unlink(place.folder.get(), name) != 0) scope.leaveOpen();
  }
  if (failure != 0) return {{}, fileError(failure, "can't make the alias", path)};
  scope.done();
  return {path, nullptr};
}

TagResult FileOperations::tags(const std::string& path) const {
  StorePlace place;
  if (NSErrorPtr error = _roots.locate(path, place)) return {TagStorage::Failed, {}, error};
  return readTags(place.folder, place.isRoot() ? "." : place.name, path);
}

TagResult FileOperations::setTags(const std::string& path, const std::vector<std::string>& names,
                                  const std::function<void()>& written,
                                  const std::optional<FileKey>& asked) {
  FileCoordinator::Claim held;
  StorePlace place;
  NSErrorPtr error = claim({path}, deadline(), held);
  if (!error) error = _roots.locate(path, place);
  if (error) return {TagStorage::Failed, {}, error};
  return writeTags(_files, place.folder, place.isRoot() ? "." : place.name, path, names, written,
                   asked);
}

}  // namespace skein::vald
