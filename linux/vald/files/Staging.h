#pragma once

#include <memory>
#include <set>
#include <string>

#include "base/Mutex.h"
#include "linux/vald/files/DirectoryHandle.h"
#include "linux/vald/files/FileLayer.h"
#include "linux/vald/files/StoreRoots.h"
#include "platform/foundation/NSError.h"

namespace skein::vald {

// A place for contents that are not yet, or no longer, in the store: a fresh name on the
// same volume as the store's folder, so that they come and go by one rename.
struct StagingPlace {
  DirectoryHandle folder;
  std::string name;
  std::string path;  // absolute
  bool outside = false;
};

// Gives such places: in the drive's state folder when it is on the root's volume, where no
// watcher sees them; else a reserved name (isStagingName) in the folder itself. Any thread.
class Staging {
 public:
  // Opens, and makes, "staging" in the state folder (absolute).
  NSErrorPtr open(const std::string& stateDirectory, FileLayer& files);

  // `prefix`: kImportPrefix or kRemovalPrefix. `beside`: where the item goes or is.
  NSErrorPtr place(const char* prefix, const StorePlace& beside, StagingPlace& place);
  // The name beside a moved item under which it waits, out of sight, to be deleted, when its copy
  // is staged at `copyPath`, which place() gave.
  static std::string sourceName(const std::string& copyPath);
  // The outside staging of this root turned out to be another volume to the system (as
  // with quotas by project): from now on in the folder itself.
  void refuseOutside(const StorePlace& beside);

  // Where `path`, one that place() gave in this or an earlier run, is now.
  NSErrorPtr find(const std::string& path, const StoreRoots& roots, StagingPlace& place) const;
  // At start: deletes all that is outside but these names.
  int clear(FileLayer& files, const std::set<std::string>& kept) const;

 private:
  std::string _path;
  DirectoryHandle _folder;
  Mutex _mutex;
  std::set<std::string> _refused SKEIN_GUARDED_BY(_mutex);  // roots
};

}  // namespace skein::vald
