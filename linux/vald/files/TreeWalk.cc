#include "linux/vald/files/TreeWalk.h"

#include <cerrno>
#include <utility>

#include "linux/vald/files/FileNames.h"

namespace skein::vald {

int TreeWalk::walk(const DirectoryHandle& top, const std::string& name, const std::string& path) {
  _path = path;
  _levels.clear();
  struct stat status {};
  if (const int failure = top.status(name, status)) return failure;
  int failure = visit(top, name, status);
  if (failure == kStepOver) return 0;
  if (failure != 0 || !S_ISDIR(status.st_mode)) return failure;
  DirectoryHandle folder;
  failure = descend(top, name, folder);
  while (failure == 0 && !_levels.empty()) {
    Level& level = _levels.back();
    if (level.folders.empty()) {
      failure = ascend(top, folder);
    } else {
      const std::string next = std::move(level.folders.back());
      level.folders.pop_back();
      failure = descend(folder, next, folder);
    }
  }
  return failure;
}

int TreeWalk::descend(const DirectoryHandle& from, const std::string& name,
                      DirectoryHandle& folder) {
  Level level;
  level.name = name;
  level.pathLength = _path.size();
  if (!_levels.empty()) _path = joinPath(_path, name);
  DirectoryHandle below;
  struct stat status {};
  int failure = from.openFolder(name, below);
  if (failure == 0) failure = below.status(status);
  if (failure != 0) {
    failure = unreadable(failure);
    if (failure == 0) _path.resize(level.pathLength);
    return failure;
  }
  level.device = status.st_dev;
  level.inode = status.st_ino;
  _levels.push_back(std::move(level));
  failure = enter(below, name);
  if (failure == 0) failure = list(below);
  folder = std::move(below);
  return failure;
}

int TreeWalk::list(const DirectoryHandle& folder) {
  Level& level = _levels.back();
  const std::size_t length = _path.size();
  int ending = 0;
  const int failure = folder.list([&](const std::string& name) {
    level.isEmpty = false;
    struct stat status {};
    const int looking = folder.status(name, status);
    if (looking == ENOENT) return true;  // gone since
    if (looking != 0) return (ending = unreadable(looking)) == 0;
    _path = joinPath(_path, name);
    ending = visit(folder, name, status);
    if (ending > 0) return false;
    _path.resize(length);
    if (ending == 0 && S_ISDIR(status.st_mode)) level.folders.push_back(name);
    ending = 0;
    return true;
  });
  return ending == 0 && failure != 0 ? unreadable(failure) : ending;
}

int TreeWalk::ascend(const DirectoryHandle& top, DirectoryHandle& folder) {
  if (const int failure = leave(folder, _levels.back().isEmpty)) return failure;
  const Level left = std::move(_levels.back());
  _levels.pop_back();
  if (_levels.empty()) return didLeave(top, left.name);
  _path.resize(left.pathLength);
  DirectoryHandle parent;
  struct stat status {};
  int failure = folder.openParent(parent);
  if (failure == 0) failure = parent.status(status);
  if (failure != 0) return failure;
  const Level& above = _levels.back();
  if (status.st_dev != above.device || status.st_ino != above.inode) return ESTALE;
  folder = std::move(parent);
  return didLeave(folder, left.name);
}

}  // namespace skein::vald
