#pragma once

#include <string>

#include "platform/foundation/NSError.h"

namespace skein {

// Where one drive's processes keep what is theirs. Several drives run beside each other:
// each has folders of its own, named after the drive.
struct DrivePaths {
  std::string store;                // the drive's folder, absolute, symbolic links resolved
  std::string driveID;              // 16 hexadecimal digits made from `store`
  std::string runtimeDirectory;     // $XDG_RUNTIME_DIR/skein/<driveID>, mode 0700
  std::string stateDirectory;       // $XDG_STATE_HOME/skein/<driveID>, mode 0700
  std::string containersDirectory;  // $XDG_DATA_HOME/skein/<driveID>/containers
  std::string cloudDirectory;       // $XDG_DATA_HOME/skein/<driveID>/cloud
  std::string daemonSocket;
  std::string hostSocket;
  std::string database;
  std::string daemonLog;
  std::string hostLog;

  // `store`: an existing folder, as the user typed it. Makes the folders. Stores an error
  // that names the cause (no such folder, not a folder, a runtime folder of somebody
  // else's, a socket path too long for the system) and answers with an empty store.
  static DrivePaths forStore(const std::string& store, NSErrorOut error);
};

}  // namespace skein
