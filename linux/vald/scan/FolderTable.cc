#include "linux/vald/scan/FolderTable.h"

#include <algorithm>

#include "linux/vald/scan/StoreNames.h"

namespace skein::vald {

void FolderTable::load(std::vector<FolderRow> rows, FolderKey next) {
  _folders.clear();
  _folderByID.clear();
  _touched.clear();
  _trashes.clear();
  _next = next;
  for (FolderRow& row : rows) {
    _next = std::max(_next, row.number + 1);
    _folderByID[row.id.rawID()] = row.number;
    const FolderKey number = row.number;
    if (isTrashFolderName(row.name)) _trashes[row.parent] = number;
    _folders[number].row = std::move(row);
  }
}

Folder* FolderTable::find(FolderKey folder) {
  const auto found = _folders.find(folder);
  return found != _folders.end() ? &found->second : nullptr;
}

FolderKey FolderTable::folderWithID(VLFileObjectID id) const {
  const auto found = id.isFolderOrAliasID() ? _folderByID.find(id.rawID()) : _folderByID.end();
  return found != _folderByID.end() ? found->second : kNoFolder;
}

FolderKey FolderTable::add(FolderRow row) {
  row.number = _next++;
  const FolderKey folder = row.number;
  _folderByID[row.id.rawID()] = folder;
  if (isTrashFolderName(row.name)) _trashes[row.parent] = folder;
  _folders[folder].row = std::move(row);
  touch(folder);
  return folder;
}

void FolderTable::remove(FolderKey folder) {
  const auto found = _folders.find(folder);
  if (found == _folders.end()) return;
  _folderByID.erase(found->second.row.id.rawID());
  if (isTrashFolderName(found->second.row.name)) _trashes.erase(found->second.row.parent);
  _folders.erase(found);
}

void FolderTable::touch(FolderKey folder) {
  Folder* found = find(folder);
  if (found == nullptr || found->isTouched) return;
  found->isTouched = true;
  _touched.push_back(folder);
}

std::vector<FolderKey> FolderTable::takeTouched() {
  auto touched = std::exchange(_touched, {});
  for (const FolderKey folder : touched) {
    if (Folder* found = find(folder)) found->isTouched = false;
  }
  return touched;
}

TreeRoot* FolderTable::rootOf(FolderKey folder, std::string& relativePath) {
  std::vector<const std::string*> names;
  while (const Folder* found = find(folder)) {
    const auto root = _roots.find(folder);
    if (root != _roots.end()) {
      relativePath.clear();
      for (auto name = names.rbegin(); name != names.rend(); ++name) {
        if (!relativePath.empty()) relativePath += '/';
        relativePath += **name;
      }
      return &root->second;
    }
    // Moves that are seen in a wrong order may make a ring for a while.
    if (names.size() > _folders.size()) return nullptr;
    names.push_back(&found->row.name);
    folder = found->row.parent;
  }
  return nullptr;
}

std::string FolderTable::pathOf(FolderKey folder) {
  std::string relative;
  const TreeRoot* root = rootOf(folder, relative);
  if (root == nullptr) return {};
  return relative.empty() ? root->folder.path : root->folder.path + '/' + relative;
}

ItemHolder FolderTable::holder(FolderKey folder) {
  const Folder* found = find(folder);
  return {found != nullptr ? found->row.id : VLFileObjectID::folderOrAliasWithRawID(0),
          folder == kDriveFolder, isTrashed(folder)};
}

bool FolderTable::isTrashed(FolderKey folder) {
  std::size_t steps = 0;
  while (const Folder* found = find(folder)) {
    if (isTrashFolderName(found->row.name)) return true;
    if (_roots.contains(folder) || ++steps > _folders.size()) return false;
    folder = found->row.parent;
  }
  return false;
}

FolderKey FolderTable::trashOf(FolderKey root) const {
  const auto found = _trashes.find(root);
  return found != _trashes.end() ? found->second : kNoFolder;
}

}  // namespace skein::vald
