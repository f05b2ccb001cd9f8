#include "linux/vald/cloud/FileAttributes.h"

#include <sys/stat.h>
#include <sys/xattr.h>

#include <cerrno>
#include <cstring>

#include "linux/vald/files/FileErrors.h"

namespace skein::vald {
namespace {

constexpr std::size_t kLargestAttribute = 65536;  // the system's limit, of the list as well

// 0 or the errno.
int copyExtendedAttributes(FileLayer& files, int from, int to) {
  std::string names(kLargestAttribute, '\0');
  const ssize_t size = flistxattr(from, names.data(), names.size());
  if (size < 0) return errno == ENOTSUP ? 0 : errno;
  names.resize(static_cast<std::size_t>(size));
  std::string value;
  for (std::size_t at = 0; at < names.size(); at += std::strlen(names.c_str() + at) + 1) {
    const std::string name = names.c_str() + at;
    if (name.starts_with("security.") || name.starts_with("trusted.")) continue;
    value.resize(kLargestAttribute);
    const ssize_t length = fgetxattr(from, name.c_str(), value.data(), value.size());
    if (length < 0) return errno;
    value.resize(static_cast<std::size_t>(length));
    if (const int code = files.setAttribute(descriptorPath(to), name, value)) return code;
  }
  // What a folder gives to new files by default is not what the file had.
  constexpr char kAccessList[] = "system.posix_acl_access";
  if (fgetxattr(from, kAccessList, nullptr, 0) < 0 && errno == ENODATA &&
      fgetxattr(to, kAccessList, nullptr, 0) >= 0) {
    return files.removeAttribute(descriptorPath(to), kAccessList);
  }
  return 0;
}

}  // namespace

NSErrorPtr copyFileAttributes(FileLayer& files, int from, int to, mode_t mode,
                              const std::string& path) {
  struct stat status {};
  if (fstat(from, &status) != 0) return fileError(errno, "can't look at", path);
  struct stat target {};
  if (fstat(to, &target) != 0) return fileError(errno, "can't look at", path);
  // Before the mode, which would be cut by it.
  if (status.st_gid != target.st_gid) {
    if (const int code = files.setGroup(to, status.st_gid)) {
      return fileError(code, "can't keep the group of", path);
    }
  }
  if (const int code = copyExtendedAttributes(files, from, to)) {
    return fileError(code, "can't keep the attributes of", path);
  }
  if (const int code = files.setMode(to, mode)) {
    return fileError(code, "can't keep the mode of", path);
  }
  const timespec times[2] = {status.st_atim, status.st_mtim};
  if (const int code = files.setTimes(to, "", times)) {
    return fileError(code, "can't keep the times of", path);
  }
  return nullptr;
}

}  // namespace skein::vald
