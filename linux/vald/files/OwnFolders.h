#pragma once

#include <sys/stat.h>

#include <string>
#include <vector>

namespace skein::vald {

// The folders that this system writes by itself (states, clouds, the desktop's thumbnails).
// Where a drive holds one, such as a drive over the home folder, it is left out of the drive:
// else what vald writes would be a change that makes it write again. They are known by device
// and inode, under whatever name.
//
// Says which these are; those that are not there are left away. Once, before threads ask.
void setOwnFolders(const std::vector<std::string>& paths);

// Any thread.
bool isOwnFolder(dev_t device, ino_t inode);
inline bool isOwnFolder(const struct stat& status) {
  return S_ISDIR(status.st_mode) && isOwnFolder(status.st_dev, status.st_ino);
}

// Whether one of them is this folder or lies below it: then it must stay where it is.
bool holdsOwnFolder(const std::string& path);

// Those of `paths` that lie below the folder `top`, as they are called there.
std::vector<std::string> foldersBelow(const std::string& top,
                                      const std::vector<std::string>& paths);

}  // namespace skein::vald
