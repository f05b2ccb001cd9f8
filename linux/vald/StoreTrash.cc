// The roots' trash folders: listed nowhere, but what lies in them keeps its identifiers and
// can be asked for.
#include "linux/vald/StoreWriter.h"
#include "linux/vald/scan/DocumentNumbers.h"
#include "linux/vald/scan/StoreNames.h"

namespace skein::vald {

void StoreWriter::checkTrashes(bool now) {
  const std::string name = ownTrashFolderName();
  std::vector<FolderKey> roots;
  for (const auto& [folder, root] : _folders.roots()) {
    if (!root.isLost) roots.push_back(folder);
  }
  for (const FolderKey key : roots) {
    const RootFolder root = _folders.roots()[key].folder;
    FileDescriptor folder;
    int error = 0;
    if (const Folder* known = _folders.find(_folders.trashOf(key))) {
      if (openFolder(root, known->row.name, known->row.key, folder, error) != Look::Gone) continue;
      removeTrash(key);
    }
    // Found by its path first, and then without following links.
    const auto found = findRoot(root.path + '/' + name, error);
    if (!found || openFolder(root, name, found->key, folder, error) != Look::Seen) continue;
    addTrash(key, found->key, now);
  }
}

void StoreWriter::addTrash(FolderKey root, const FileKey& key, bool now) {
  const bool isOwnTransaction = !_inTransaction;
  begin();
  FolderRow row;
  std::uint32_t attempt = 0;
  do {
    row.id = VLFileObjectID::folderOrAliasWithRawID(inodeNumber(key, attempt++));
  } while (_folders.folderWithID(row.id) != kNoFolder || _bulkIDs.contains(row.id.rawID()));
  row.parent = root;
  row.name = ownTrashFolderName();
  row.key = key;
  const FolderKey folder = _folders.add(std::move(row));
  _index.setSetting(trashSetting(root), std::to_string(folder));
  int descriptor = -1;
  int error = 0;
  _disk.forget();
  if (now && !_isBulk && _disk.open(folder, descriptor, error) == Look::Seen) {
    noteWatch(folder, _watcher.watch(folder, descriptor));
    const FolderSnapshot snapshot = readFolder(descriptor, Detail::Full);
    if (snapshot.look == Look::Seen) {
      _folders.find(folder)->row.scanned = true;
      _folders.find(folder)->round = _round;
      _reconciler.addFolder(folder, snapshot);
    }
  } else {
    enqueue({folder});
  }
  if (isOwnTransaction) commit();
}

void StoreWriter::removeTrash(FolderKey root) {
  const FolderKey folder = _folders.trashOf(root);
  if (folder == kNoFolder || _isBulk) return;
  const bool isOwnTransaction = !_inTransaction;
  begin();
  for (const ItemRow& row : _index.childrenOf(folder)) _reconciler.buryTree(row);
  _watcher.unwatch(folder);
  _folders.touch(folder);
  _folders.remove(folder);
  _index.setSetting(trashSetting(root), std::nullopt);
  afterDecisions();
  if (isOwnTransaction) commit();
}

}  // namespace skein::vald
