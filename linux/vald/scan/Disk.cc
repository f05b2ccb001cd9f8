#include "linux/vald/scan/Disk.h"

#include <cerrno>

namespace skein::vald {
namespace {
constexpr std::size_t kMostOpen = 64;
}

Look Disk::open(FolderKey folder, int& descriptor, int& error) {
  const auto known = _open.find(folder);
  if (known != _open.end()) {
    descriptor = known->second.get();
    return Look::Seen;
  }
  std::string relative;
  TreeRoot* root = _folders.rootOf(folder, relative);
  if (root == nullptr) {
    error = ENOENT;
    return Look::Gone;
  }
  if (root->isLost) return Look::RootLost;
  FileDescriptor opened;
  const Look look =
      openFolder(root->folder, relative, _folders.find(folder)->row.key, opened, error);
  if (look == Look::RootLost) root->isLost = true;
  if (look != Look::Seen) return look;
  if (_open.size() >= kMostOpen) _open.clear();
  descriptor = opened.get();
  _open[folder] = std::move(opened);
  return Look::Seen;
}

Look Disk::at(FolderKey folder, const std::string& name, FileState& state) {
  int descriptor = -1;
  int error = 0;
  const Look look = open(folder, descriptor, error);
  return look == Look::Seen ? readEntry(descriptor, name, state, error) : look;
}

}  // namespace skein::vald
