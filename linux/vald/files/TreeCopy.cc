#include "linux/vald/files/TreeCopy.h"

#include <fcntl.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <string_view>

#include "linux/vald/files/AccessList.h"
#include "linux/vald/files/DocumentHint.h"
#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileKey.h"
#include "linux/vald/files/FileNames.h"
#include "linux/vald/files/OwnFolders.h"
#include "linux/vald/files/TreeWalk.h"

namespace skein::vald {
namespace {

constexpr std::int64_t kChunk = std::int64_t{16} << 20;
constexpr std::size_t kBuffer = std::size_t{1} << 20;
constexpr std::uint64_t kTellItems = 64;
constexpr std::uint64_t kTellBytes = std::uint64_t{8} << 20;
// Up to here each file is synced by itself; beyond, one sync of the file system is
// quicker, though it also writes what other programs have pending.
constexpr std::uint64_t kFewItems = 32;
// Says which document a file is; a copy is another document.
constexpr std::string_view kOwnAttributes = "user.skein.";
constexpr char kAccessList[] = "system.posix_acl_access";
constexpr char kDefaultList[] = "system.posix_acl_default";

constexpr std::size_t kLargestAttribute = 65536;  // the system's limit, of the list as well

std::string attributeOf(int file, const char* name) {
  std::string value(kLargestAttribute, '\0');
  const ssize_t size = ::fgetxattr(file, name, value.data(), value.size());
  value.resize(size > 0 ? static_cast<std::size_t>(size) : 0);
  return value;
}

bool isSame(const timespec& one, const timespec& other) {
  return one.tv_sec == other.tv_sec && one.tv_nsec == other.tv_nsec;
}

bool isUnchanged(int file, const struct stat& before) {
  struct stat now {};
  return ::fstat(file, &now) == 0 && now.st_size == before.st_size &&
         isSame(now.st_mtim, before.st_mtim) && isSame(now.st_ctim, before.st_ctim);
}

NSErrorPtr refused(const char* doing, const std::string& path, const std::string& why) {
  return fileErrorWithWords(NSFileWriteUnknownError, EINVAL,
                            std::string(doing) + " \"" + printable(path) + "\": " + why, path);
}

bool saysImpossible(int number) {
  return number == EOPNOTSUPP || number == ENOTTY || number == EXDEV || number == EINVAL ||
         number == ENOSYS || number == EPERM;
}

}  // namespace

int TreeCopy::advance(std::uint64_t items, std::uint64_t bytes) {
  _state.doneItems += items;
  _state.doneBytes += bytes;
  const bool tell = _state.doneItems - _toldItems >= kTellItems ||
                    _state.doneBytes - _toldBytes >= kTellBytes ||
                    _state.doneItems == _state.totalItems;
  if (!tell || !_progress) return 0;
  _toldItems = _state.doneItems;
  _toldBytes = _state.doneBytes;
  return _progress(_state) ? 0 : ECANCELED;
}

class TreeCopy::Measure final : public TreeWalk {
 public:
  explicit Measure(TreeCopy& copy) : _copy(copy) {}
  const NSErrorPtr& refusal() const { return _refusal; }

 private:
  int visit(const DirectoryHandle&, const std::string& name, const struct stat& status) override {
    FileProgress& state = _copy._state;
    if (++state.totalItems % kTellItems == 0 && _copy._progress && !_copy._progress({})) {
      return ECANCELED;
    }
    // The first one's name is what the caller makes of it.
    if (depth() > 0) _refusal = refusalOfName(name, false);
    if (isOwnFolder(status)) {
      _refusal = refused(_copy._doing, path(),
                         "it is where this system keeps its own files; leave it out");
    }
    if (S_ISREG(status.st_mode)) {
      state.totalBytes += static_cast<std::uint64_t>(status.st_size);
    } else if (!S_ISLNK(status.st_mode) && !S_ISDIR(status.st_mode)) {
      _refusal = refused(_copy._doing, path(), "it is a device, a pipe or a socket; leave it out");
    }
    if (depth() > kDeepestTree) {
      _refusal = refused(_copy._doing, path(),
                         "it is more than " + std::to_string(kDeepestTree) +
                             " folders deep; take its parts one by one");
    }
    return _refusal ? EINVAL : 0;
  }

  TreeCopy& _copy;
  NSErrorPtr _refusal;
};

NSErrorPtr TreeCopy::measure(const DirectoryHandle& folder, const std::string& name,
                             const std::string& path) {
  Measure measure(*this);
  const int failure = measure.walk(folder, name, path);
  if (failure == 0 || measure.refusal()) return measure.refusal();
  return fileError(failure, failure == ECANCELED ? _doing : "can't read", measure.path());
}

class TreeCopy::Copy final : public TreeWalk {
 public:
  Copy(TreeCopy& copy, const DirectoryHandle& to, const std::string& newName)
      : _copy(copy), _to(to), _newName(newName) {}

 private:
  // The folder of the copy that is being filled, and the name in it.
  const DirectoryHandle& into() const { return depth() == 0 ? _to : _made; }
  const std::string& named(const std::string& name) const { return depth() == 0 ? _newName : name; }

  int visit(const DirectoryHandle& from, const std::string& name,
            const struct stat& status) override {
    const std::string& made = named(name);
    if (S_ISDIR(status.st_mode)) return _copy._files.makeFolder(into().get(), made, 0700);
    if (S_ISREG(status.st_mode)) return _copy.copyFile(from, name, into(), made);
    std::string target;
    int failure = S_ISLNK(status.st_mode) ? from.readLink(name, target) : EINVAL;
    if (failure == 0) failure = _copy._files.makeLink(target, into().get(), made);
    const timespec times[2] = {status.st_atim, status.st_mtim};
    if (failure == 0) failure = _copy._files.setTimes(into().get(), made, times);
    return failure != 0 ? failure : _copy.advance(1, 0);
  }
  int enter(const DirectoryHandle&, const std::string& name) override {
    const bool isFirst = depth() == 1;
    DirectoryHandle made;
    const int failure = (isFirst ? _to : _made).openFolder(isFirst ? _newName : name, made);
    _made = std::move(made);
    return failure;
  }
  int leave(const DirectoryHandle& from, bool) override {
    struct stat status {};
    int failure = from.status(status);
    if (failure == 0) failure = _copy.copyAttributes(from.get(), _made.get());
    // Also from a read-only medium the owner gets a folder that can be filled and moved.
    const mode_t least = _copy._isMove ? 0 : 0700;
    if (failure == 0) failure = _copy.copyAccess(from.get(), _made.get(), status, least);
    const timespec times[2] = {status.st_atim, status.st_mtim};
    if (failure == 0) failure = _copy._files.setTimes(_made.get(), {}, times);
    if (failure == 0) failure = _copy.advance(1, 0);
    DirectoryHandle above;
    if (failure == 0) failure = _made.openParent(above);
    _made = std::move(above);
    return failure;
  }

  TreeCopy& _copy;
  const DirectoryHandle& _to;
  const std::string& _newName;
  DirectoryHandle _made;  // the copy of the folder that is being read
};

NSErrorPtr TreeCopy::copy(const DirectoryHandle& from, const std::string& name,
                          const std::string& path, const DirectoryHandle& to,
                          const std::string& newName) {
  Copy copy(*this, to, newName);
  const int failure = copy.walk(from, name, path);
  return failure == 0 ? nullptr : fileError(failure, _doing, copy.path());
}

int TreeCopy::copyFile(const DirectoryHandle& from, const std::string& name,
                       const DirectoryHandle& to, const std::string& newName) {
  FileDescriptor source;
  FileLease lease;  // after the file, so that it is given up first
  FileDescriptor made;
  struct stat status {};
  int failure = from.openFile(name, source);
  if (failure == 0) {
    const int refusal = lease.take(source.get());
    if (refusal == EAGAIN) failure = ETXTBSY;
    if (refusal == 0) _lease = &lease;
  }
  if (failure == 0 && ::fstat(source.get(), &status) != 0) failure = errno;
  if (failure == 0) failure = _files.createFile(to.get(), newName, 0600, made);
  if (failure == 0) failure = copyContents(source.get(), made.get(), status);
  if (failure == 0) failure = copyAttributes(source.get(), made.get());
  if (failure == 0 && !isUnchanged(source.get(), status)) failure = ETXTBSY;
  _lease = nullptr;
  if (failure == 0) failure = copyAccess(source.get(), made.get(), status, _isMove ? 0 : 0400);
  const timespec times[2] = {status.st_atim, status.st_mtim};
  if (failure == 0) failure = _files.setTimes(made.get(), {}, times);
  return failure != 0 ? failure : advance(1, 0);
}

int TreeCopy::copyContents(int from, int to, const struct stat& status) {
  const auto size = static_cast<std::int64_t>(status.st_size);
  if (_clones && size > 0) {
    const int failure = _files.cloneContents(from, to);
    if (failure == 0) return advance(0, static_cast<std::uint64_t>(size));
    if (!saysImpossible(failure)) return failure;
    _clones = false;
  }
  if (status.st_blocks * 512 >= size) return copyRange(from, to, 0, size, true);
  // Holes stay holes.
  std::int64_t at = 0;
  while (at < size) {
    const off_t data = ::lseek(from, at, SEEK_DATA);
    if (data < 0 && errno == ENXIO) break;
    if (data < 0) return copyRange(from, to, at, size, true);
    const off_t hole = ::lseek(from, data, SEEK_HOLE);
    const std::int64_t end = hole < 0 ? size : hole;
    if (const int failure = copyRange(from, to, data, end, false)) return failure;
    at = end;
  }
  return _files.setLength(to, size);
}

int TreeCopy::copyRange(int from, int to, std::int64_t offset, std::int64_t end, bool untilEnd) {
  // Files of the system's own say that they are empty and are not; only reading tells.
  bool reads = !_copiesRanges || (untilEnd && end == 0);
  while (!reads && (untilEnd || offset < end)) {
    const std::int64_t most = untilEnd ? kChunk : std::min(kChunk, end - offset);
    std::size_t copied = 0;
    const int failure = _files.copyRange(from, to, offset, static_cast<std::size_t>(most), copied);
    if (failure != 0 && !saysImpossible(failure)) return failure;
    if (failure != 0) {
      _copiesRanges = false;
      reads = true;
      break;
    }
    if (copied == 0) return 0;
    // Begins to write what there is, so that a large file is neither pending in memory as
    // a whole nor waited for at the end.
    if (copied == static_cast<std::size_t>(kChunk)) {
      ::sync_file_range(to, offset, static_cast<off64_t>(copied), SYNC_FILE_RANGE_WRITE);
    }
    offset += static_cast<std::int64_t>(copied);
    if (const int stop = advance(0, copied)) return stop;
    // A file of the size it was said to have needs no other call to find its end.
    if (offset == end) return 0;
    if (isDisturbed()) return ETXTBSY;
  }
  return reads ? copyByReading(from, to, offset, end, untilEnd) : 0;
}

int TreeCopy::copyByReading(int from, int to, std::int64_t offset, std::int64_t end,
                            bool untilEnd) {
  _buffer.resize(kBuffer);
  if (::lseek(to, offset, SEEK_SET) < 0) return errno;
  while (untilEnd || offset < end) {
    const std::size_t most =
        untilEnd ? kBuffer : std::min(kBuffer, static_cast<std::size_t>(end - offset));
    const ssize_t got = ::pread(from, _buffer.data(), most, offset);
    if (got < 0 && errno == EINTR) continue;
    if (got < 0) return errno;
    if (got == 0) break;
    const auto count = static_cast<std::size_t>(got);
    if (const int failure = _files.write(to, std::string_view(_buffer).substr(0, count))) {
      return failure;
    }
    offset += got;
    if (const int stop = advance(0, count)) return stop;
    if (offset != end && isDisturbed()) return ETXTBSY;
  }
  return 0;
}

int TreeCopy::copyAttributes(int from, int to) {
  std::string names(kLargestAttribute, '\0');
  const ssize_t length = ::flistxattr(from, names.data(), names.size());
  if (length < 0 && errno != ENOTSUP && errno != ENOSYS) return errno;
  names.resize(length > 0 ? static_cast<std::size_t>(length) : 0);
  for (std::size_t at = 0; at < names.size();) {
    const std::string name(names.c_str() + at);
    at += name.size() + 1;
    if (!name.starts_with("user.") || name == kHintAttribute) continue;
    if (!_isMove && name.starts_with(kOwnAttributes)) continue;
    std::string value(kLargestAttribute, '\0');
    const ssize_t size = ::fgetxattr(from, name.c_str(), value.data(), value.size());
    if (size < 0) continue;  // gone meanwhile, or not ours to read
    value.resize(static_cast<std::size_t>(size));
    const int failure = _files.setAttribute(descriptorPath(to), name, value);
    // A file system without attributes takes the contents all the same.
    if (failure != 0 && failure != ENOTSUP && failure != EPERM) return failure;
  }
  return _isMove ? copyHint(from, to) : 0;
}

int TreeCopy::copyHint(int from, int to) {
  auto hint = DocumentHint::parse(attributeOf(from, kHintAttribute));
  FileKey source;
  FileKey made;
  if (!hint || readFileKey(from, {}, source) != 0 || hint->inode != source.inode) return 0;
  if (const int failure = readFileKey(to, {}, made)) return failure;
  hint->inode = made.inode;
  hint->generation = made.generation;
  const int failure = _files.setAttribute(descriptorPath(to), kHintAttribute, hint->asText());
  return failure == ENOTSUP || failure == EPERM ? 0 : failure;
}

int TreeCopy::copyAccess(int from, int to, const struct stat& status, mode_t least) {
  struct stat made {};
  if (::fstat(to, &made) != 0) return errno;
  mode_t mode = status.st_mode & (_isMove && S_ISDIR(status.st_mode) ? 03777 : 0777);
  AccessList list(attributeOf(from, kAccessList));
  int failure = made.st_gid == status.st_gid ? 0 : _files.setGroup(to, status.st_gid);
  if (failure == EPERM || failure == EINVAL) {
    // To another group the copy is what it is to everybody.
    list.limitGroup(mode & 07);
    if (list.isEmpty()) mode &= 03707 | (mode & 07) << 3;
    failure = 0;
  }
  if (failure == 0) failure = copyList(to, kAccessList, list.bytes());
  if (failure == ENOTSUP || failure == EPERM || failure == EINVAL) {
    // Without the list the group's bits are the group's own, not the most that anybody has.
    if (!list.isEmpty()) mode = (mode & 03707) | static_cast<mode_t>(list.groupPermissions() << 3);
    failure = 0;
  }
  if (failure == 0 && S_ISDIR(status.st_mode)) {
    failure = copyList(to, kDefaultList, attributeOf(from, kDefaultList));
    if (failure == ENOTSUP || failure == EPERM || failure == EINVAL) failure = 0;
  }
  return failure != 0 ? failure : _files.setMode(to, mode | least);
}

// What a folder gives to new files by default is not what the source has.
int TreeCopy::copyList(int to, const char* name, const std::string& list) {
  if (!list.empty()) return _files.setAttribute(descriptorPath(to), name, list);
  return attributeOf(to, name).empty() ? 0 : _files.removeAttribute(descriptorPath(to), name);
}

class TreeCopy::Sync final : public TreeWalk {
 public:
  explicit Sync(FileLayer& files) : _files(files) {}

 private:
  int visit(const DirectoryHandle& folder, const std::string& name,
            const struct stat& status) override {
    if (!S_ISREG(status.st_mode)) return 0;
    FileDescriptor file;
    const int failure = folder.openFile(name, file);
    return failure != 0 ? failure : _files.sync(file.get());
  }
  int leave(const DirectoryHandle& folder, bool) override { return _files.sync(folder.get()); }

  FileLayer& _files;
};

NSErrorPtr TreeCopy::sync(const DirectoryHandle& to, const std::string& newName,
                          const std::string& path) {
  int failure = _state.totalItems > kFewItems ? _files.syncAll(to.get())
                                              : Sync(_files).walk(to, newName, path);
  // The disk may have taken its time.
  if (failure == 0 && _progress && !_progress(_state)) failure = ECANCELED;
  return failure == 0 ? nullptr : fileError(failure, _doing, path);
}

}  // namespace skein::vald
