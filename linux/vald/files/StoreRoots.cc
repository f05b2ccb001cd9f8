#include "linux/vald/files/StoreRoots.h"

#include <algorithm>
#include <cerrno>
#include <utility>

#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"

namespace skein::vald {
namespace {

std::string withoutTrailingSeparators(std::string path) {
  while (path.size() > 1 && path.back() == '/') path.pop_back();
  return path;
}

// "." and ".." would let a path mean another one than it says.
bool isPlain(const std::string& relative) {
  for (const std::string& name : pathComponents(relative)) {
    if (name == "." || name == ".." || name.size() > kLongestName) return false;
  }
  return relative.find("//") == std::string::npos && relative.find('\0') == std::string::npos;
}

}  // namespace

bool isMountPoint(const std::string& path, dev_t device) {
  struct stat parent {};
  return stat((path + "/..").c_str(), &parent) != 0 || parent.st_dev != device;
}

std::string StorePlace::path() const {
  return relative.empty() ? root->path : joinPath(root->path, relative);
}

std::string StorePlace::folderPath() const {
  return folderRelative.empty() ? root->path : joinPath(root->path, folderRelative);
}

NSErrorPtr StoreRoots::set(const std::vector<std::string>& paths) {
  std::vector<std::shared_ptr<const OpenRoot>> roots;
  for (const std::string& path : paths) {
    auto root = std::make_shared<OpenRoot>();
    root->mayBeMadeAnew = !roots.empty();
    root->path = withoutTrailingSeparators(path);
    if (const int failure = DirectoryHandle::openRoot(root->path, root->folder)) {
      return fileError(failure, "can't open the folder", path);
    }
    roots.push_back(std::move(root));
  }
  MutexLock lock(_mutex);
  _roots = std::move(roots);
  return nullptr;
}

std::vector<std::shared_ptr<const OpenRoot>> StoreRoots::list() const {
  MutexLock lock(_mutex);
  return _roots;
}

std::shared_ptr<const OpenRoot> StoreRoots::rootOf(const std::string& path) const {
  MutexLock lock(_mutex);
  std::shared_ptr<const OpenRoot> found;
  for (const auto& root : _roots) {
    // The longest: a container's folder may lie within the drive's.
    if (isAtOrBelow(path, root->path) && (!found || root->path.size() > found->path.size())) {
      found = root;
    }
  }
  return found;
}

std::shared_ptr<const OpenRoot> StoreRoots::current(std::shared_ptr<const OpenRoot> root) const {
  struct stat known {};
  struct stat there {};
  if (!root->mayBeMadeAnew || root->folder.status(known) != 0 ||
      stat(root->path.c_str(), &there) != 0) {
    return root;
  }
  const bool isSame = known.st_ino == there.st_ino && known.st_dev == there.st_dev;
  // A deleted folder that is held open keeps its number, but the number of its links is 0.
  if ((isSame && known.st_nlink != 0) || isMountPoint(root->path, there.st_dev)) return root;
  auto anew = std::make_shared<OpenRoot>();
  anew->path = root->path;
  anew->mayBeMadeAnew = true;
  if (DirectoryHandle::openRoot(root->path, anew->folder) != 0) return root;
  MutexLock lock(_mutex);
  const auto place = std::find(_roots.begin(), _roots.end(), root);
  if (place != _roots.end()) *place = anew;
  return anew;
}

bool StoreRoots::contains(const std::string& path) const { return rootOf(path) != nullptr; }

NSErrorPtr StoreRoots::locate(const std::string& given, StorePlace& place) const {
  const std::string path = withoutTrailingSeparators(given);
  auto root = rootOf(path);
  if (!root) {
    return fileErrorWithWords(NSFileWriteNoPermissionError, EACCES,
                              "\"" + printable(path) + "\" is not in the drive", path);
  }
  root = current(std::move(root));
  std::string relative = path.substr(root->path.size());
  if (!relative.empty() && relative.front() == '/') relative.erase(0, 1);
  if (!isPlain(relative)) {
    return fileErrorWithWords(NSFileWriteInvalidFileNameError, EINVAL,
                              "\"" + printable(path) + "\" is no path of a document", path);
  }
  StorePlace found;
  found.folderRelative = parentOfPath(relative);
  found.name = nameOfPath(relative);
  found.relative = std::move(relative);
  if (const int failure = root->folder.openFolder(found.folderRelative, found.folder)) {
    return fileError(failure, "can't open the folder of", path);
  }
  found.root = std::move(root);
  place = std::move(found);
  return nullptr;
}

NSErrorPtr StoreRoots::locate(const std::string& folder, const std::string& name,
                              StorePlace& place) const {
  const std::string parent = withoutTrailingSeparators(folder);
  const auto root = rootOf(parent);
  if (root && parent == root->path) {
    if (NSErrorPtr refusal = refusalOfName(name, true)) return refusal;
  } else if (NSErrorPtr refusal = refusalOfName(name, false)) {
    return refusal;
  }
  NSErrorPtr error = locate(joinPath(parent, name), place);
  // The folder is what is missing, so the error names it.
  if (error && root && error->code() == NSFileNoSuchFileError) {
    return fileError(ENOENT, "can't open the folder", parent);
  }
  return error;
}

}  // namespace skein::vald
