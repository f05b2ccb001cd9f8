#pragma once

#include <string>
#include <vector>

#include "platform/foundation/NSError.h"

namespace skein {

// Which drive a folder is. A drive has an identity of its own, 128 random bits, that travels
// with its folder as an attribute of it, so that a folder that was renamed or moved is the
// same drive. The drive's state notes which folder it last belonged to (its path, and the
// folder's inode and birth), and that tells a copy from the drive: who copies a folder copies
// the attribute too.
//
// - The noted path, or the noted folder at another mount of the same volume: the same drive.
// - Another folder with this identity stands at the noted path: this one is a copy. It is
//   given an identity of its own and begins as a new drive.
// - Nothing with this identity stands there any more: the folder was moved here.
//
// Where attributes are refused (the file system has none, the folder may not be written) the
// identity is made from the folder's path.
struct DriveIdentity {
  std::string name;    // 32 hexadecimal digits, or 16 when it was made from the path
  std::string path;    // where the drive's processes have its folder: another mount keeps this
  bool isNew = false;  // nothing was known of the drive, and now it is
};

// "`what`: the text of errno `code`.", in NSPOSIXErrorDomain: a folder of the drive or of its
// processes could not be used.
NSErrorPtr pathFailure(int code, const std::string& what);

// Finds the identity of the folder `path` (absolute, links resolved, there), and gives it one
// when it has none. `stateTop` and `dataTop` are the folders that hold each drive's folders of
// that name; `stateTop` is there. When it returns, the drive's state folder is there and notes
// the folder.
//
// A drive that was known by its path only is taken over, with all that is its own. Processes
// that serve a moved drive at its old path are told to end: their sockets are removed.
//
// Nobody has agreed to uploads of a drive that is new (UploadConsent.h).
//
// Errors: the state folder cannot be written, another process holds the list of drives for
// seconds, an older version's processes still serve the drive, the folder at the noted path
// cannot be looked at. Any process and thread; waits for the disk.
DriveIdentity identityOfDrive(const std::string& path, const std::string& stateTop,
                              const std::string& dataTop, NSErrorOut error);

// Whether the folder is a drive whose state is here; nothing is made or changed. A copy of a
// drive is none yet. As above.
bool isKnownDrive(const std::string& path, const std::string& stateTop);

// What the drives' states note: where each drive is, or was last.
struct NotedDrive {
  std::string name;
  std::string path;      // empty: nothing is noted, as before folders had identities
  bool isThere = false;  // the drive's folder stands there
};
std::vector<NotedDrive> notedDrives(const std::string& stateTop);

// Takes the identity off the folder, if it is this one.
void removeIdentity(const std::string& path, const std::string& name);

}  // namespace skein
