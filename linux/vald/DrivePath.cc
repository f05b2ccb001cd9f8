#include "linux/vald/DrivePath.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <string_view>

#include "linux/protocol/FileDescriptor.h"
#include "linux/vald/WatchScope.h"

namespace skein::vald {
namespace {

// The components of what follows `root` in `path`; empty for the root itself.
std::vector<std::string> componentsBelow(const std::string& root, const std::string& path) {
  std::vector<std::string> components;
  if (path == root) return components;
  std::size_t start = root == "/" ? 1 : root.size() + 1;
  while (start <= path.size()) {
    const std::size_t end = std::min(path.find('/', start), path.size());
    components.push_back(path.substr(start, end - start));
    start = end + 1;
  }
  return components;
}

bool isLink(int folder, const std::string& name) {
  struct stat status {};
  return fstatat(folder, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 &&
         S_ISLNK(status.st_mode);
}

}  // namespace

NSErrorPtr noSuchFile(const std::string& reason) {
  return NSError::errorWithDomain(NSCocoaErrorDomain, NSFileNoSuchFileError,
                                  {{NSLocalizedDescriptionKey, reason}});
}

NSErrorPtr checkDrivePath(const std::string& path, const std::vector<std::string>& roots) {
  if (path.empty() || path.front() != '/' || path.find('\0') != std::string::npos) {
    return noSuchFile("\"" + path + "\" is not an absolute path.");
  }
  const auto root = std::find_if(roots.begin(), roots.end(), [&path](const std::string& folder) {
    return pathIsWithin(path, folder);
  });
  if (root == roots.end()) {
    return noSuchFile("\"" + path + "\" lies outside the drive " +
                      (roots.empty() ? std::string() : roots.front()) + ".");
  }

  const std::vector<std::string> components = componentsBelow(*root, path);
  for (const std::string& component : components) {
    if (component.empty() || component == "." || component == "..") {
      return noSuchFile("\"" + path + "\" has an empty, \".\" or \"..\" component.");
    }
  }
  constexpr int kFolder = O_PATH | O_DIRECTORY | O_CLOEXEC;
  FileDescriptor folder(open(root->c_str(), kFolder));
  for (std::size_t i = 0; i + 1 < components.size() && folder; ++i) {
    if (isLink(folder.get(), components[i])) {
      return noSuchFile("\"" + path + "\" leads through the symbolic link \"" + components[i] +
                        "\", which the drive does not follow.");
    }
    folder = FileDescriptor(openat(folder.get(), components[i].c_str(), kFolder | O_NOFOLLOW));
  }
  return nullptr;
}

}  // namespace skein::vald
