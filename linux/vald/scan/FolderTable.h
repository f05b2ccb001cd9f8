#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <unordered_map>
#include <utility>
#include <vector>

#include "linux/vald/index/IndexWriter.h"
#include "linux/vald/index/ItemMaking.h"
#include "linux/vald/scan/FolderReader.h"

namespace skein::vald {

// One of the store's roots: the drive's folder, or an app container's.
struct TreeRoot {
  RootFolder folder;
  std::optional<std::string> containerID;
  bool isLost = false;  // its folder is missing: nothing below it is believed
};

// One folder, as the writer knows it.
struct Folder {
  FolderRow row;
  std::uint32_t round = 0;  // the last round of scanning that asked for it
  std::uint32_t read = 0;   // the last round in which it was read
  std::uint32_t retained = 0;
  bool isTouched = false;      // its row is to be written at the next commit
  bool isCountUntold = false;  // its own item is to be journalled with the new count
};

// Every folder of the store in memory, for the writer thread alone: what a path is made
// of, and what a scan has yet to see. The index holds the same.
class FolderTable {
 public:
  // Forgets everything and begins with these rows.
  void load(std::vector<FolderRow> rows, FolderKey next);

  // A pointer is valid until the next add() or remove().
  Folder* find(FolderKey folder);
  FolderKey folderWithID(VLFileObjectID id) const;  // kNoFolder: there is none
  // Draws a key for a folder that is new.
  FolderKey add(FolderRow row);
  void remove(FolderKey folder);
  void touch(FolderKey folder);
  std::vector<FolderKey> takeTouched();

  void setRoot(FolderKey folder, TreeRoot root) { _roots[folder] = std::move(root); }
  void removeRoot(FolderKey folder) { _roots.erase(folder); }
  std::unordered_map<FolderKey, TreeRoot>& roots() { return _roots; }
  // The root above a folder and the path below it; null for one that hangs in the air.
  TreeRoot* rootOf(FolderKey folder, std::string& relativePath);
  std::string pathOf(FolderKey folder);

  ItemHolder holder(FolderKey folder);
  // Whether the folder is a trash, or lies in one.
  bool isTrashed(FolderKey folder);
  // The trash of a root; kNoFolder while it has none.
  FolderKey trashOf(FolderKey root) const;
  std::size_t size() const { return _folders.size(); }
  template <class F>
  void forEach(F&& visit) {
    for (auto& [key, folder] : _folders) visit(key, folder);
  }

 private:
  std::unordered_map<FolderKey, Folder> _folders;
  std::unordered_map<std::uint64_t, FolderKey> _folderByID;
  std::unordered_map<FolderKey, TreeRoot> _roots;
  std::unordered_map<FolderKey, FolderKey> _trashes;  // by root
  std::vector<FolderKey> _touched;
  FolderKey _next = kDriveFolder;
};

}  // namespace skein::vald
