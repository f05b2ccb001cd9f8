#include "linux/vald/files/FileLayer.h"

#include <fcntl.h>
#include <linux/fs.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>

namespace skein::vald {
namespace {

// Runs a system call until it is not interrupted. 0 or its errno.
template <class Call>
int result(Call call) {
  while (call() < 0) {
    if (errno != EINTR) return errno;
  }
  return 0;
}

}  // namespace

std::string_view fileStepName(FileStep step) {
  switch (step) {
    case FileStep::MakeFolder: return "make folder";
    case FileStep::CreateFile: return "create file";
    case FileStep::Write: return "write";
    case FileStep::Clone: return "clone";
    case FileStep::SetAttribute: return "set attribute";
    case FileStep::RemoveAttribute: return "remove attribute";
    case FileStep::SetMode: return "set mode";
    case FileStep::SetGroup: return "set group";
    case FileStep::SetTimes: return "set times";
    case FileStep::MakeLink: return "make link";
    case FileStep::Link: return "link";
    case FileStep::Rename: return "rename";
    case FileStep::Unlink: return "unlink";
    case FileStep::RemoveFolder: return "remove folder";
    case FileStep::Sync: return "sync";
    case FileStep::JournalBegin: return "journal begin";
    case FileStep::JournalMark: return "journal mark";
    case FileStep::JournalEnd: return "journal end";
  }
  return "unknown";
}

std::string descriptorPath(int file) { return "/proc/self/fd/" + std::to_string(file); }

int FileLayer::makeFolder(int at, const std::string& name, mode_t mode) {
  if (const int fault = beforeStep(FileStep::MakeFolder, name)) return fault;
  return result([&] { return ::mkdirat(at, name.c_str(), mode); });
}

int FileLayer::createFile(int at, const std::string& name, mode_t mode, FileDescriptor& file) {
  if (const int fault = beforeStep(FileStep::CreateFile, name)) return fault;
  return result([&] {
    const int flags = O_RDWR | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC;
    file = FileDescriptor(::openat(at, name.c_str(), flags, mode));
    return file.get();
  });
}

int FileLayer::write(int file, std::string_view bytes) {
  if (const int fault = beforeStep(FileStep::Write, {})) return fault;
  while (!bytes.empty()) {
    ssize_t written = 0;
    const int failure = result([&] { return written = ::write(file, bytes.data(), bytes.size()); });
    if (failure != 0) return failure;
    bytes.remove_prefix(static_cast<std::size_t>(written));
  }
  return 0;
}

int FileLayer::cloneContents(int from, int to) {
  if (const int fault = beforeStep(FileStep::Clone, {})) return fault;
  return result([&] { return ::ioctl(to, FICLONE, from); });
}

int FileLayer::copyRange(int from, int to, std::int64_t offset, std::size_t length,
                         std::size_t& copied) {
  if (const int fault = beforeStep(FileStep::Clone, {})) return fault;
  off64_t in = offset;
  off64_t out = offset;
  ssize_t count = 0;
  const int failure =
      result([&] { return count = ::copy_file_range(from, &in, to, &out, length, 0); });
  copied = failure == 0 ? static_cast<std::size_t>(count) : 0;
  return failure;
}

int FileLayer::setLength(int file, std::int64_t length) {
  if (const int fault = beforeStep(FileStep::Write, {})) return fault;
  return result([&] { return ::ftruncate(file, length); });
}

int FileLayer::setAttribute(const std::string& path, const std::string& name,
                            std::string_view value) {
  if (const int fault = beforeStep(FileStep::SetAttribute, name)) return fault;
  return result(
      [&] { return ::setxattr(path.c_str(), name.c_str(), value.data(), value.size(), 0); });
}

int FileLayer::removeAttribute(const std::string& path, const std::string& name) {
  if (const int fault = beforeStep(FileStep::RemoveAttribute, name)) return fault;
  return result([&] { return ::removexattr(path.c_str(), name.c_str()); });
}

int FileLayer::setMode(int file, mode_t mode) {
  if (const int fault = beforeStep(FileStep::SetMode, {})) return fault;
  return result([&] { return ::fchmod(file, mode); });
}

int FileLayer::setGroup(int file, gid_t group) {
  if (const int fault = beforeStep(FileStep::SetGroup, {})) return fault;
  return result([&] { return ::fchown(file, static_cast<uid_t>(-1), group); });
}

int FileLayer::setTimes(int at, const std::string& name, const timespec times[2]) {
  if (const int fault = beforeStep(FileStep::SetTimes, name)) return fault;
  if (name.empty()) return result([&] { return ::futimens(at, times); });
  return result([&] { return ::utimensat(at, name.c_str(), times, AT_SYMLINK_NOFOLLOW); });
}

int FileLayer::makeLink(const std::string& target, int at, const std::string& name) {
  if (const int fault = beforeStep(FileStep::MakeLink, name)) return fault;
  return result([&] { return ::symlinkat(target.c_str(), at, name.c_str()); });
}

int FileLayer::link(int file, int at, const std::string& name) {
  if (const int fault = beforeStep(FileStep::Link, name)) return fault;
  return ::linkat(AT_FDCWD, descriptorPath(file).c_str(), at, name.c_str(), AT_SYMLINK_FOLLOW) == 0
             ? 0
             : errno;
}

int FileLayer::renameWithoutReplacing(int at, const std::string& name, int newAt,
                                      const std::string& newName) {
  if (const int fault = beforeStep(FileStep::Rename, name)) return fault;
  const int failure = renameKeeping(at, name, newAt, newName);
  // EINVAL also says that a folder would go below itself; plain rename says it again.
  if (failure != EINVAL && failure != ENOSYS) return failure;
  struct stat status {};
  if (::fstatat(at, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) return errno;
  if (!S_ISDIR(status.st_mode)) {
    const int linking = linkBeside(at, name, newAt, newName);
    if (linking == 0) {
      const int unlinking = unlink(at, name);
      if (unlinking != 0) unlink(newAt, newName);
      return unlinking;
    }
    if (linking != EPERM && linking != EOPNOTSUPP && linking != ENOSYS && linking != EMLINK) {
      return linking;
    }
  }
  // What comes between these two is lost where it is a file that no second name can be made of,
  // and where it is an empty folder; nothing else can be replaced by a folder.
  if (::fstatat(newAt, newName.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0) return EEXIST;
  return result([&] { return ::renameat(at, name.c_str(), newAt, newName.c_str()); });
}

int FileLayer::renameKeeping(int at, const std::string& name, int newAt,
                             const std::string& newName) {
  return result(
      [&] { return ::renameat2(at, name.c_str(), newAt, newName.c_str(), RENAME_NOREPLACE); });
}

int FileLayer::linkBeside(int at, const std::string& name, int newAt, const std::string& newName) {
  if (const int fault = beforeStep(FileStep::Link, newName)) return fault;
  return result([&] { return ::linkat(at, name.c_str(), newAt, newName.c_str(), 0); });
}

int FileLayer::renameOver(int at, const std::string& name, int newAt, const std::string& newName) {
  if (const int fault = beforeStep(FileStep::Rename, name)) return fault;
  return result([&] { return ::renameat(at, name.c_str(), newAt, newName.c_str()); });
}

int FileLayer::unlink(int at, const std::string& name) {
  if (const int fault = beforeStep(FileStep::Unlink, name)) return fault;
  return result([&] { return ::unlinkat(at, name.c_str(), 0); });
}

int FileLayer::removeFolder(int at, const std::string& name) {
  if (const int fault = beforeStep(FileStep::RemoveFolder, name)) return fault;
  return result([&] { return ::unlinkat(at, name.c_str(), AT_REMOVEDIR); });
}

int FileLayer::writeBehind(int file, std::uint64_t from, std::uint64_t to) {
  if (const int fault = beforeStep(FileStep::Sync, {})) return fault;
  int failure = result([&] {
    return ::sync_file_range(file, static_cast<off64_t>(from), static_cast<off64_t>(to - from),
                             SYNC_FILE_RANGE_WRITE);
  });
  if (failure == 0 && from > 0) {
    failure = result([&] {
      return ::sync_file_range(
          file, 0, static_cast<off64_t>(from),
          SYNC_FILE_RANGE_WAIT_BEFORE | SYNC_FILE_RANGE_WRITE | SYNC_FILE_RANGE_WAIT_AFTER);
    });
  }
  // Where there is no such thing, the sync does it all.
  return failure == EINVAL || failure == ENOSYS || failure == EOPNOTSUPP ? 0 : failure;
}

int FileLayer::sync(int file) {
  if (const int fault = beforeStep(FileStep::Sync, descriptorPath(file))) return fault;
  const int failure = result([&] { return ::fsync(file); });
  return failure == EINVAL || failure == ENOSYS ? 0 : failure;
}

int FileLayer::syncAll(int file) {
  if (const int fault = beforeStep(FileStep::Sync, {})) return fault;
  return result([&] { return ::syncfs(file); });
}

}  // namespace skein::vald
