#pragma once

#include <sys/stat.h>

#include <cstddef>
#include <string>
#include <vector>

#include "linux/vald/files/DirectoryHandle.h"

namespace skein::vald {

// Goes through a file or a tree, depth first. However deep the tree is, few folders are open
// and no stack grows; memory grows with the names of the folders that wait on the way down.
// Symbolic links are entries like files. One use at a time; one thread.
class TreeWalk {
 public:
  virtual ~TreeWalk() = default;

  // `path`: what `name` in `folder` is called in errors. 0, or the errno that ended the walk;
  // path() is where then. ESTALE: a folder was moved meanwhile.
  int walk(const DirectoryHandle& folder, const std::string& name, const std::string& path);

  // Of what is being visited.
  const std::string& path() const { return _path; }

 protected:
  // visit() of a folder answers this to leave it out.
  static constexpr int kStepOver = -1;

  // Each entry, a folder before anything in it. Here and below, 0 or the errno that ends the
  // walk.
  virtual int visit(const DirectoryHandle& folder, const std::string& name,
                    const struct stat& status) = 0;
  // A folder is about to be read, and all that is in it has been visited.
  virtual int enter(const DirectoryHandle&, const std::string& /*name*/) { return 0; }
  virtual int leave(const DirectoryHandle&, bool /*isEmpty*/) { return 0; }
  // After leave(), from outside.
  virtual int didLeave(const DirectoryHandle& /*parent*/, const std::string& /*name*/) { return 0; }
  // A folder cannot be opened, or not be read to its end, or an entry not be looked at. 0 goes on
  // without.
  virtual int unreadable(int failure) { return failure; }

  // Of the folder that is entered or left; 1 is the first.
  std::size_t depth() const { return _levels.size(); }

 private:
  struct Level {
    std::string name;
    dev_t device = 0;
    ino_t inode = 0;
    std::size_t pathLength = 0;  // of the folder that holds it
    bool isEmpty = true;
    std::vector<std::string> folders;  // that are yet to be entered
  };

  // Opens and lists a folder, and makes `folder` it.
  int descend(const DirectoryHandle& from, const std::string& name, DirectoryHandle& folder);
  int list(const DirectoryHandle& folder);
  // Leaves `folder`, and makes it the one above.
  int ascend(const DirectoryHandle& top, DirectoryHandle& folder);

  std::string _path;
  std::vector<Level> _levels;
};

}  // namespace skein::vald
