#pragma once

#include <optional>
#include <string>
#include <vector>

#include "base/Mutex.h"
#include "linux/desktop/DesktopEntries.h"
#include "linux/vald/Store.h"
#include "platform/log/Log.h"
#include "vellum/VLContainer.h"

namespace skein::vald {

struct ContainerFolders {
  std::string drive;                      // the drive's folder
  std::string containers;                 // where the app containers' folders are made
  std::vector<std::string> applications;  // where desktop entries are, the first wins
};

// The drive's containers: its own, and those of the installed apps. An app container's
// folder of documents is made when an app that claims it is found. When the app goes, the
// container leaves the list; its folder stays, untouched, and is back with the app.
// Documents and Desktop are folders of the drive, never made here.
class Containers {
 public:
  // Reads the desktop entries at once. `log` outlives it.
  Containers(ContainerFolders folders, Log& log);

  // Looks again; whether anything differs, a name or an icon included. One thread at a
  // time, which may wait for the disk.
  bool refresh() SKEIN_EXCLUDES(_mutex);

  // The same for Documents and Desktop alone, which costs two questions to the disk.
  bool refreshDriveFolders() SKEIN_EXCLUDES(_mutex);

  // All of them, the drive's own first. Any thread.
  std::vector<VLContainer::Properties> list() const SKEIN_EXCLUDES(_mutex);

  // One of them, whose documents folder is there: when it is gone it is made again if
  // `recreate`, which `recreated` tells; the drive's own folder never is. An error for a
  // container that is not known, and for a folder that is not there or cannot be made. As
  // refresh().
  VLContainer::Properties find(const std::string& containerID, bool recreate, bool& recreated,
                               NSErrorOut error) SKEIN_EXCLUDES(_mutex);

  // The app containers that have a folder, as the store indexes them. Any thread.
  std::vector<StoreRoot> storeRoots() const SKEIN_EXCLUDES(_mutex);

 private:
  struct Known {
    AppContainer app;
    std::optional<std::string> documents;  // nil when it could not be made

    friend bool operator==(const Known&, const Known&) = default;
  };
  struct State {
    std::vector<Known> apps;
    bool hasDocuments = false;
    bool hasDesktop = false;

    friend bool operator==(const State&, const State&) = default;
  };

  bool hasDriveFolder(const char* name) const;
  std::vector<Known> lookForApps() const;
  bool keep(State state) SKEIN_EXCLUDES(_mutex);

  const ContainerFolders _folders;
  Log& _log;
  mutable Mutex _mutex;
  State _state SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein::vald
