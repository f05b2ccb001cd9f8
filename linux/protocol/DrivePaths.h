#pragma once

#include <string>

#include "platform/foundation/NSError.h"

namespace skein {

// Names in a drive's state folder. Locks and sockets stand beside the data that they protect,
// so that whoever finds the data finds the processes, from every session of the user.
inline constexpr char kDaemonSocketName[] = "/vald.socket";
inline constexpr char kHostSocketName[] = "/skein-host.socket";
inline constexpr char kDaemonLockName[] = "/vald.lock";
inline constexpr char kHostLockName[] = "/skein-host.lock";

// The folders that hold every drive's folders of that name.
struct DriveTops {
  std::string state;  // $XDG_STATE_HOME/skein
  std::string data;   // $XDG_DATA_HOME/skein
};

// Where one drive's processes keep what is theirs. Several drives run beside each other:
// each has folders of its own, named after the drive's identity (DriveIdentity.h).
struct DrivePaths {
  std::string store;                // the drive's folder, absolute, symbolic links resolved
  std::string driveID;              // 32 hexadecimal digits, or 16 made from `store`
  std::string stateDirectory;       // $XDG_STATE_HOME/skein/<driveID>, mode 0700
  std::string containersDirectory;  // $XDG_DATA_HOME/skein/<driveID>/containers
  std::string cloudDirectory;       // $XDG_DATA_HOME/skein/<driveID>/cloud
  std::string daemonSocket;         // may be longer than an address holds, see UnixSocket.h
  std::string hostSocket;
  std::string daemonLock;
  std::string hostLock;
  std::string database;
  std::string daemonLog;
  std::string hostLog;
  bool isNew = false;  // this call made it a drive

  // `store`: an existing folder, as the user typed it. Makes the folders, and gives the
  // drive an identity when it has none. Stores an error that names the cause (no such
  // folder, not a folder, a state folder of somebody else's, or one of identityOfDrive) and
  // answers with an empty store.
  static DrivePaths forStore(const std::string& store, NSErrorOut error);

  // Whether the folder is a drive already; nothing is made. False when it cannot be told.
  static bool isKnown(const std::string& store);
  // An error: there is no home folder.
  static DriveTops tops(NSErrorOut error);
};

}  // namespace skein
