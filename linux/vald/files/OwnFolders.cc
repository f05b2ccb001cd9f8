#include "linux/vald/files/OwnFolders.h"

#include <algorithm>
#include <filesystem>
#include <utility>

#include "linux/vald/files/FileNames.h"

namespace skein::vald {
namespace {

std::vector<std::pair<dev_t, ino_t>> ownFolders;
std::vector<std::string> ownPaths;

}  // namespace

void setOwnFolders(const std::vector<std::string>& paths) {
  ownFolders.clear();
  ownPaths = foldersBelow("", paths);
  for (const std::string& path : paths) {
    struct stat status {};
    if (stat(path.c_str(), &status) == 0) ownFolders.emplace_back(status.st_dev, status.st_ino);
  }
}

bool isOwnFolder(dev_t device, ino_t inode) {
  return std::find(ownFolders.begin(), ownFolders.end(), std::pair(device, inode)) !=
         ownFolders.end();
}

bool holdsOwnFolder(const std::string& path) {
  return std::any_of(ownPaths.begin(), ownPaths.end(),
                     [&](const std::string& own) { return isAtOrBelow(own, path); });
}

std::vector<std::string> foldersBelow(const std::string& top,
                                      const std::vector<std::string>& paths) {
  std::vector<std::string> below;
  for (const std::string& path : paths) {
    std::error_code failed;
    std::string real = std::filesystem::canonical(path, failed);
    if (!failed && real != top && isAtOrBelow(real, top)) below.push_back(std::move(real));
  }
  return below;
}

}  // namespace skein::vald
