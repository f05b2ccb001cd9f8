#include "linux/vald/files/DirectoryHandle.h"

#include <dirent.h>
#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstring>
#include <memory>

#include "linux/vald/files/FileNames.h"

namespace skein::vald {
namespace {

constexpr int kFolderFlags = O_RDONLY | O_DIRECTORY | O_CLOEXEC;

// 0 or the errno; `file` is set on success.
int opened(int descriptor, FileDescriptor& file) {
  if (descriptor < 0) return errno;
  file = FileDescriptor(descriptor);
  return 0;
}

int openBeneath(int at, const std::string& relative, FileDescriptor& folder) {
  struct open_how how {};
  how.flags = kFolderFlags;
  how.resolve = RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS;
  return opened(static_cast<int>(::syscall(SYS_openat2, at, relative.c_str(), &how, sizeof(how))),
                folder);
}

// One component after the other: for kernels and sandboxes without openat2, and for paths
// that are longer than one call takes.
int openStepwise(int at, const std::string& relative, FileDescriptor& folder) {
  FileDescriptor current;
  for (const std::string& name : pathComponents(relative)) {
    if (name == "." || name == "..") return EXDEV;
    FileDescriptor next;
    const int failure = opened(
        ::openat(current ? current.get() : at, name.c_str(), kFolderFlags | O_NOFOLLOW), next);
    if (failure != 0) return failure;
    current = std::move(next);
  }
  folder = std::move(current);
  return 0;
}

}  // namespace

int DirectoryHandle::openRoot(const std::string& path, DirectoryHandle& folder) {
  return opened(::open(path.c_str(), kFolderFlags), folder._folder);
}

int DirectoryHandle::openFolder(const std::string& relative, DirectoryHandle& folder) const {
  if (relative.empty()) return opened(::openat(get(), ".", kFolderFlags), folder._folder);
  int failure = ENAMETOOLONG;
  if (relative.size() < PATH_MAX) {
    do {
      failure = openBeneath(get(), relative, folder._folder);
    } while (failure == EINTR || failure == EAGAIN);
  }
  if (failure != ENOSYS && failure != ENAMETOOLONG && failure != EPERM) return failure;
  return openStepwise(get(), relative, folder._folder);
}

int DirectoryHandle::openParent(DirectoryHandle& folder) const {
  return opened(::openat(get(), "..", kFolderFlags), folder._folder);
}

int DirectoryHandle::openFile(const std::string& name, FileDescriptor& file) const {
  const int flags = O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC;
  return opened(::openat(get(), name.c_str(), flags), file);
}

int DirectoryHandle::openEntry(const std::string& name, FileDescriptor& entry) const {
  return opened(::openat(get(), name.c_str(), O_PATH | O_NOFOLLOW | O_CLOEXEC), entry);
}

int DirectoryHandle::status(const std::string& name, struct stat& status) const {
  return ::fstatat(get(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 ? 0 : errno;
}

int DirectoryHandle::status(struct stat& status) const {
  return ::fstat(get(), &status) == 0 ? 0 : errno;
}

bool DirectoryHandle::exists(const std::string& name) const {
  struct stat found {};
  return status(name, found) == 0;
}

bool DirectoryHandle::lists(const std::string& name) const {
  bool found = false;
  const int failure = list([&](const std::string& entry) {
    found = entry == name;
    return !found;
  });
  return found || failure != 0;
}

int DirectoryHandle::readLink(const std::string& name, std::string& target) const {
  target.resize(PATH_MAX);
  const ssize_t length = ::readlinkat(get(), name.c_str(), target.data(), target.size());
  const int failure = length < 0 ? errno : 0;
  target.resize(failure == 0 ? static_cast<std::size_t>(length) : 0);
  return failure;
}

int DirectoryHandle::list(const std::function<bool(const std::string&)>& each) const {
  // A descriptor of its own: the position of this one is shared with nobody.
  const int copy = ::openat(get(), ".", kFolderFlags);
  if (copy < 0) return errno;
  const std::unique_ptr<DIR, int (*)(DIR*)> stream(::fdopendir(copy), &::closedir);
  if (!stream) {
    const int failure = errno;
    ::close(copy);
    return failure;
  }
  while (true) {
    errno = 0;
    const dirent* entry = ::readdir(stream.get());
    if (entry == nullptr) return errno;
    if (std::strcmp(entry->d_name, ".") == 0 || std::strcmp(entry->d_name, "..") == 0) continue;
    if (!each(entry->d_name)) return 0;
  }
}

std::uint64_t DirectoryHandle::mountOf(const std::string& name) const {
  struct statx status {};
  const int flags = AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT | (name.empty() ? AT_EMPTY_PATH : 0);
  if (::statx(get(), name.c_str(), flags, STATX_MNT_ID, &status) != 0) return 0;
  return (status.stx_mask & STATX_MNT_ID) != 0 ? status.stx_mnt_id : 0;
}

}  // namespace skein::vald
