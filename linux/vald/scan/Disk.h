#pragma once

#include <string>
#include <unordered_map>

#include "linux/vald/scan/FolderTable.h"

namespace skein::vald {

// The disk as the folder table addresses it. Keeps folders that were opened for the
// length of one batch. On the writer thread.
class Disk {
 public:
  explicit Disk(FolderTable& folders) : _folders(folders) {}

  // Opens a folder; the descriptor stays this object's. A root that turns out to be
  // missing is marked lost.
  Look open(FolderKey folder, int& descriptor, int& error);
  // What stands at a name. A folder that is gone holds nothing.
  Look at(FolderKey folder, const std::string& name, FileState& state);
  // Closes what was opened: folders may have moved since.
  void forget() { _open.clear(); }

 private:
  FolderTable& _folders;
  std::unordered_map<FolderKey, FileDescriptor> _open;
};

}  // namespace skein::vald
