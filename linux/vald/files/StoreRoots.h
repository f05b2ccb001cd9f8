#pragma once

#include <memory>
#include <string>
#include <vector>

#include "base/Mutex.h"
#include "linux/vald/files/DirectoryHandle.h"
#include "platform/foundation/NSError.h"

namespace skein::vald {

// One root that files are kept under: the drive's folder, or an app container's. Opened
// once; a root that is renamed meanwhile stays the same folder, until another one of an app's
// stands in its place.
struct OpenRoot {
  std::string path;  // absolute, as documents' paths begin
  DirectoryHandle folder;
  // Another folder that stands at the path is the root then. Not the drive's own: that is
  // missing until its very folder is back.
  bool mayBeMadeAnew = false;
};

// Whether a folder that was opened at `path`, and is on `device`, is where a file system is
// mounted: it differs from its parent's. A volume that comes or goes makes nothing anew.
bool isMountPoint(const std::string& path, dev_t device);

// A place in the store: an existing folder, open, and a name in it that may or may not be
// there. The name is empty for a root itself; then `folder` is that root.
struct StorePlace {
  std::shared_ptr<const OpenRoot> root;
  std::string relative;  // below the root; empty for the root itself
  std::string folderRelative;
  std::string name;
  DirectoryHandle folder;

  std::string path() const;
  std::string folderPath() const;
  bool isRoot() const { return name.empty(); }
  bool isAtRoot() const { return !name.empty() && folderRelative.empty(); }
};

// Finds places by absolute path, without following symbolic links below a root. Any thread.
class StoreRoots {
 public:
  // Opens every root, the drive's first, then the app containers'. Null, or the error of the first
  // that cannot be opened; then the roots stay as they were.
  NSErrorPtr set(const std::vector<std::string>& paths);
  std::vector<std::shared_ptr<const OpenRoot>> list() const;

  // The place of a path inside a root; its folder must be there. Cocoa 4 when it is not,
  // "no permission" for a path outside every root, "invalid name" for a path that is none.
  NSErrorPtr locate(const std::string& path, StorePlace& place) const;
  // A folder and a name in it.
  NSErrorPtr locate(const std::string& folder, const std::string& name, StorePlace& place) const;
  // Whether the path lies in a root, by name alone.
  bool contains(const std::string& path) const;

 private:
  std::shared_ptr<const OpenRoot> rootOf(const std::string& path) const SKEIN_EXCLUDES(_mutex);
  // The root itself, or the one that took its place on the disk, which is kept from then on.
  std::shared_ptr<const OpenRoot> current(std::shared_ptr<const OpenRoot> root) const
      SKEIN_EXCLUDES(_mutex);

  mutable Mutex _mutex;
  mutable std::vector<std::shared_ptr<const OpenRoot>> _roots SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein::vald
