#include "linux/vald/files/TreeRemoval.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <vector>

#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"

namespace skein::vald {

NSErrorPtr obstacleToRemoval(const DirectoryHandle& folder, const std::string& name,
                             const std::string& path, const std::function<bool()>& goesOn) {
  const char* const doing = "can't remove";
  struct stat status {};
  if (const int failure = folder.status(name, status)) return fileError(failure, doing, path);
  if (!S_ISDIR(status.st_mode)) return nullptr;
  if (!goesOn()) return fileError(ECANCELED, doing, path);
  if (folder.mountOf(name) != folder.mountOf()) return fileError(EBUSY, doing, path);
  DirectoryHandle below;
  if (const int failure = folder.openFolder(name, below)) return fileError(failure, doing, path);
  NSErrorPtr error;
  bool empty = true;
  const int failure = below.list([&](const std::string& child) {
    empty = false;
    struct stat childStatus {};
    if (below.status(child, childStatus) == 0 && S_ISDIR(childStatus.st_mode)) {
      error = obstacleToRemoval(below, child, joinPath(path, child), goesOn);
    }
    return error == nullptr;
  });
  if (error) return error;
  if (failure != 0) return fileError(failure, doing, path);
  if (!empty && ::faccessat(below.get(), ".", W_OK | X_OK, AT_EACCESS) != 0) {
    return fileError(errno, doing, path);
  }
  return nullptr;
}

int removeTree(FileLayer& files, const DirectoryHandle& folder, const std::string& name) {
  struct stat status {};
  int failure = folder.status(name, status);
  if (failure != 0) return failure == ENOENT ? 0 : failure;
  if (!S_ISDIR(status.st_mode)) {
    failure = files.unlink(folder.get(), name);
    return failure == ENOENT ? 0 : failure;
  }
  if (folder.mountOf(name) != folder.mountOf()) return EBUSY;
  DirectoryHandle below;
  if ((failure = folder.openFolder(name, below)) != 0) return failure;
  // Some file systems lose their place in a folder from which entries go, so a pass that
  // removed something is followed by another.
  int first = 0;
  for (bool removed = true; removed && first == 0;) {
    removed = false;
    failure = below.list([&](const std::string& child) {
      const int own = removeTree(files, below, child);
      if (own == 0) {
        removed = true;
      } else if (first == 0) {
        first = own;
      }
      return true;
    });
    if (first == 0) first = failure;
  }
  if (first != 0) return first;
  failure = files.removeFolder(folder.get(), name);
  return failure == ENOENT ? 0 : failure;
}

}  // namespace skein::vald
