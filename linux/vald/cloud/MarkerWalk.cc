#include "linux/vald/cloud/MarkerWalk.h"

#include <unistd.h>

#include <cerrno>
#include <utility>
#include <vector>

#include "linux/vald/cloud/CloudErrors.h"
#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"

namespace skein::vald {
namespace {

NSErrorPtr couldNotRead(int code, const std::string& path) {
  return fileError(code, "can't look through", path);
}

// It went, or became something else, since it was listed.
bool isGone(int code) { return code == ENOENT || code == ENOTDIR || code == ELOOP; }

NSErrorPtr tellOf(const DirectoryHandle& folder, const std::string& folderPath,
                  const std::string& name, const EachMarker& each) {
  FileDescriptor file;
  const int code = folder.openFile(name, file);
  if (isGone(code)) return nullptr;
  if (code != 0) return couldNotRead(code, joinPath(folderPath, name));
  int unread = 0;
  const auto marker = readMarkerText(file.get(), &unread);
  if (unread != 0) return couldNotRead(unread, joinPath(folderPath, name));
  if (!marker) return nullptr;
  return each(joinPath(folderPath, nameOfDocument(*marker, name)), *marker);
}

// All entries below an open folder, whose path is `top`.
NSErrorPtr walkFolder(const DirectoryHandle& opened, const std::string& top, Unreadable unreadable,
                      const Cancellation& cancellation, const EachEntry& each) {
  // 0, or the errno that ends the walk.
  const auto serious = [unreadable](int code) {
    const bool isSkipped = unreadable == Unreadable::IsSkipped && code == EACCES;
    return isGone(code) || isSkipped ? 0 : code;
  };
  std::vector<std::string> folders{""};  // below the top, still to be read
  while (!folders.empty()) {
    if (cancellation.isCancelled()) return cancelledError();
    const std::string relative = std::move(folders.back());
    folders.pop_back();
    const std::string path = relative.empty() ? top : joinPath(top, relative);
    DirectoryHandle folder;
    NSErrorPtr error;
    int code = opened.openFolder(relative, folder);
    if (code == 0) {
      code = folder.list([&](const std::string& name) {
        struct stat status {};
        if (const int unseen = folder.status(name, status)) {
          if (serious(unseen) != 0) error = couldNotRead(unseen, joinPath(path, name));
          return error == nullptr;
        }
        if (S_ISDIR(status.st_mode)) {
          folders.push_back(relative.empty() ? name : joinPath(relative, name));
        }
        error = each(path, folder, name, status);
        return error == nullptr;
      });
    }
    if (error != nullptr) return error;
    if (serious(code) != 0) return couldNotRead(code, path);
  }
  return nullptr;
}

}  // namespace

NSErrorPtr walkEntries(const StoreRoots& roots, Unreadable unreadable,
                       const Cancellation& cancellation, const EachEntry& each) {
  for (const auto& root : roots.list()) {
    NSErrorPtr error = walkFolder(root->folder, root->path, unreadable, cancellation, each);
    if (error != nullptr) return error;
  }
  return nullptr;
}

NSErrorPtr walkMarkers(const StoreRoots& roots, const std::vector<std::string>& otherFolders,
                       const Cancellation& cancellation, const EachMarker& each) {
  const EachEntry look = [&](const std::string& folderPath, const DirectoryHandle& folder,
                             const std::string& name, const struct stat& status) -> NSErrorPtr {
    if (!S_ISREG(status.st_mode) || status.st_uid != geteuid() || !mayBeMarkerName(name)) {
      return nullptr;
    }
    return tellOf(folder, folderPath, name, each);
  };
  NSErrorPtr error = walkEntries(roots, Unreadable::Stops, cancellation, look);
  for (const std::string& path : otherFolders) {
    if (error != nullptr) break;
    // Nobody else can hide this user's files in one, nor keep the walk from its end with one.
    struct stat status {};
    if (lstat(path.c_str(), &status) != 0 || status.st_uid != geteuid()) continue;
    DirectoryHandle folder;
    const int code = DirectoryHandle::openRoot(path, folder);
    if (isGone(code)) continue;
    error = code != 0 ? couldNotRead(code, path)
                      : walkFolder(folder, path, Unreadable::Stops, cancellation, look);
  }
  return error;
}

}  // namespace skein::vald
