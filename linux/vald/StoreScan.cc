// The writer's rounds over the store: roots, folders that were read, the bulk load.
#include <algorithm>
#include <cerrno>
#include <cstring>
#include <iterator>

#include "base/Numbers.h"
#include "linux/vald/StoreWriter.h"
#include "linux/vald/files/FileNames.h"
#include "linux/vald/files/StoreRoots.h"
#include "linux/vald/index/IndexFile.h"
#include "linux/vald/scan/DocumentNumbers.h"
#include "linux/vald/scan/StoreNames.h"

namespace skein::vald {
namespace {

constexpr char kComplete[] = "scanned once";
constexpr char kAttributesUntil[] = "attributes until";
// A bulk load tells so many items one by one; a small folder is all there is to many.
constexpr std::uint64_t kMostToldInBulk = 5000;
constexpr int kPages = 1000;
constexpr int kPagesOfBulk = 8000;

bool isSameRoot(const FileKey& a, const FileKey& b) {
  return a.inode == b.inode && a.generation == b.generation;
}

// Whether the folder that stands in the place of an app's was made anew, by whomever; it is
// the container's from then on, and what was in the old one is gone. Where a volume is
// mounted or was unmounted, and for the drive's own folder, nothing is concluded.
bool wasMadeAnew(const TreeRoot& root, const std::optional<RootFolder>& found) {
  return root.containerID && found && !isSameRoot(found->key, root.folder.key) &&
         !isMountPoint(root.folder.path, found->device) &&
         (root.folder.device == 0 || root.folder.device == found->device);
}

}  // namespace

// ---- roots and rounds

void StoreWriter::load() {
  _reload = false;
  note({});
  _watcher.clear();
  _folders.load(_index.folders(), _index.nextFolder());
  _folders.roots().clear();
  _unreadable.clear();
  {
    MutexLock lock(_mutex);
    _unwatched.clear();
  }
  const auto now = std::chrono::steady_clock::now();
  _lastTick = now;
  _lastSlowRound = now;
  _bulkStart = now;
  _isBulk = _folders.size() == 0;
  checkpointAfter(_isBulk ? kPagesOfBulk : kPages);
  if (!_isBulk && !hasSecondaryIndexes(*_database)) buildSecondaryIndexes(*_database);

  begin();
  if (_folders.find(kDriveFolder) == nullptr) {
    FolderRow row;
    row.id = VLFileObjectID::folderOrAliasWithRawID(inodeNumber(_drive.key, 0));
    row.key = _drive.key;
    _folders.add(std::move(row));
    _index.putRoot({kDriveFolder, std::nullopt, _drive.path, _drive.key});
  }
  _folders.setRoot(kDriveFolder, {_drive, std::nullopt, false});
  for (RootRow& root : _index.roots()) {
    int error = 0;
    if (const auto moved = pathNow(root)) {
      root.path = *moved;
      _index.putRoot(root);
    }
    if (!root.containerID) continue;
    const auto found = findRoot(root.path, error);
    const bool isThere = found && isSameRoot(found->key, root.key);
    _folders.setRoot(root.folder, {isThere ? *found : RootFolder{root.path, 0, root.key},
                                   root.containerID, !isThere});
  }
  commit();
  setContainers(_options.containers);
  checkTrashes(false);
  for (const Copy& copy : std::exchange(_copies, {})) {
    if (!_isBulk) takeCopy(copy);
  }
  const auto rankOf = [&](const char* name) {
    const auto text = _index.setting(name);
    return text ? parseNumber<std::uint64_t>(*text).value_or(0) : 0;
  };
  _attributesAt = rankOf(kAttributesRead);
  _attributesUntil = rankOf(kAttributesUntil);
  if (!_isBulk && _attributesUntil == 0) {
    // A first scan that was cut off, or an index from before attributes were read.
    _attributesUntil = _index.rank();
    _index.setSetting(kAttributesUntil, std::to_string(_attributesUntil));
  }
  _isReadingAttributes = _attributesAt < _attributesUntil;
  startRound(_isBulk || !_index.setting(kComplete) ? LocalDaemonStatus::Scan::First
                                                   : LocalDaemonStatus::Scan::Verifying);
}

// Where the root's folder is, when that is elsewhere than the index says: the drive, or the
// folders that hold its containers, were renamed or moved.
std::optional<std::string> StoreWriter::pathNow(const RootRow& root) const {
  if (!root.containerID) {
    return root.path != _drive.path ? std::optional(_drive.path) : std::nullopt;
  }
  for (const StoreRoot& container : _options.containers) {
    if (container.containerID != root.containerID || container.path == root.path) continue;
    int error = 0;
    const auto found = findRoot(container.path, error);
    if (found && isSameRoot(found->key, root.key)) return container.path;
  }
  return std::nullopt;
}

void StoreWriter::setContainers(const std::vector<StoreRoot>& containers) {
  _options.containers = containers;
  const auto wanted = [&](const TreeRoot& root) {
    if (!root.containerID) return true;
    int error = 0;
    return std::any_of(containers.begin(), containers.end(),
                       [&](const StoreRoot& container) {
                         return container.containerID == root.containerID &&
                                container.path == root.folder.path;
                       }) &&
           !wasMadeAnew(root, findRoot(root.folder.path, error));
  };
  std::vector<FolderKey> unwanted;
  for (const auto& [folder, root] : _folders.roots()) {
    if (!wanted(root)) unwanted.push_back(folder);
  }
  if (!unwanted.empty() && _isBulk) endBulkLoad();
  begin();
  for (const FolderKey folder : unwanted) {
    removeTrash(folder);
    const Folder* found = _folders.find(folder);
    if (found != nullptr) {
      if (const auto row = _index.rowWithID(found->row.id)) _reconciler.buryTree(*row);
    }
    _index.eraseRoot(folder);
    _folders.removeRoot(folder);
  }
  std::vector<FolderKey> fresh;
  for (const StoreRoot& container : containers) {
    const auto known = std::find_if(
        _folders.roots().begin(), _folders.roots().end(),
        [&](const auto& root) { return root.second.containerID == container.containerID; });
    if (known != _folders.roots().end()) {
      Folder* folder = _folders.find(known->first);
      if (folder == nullptr || folder->row.name == container.displayName) continue;
      for (ItemRow& row : _index.rowsNamed(kDriveFolder, folder->row.name)) {
        if (row.folder != known->first) continue;
        row.name = container.displayName;
        _journal.update(row, kDriveFolder);
      }
      folder->row.name = container.displayName;
      _folders.touch(known->first);
      continue;
    }
    int error = 0;
    auto found = findRoot(container.path, error);
    if (!found || !container.containerID) {
      VL_ERROR(_log, "[ERROR] the documents folder %@ of %@ cannot be opened: %s", container.path,
               container.displayName, std::strerror(error));
      continue;
    }
    std::uint32_t attempt = 0;
    VLFileObjectID id = VLFileObjectID::folderOrAliasWithRawID(0);
    do {
      id = VLFileObjectID::folderOrAliasWithRawID(inodeNumber(found->key, attempt++));
    } while (_folders.folderWithID(id) != kNoFolder || _bulkIDs.contains(id.rawID()));
    FolderRow folder;
    folder.id = id;
    folder.name = container.displayName;
    folder.key = found->key;
    ItemRow row;
    row.parent = kDriveFolder;
    row.name = container.displayName;
    row.id = id;
    row.state.kind = ItemKind::Folder;
    row.state.key = found->key;
    row.containerID = container.containerID;
    row.folder = _folders.add(std::move(folder));
    _index.putRoot({row.folder, container.containerID, container.path, found->key});
    _folders.setRoot(row.folder, {std::move(*found), container.containerID, false});
    _journal.insert(row);
    fresh.push_back(row.folder);
  }
  afterDecisions();
  commit();
  enqueue(fresh);
  checkTrashes(false);
}

void StoreWriter::checkRoots() {
  bool isBack = false;
  bool isAnew = false;
  for (auto& [folder, root] : _folders.roots()) {
    int error = 0;
    const auto found = findRoot(root.folder.path, error);
    const bool isThere = found && isSameRoot(found->key, root.folder.key);
    if (isThere && root.isLost) {
      // A volume that is mounted again may come under another device.
      root.folder.device = found->device;
      root.folder.key = found->key;
      isBack = true;
      VL_NOTICE(_log, "[NOTICE] %@ is back", root.folder.path);
    } else if (wasMadeAnew(root, found)) {
      isAnew = true;
    } else if (!isThere && !root.isLost) {
      VL_ERROR(_log,
               "[ERROR] %@ is missing: deleted, renamed or unmounted. Nothing is taken for "
               "deleted; the drive goes on when the folder is back",
               root.folder.path);
    }
    root.isLost = !isThere;
  }
  for (const StoreRoot& container : _options.containers) {
    int error = 0;
    const bool isKnown = std::any_of(
        _folders.roots().begin(), _folders.roots().end(),
        [&](const auto& root) { return root.second.containerID == container.containerID; });
    if (!isKnown && findRoot(container.path, error)) isAnew = true;  // it could not be opened
  }
  if (isBack) startRound(LocalDaemonStatus::Scan::Rescanning);
  // In the middle of other work it waits for the next look, which is soon.
  if (isAnew && !_inTransaction) {
    VL_NOTICE(_log, "[NOTICE] an app's container is there anew; the drive goes on with it");
    setContainers(_options.containers);
    return;
  }
  checkTrashes(false);
}

void StoreWriter::startRound(LocalDaemonStatus::Scan kind) {
  if (_inRound) {
    _roundAgain = true;
    return;
  }
  ++_round;
  _inRound = true;
  _details.expectMore();
  _scanned = 0;
  _scanKind = kind;
  std::vector<FolderKey> roots;
  for (const auto& [folder, root] : _folders.roots()) {
    roots.push_back(folder);
    if (const FolderKey trash = _folders.trashOf(folder)) roots.push_back(trash);
  }
  // The drive's own folder is read first.
  std::sort(roots.begin(), roots.end());
  enqueue(roots);
  publish();
}

void StoreWriter::finishRound() {
  if (_isBulk) endBulkLoad();
  begin();
  _reconciler.endRound();
  afterDecisions();
  _index.setSetting(kComplete, "1");
  if (!_isReadingAttributes) takeWaitingHints();
  _inRound = false;
  _scanKind = LocalDaemonStatus::Scan::Idle;
  if (!commit()) return;
  if (std::exchange(_roundAgain, false)) startRound(LocalDaemonStatus::Scan::Rescanning);
}

void StoreWriter::enqueue(const std::vector<FolderKey>& folders) {
  if (folders.empty()) return;
  std::vector<ScanJob> jobs;
  for (const FolderKey key : folders) {
    Folder* folder = _folders.find(key);
    ScanJob job;
    const TreeRoot* root = folder != nullptr ? _folders.rootOf(key, job.relativePath) : nullptr;
    if (root == nullptr || root->isLost) continue;
    folder->round = _round;
    const auto separators = std::count(job.relativePath.begin(), job.relativePath.end(), '/');
    if (static_cast<std::size_t>(separators) >= kDeepestTree) {
      if (_unreadable.insert(key).second) {
        VL_NOTICE(_log,
                  "[NOTICE] what is in a folder below %@ is left out: it is more than %llu deep",
                  folder->row.name, static_cast<unsigned long long>(kDeepestTree));
      }
      continue;
    }
    job.folder = key;
    job.root = root->folder;
    job.key = folder->row.key;
    jobs.push_back(std::move(job));
  }
  _scanner.add(std::move(jobs));
}

void StoreWriter::enqueueSubfolders(FolderKey folder) {
  std::vector<FolderKey> subfolders = _index.subfoldersOf(folder);
  std::erase_if(subfolders, [&](FolderKey subfolder) {
    const Folder* found = _folders.find(subfolder);
    return found == nullptr || found->round == _round;
  });
  enqueue(subfolders);
}

// ---- one folder

void StoreWriter::noteWatch(FolderKey folder, bool isWatched) {
  MutexLock lock(_mutex);
  if (isWatched) {
    _unwatched.erase(folder);
  } else {
    _unwatched.insert(folder);
  }
}

void StoreWriter::noteUnreadable(FolderKey folder, int error) {
  if (_unreadable.insert(folder).second) {
    VL_NOTICE(_log, "[NOTICE] the folder %@ cannot be read: %s", _folders.pathOf(folder),
              std::strerror(error));
  }
}

void StoreWriter::afterDecisions() {
  for (const FolderKey folder : _reconciler.takeRemovedFolders()) {
    _watcher.unwatch(folder);
    _unreadable.erase(folder);
    MutexLock lock(_mutex);
    _unwatched.erase(folder);
  }
  enqueue(_reconciler.takeNewFolders());
}

void StoreWriter::accept(FolderKey key, const FolderSnapshot& snapshot, bool inRound, bool isOld) {
  Folder* folder = _folders.find(key);
  if (folder == nullptr) return;
  switch (snapshot.look) {
    case Look::Seen: break;
    case Look::Gone:
      // Its parent tells where it went; a trash is asked for by itself.
      if (isTrashFolderName(folder->row.name)) return;
      if (folder->row.parent != kNoFolder) {
        _later.folders[folder->row.parent].names.insert(folder->row.name);
      }
      return;
    case Look::Unreadable: noteUnreadable(key, snapshot.error); return;
    case Look::RootLost: checkRoots(); return;
  }
  _unreadable.erase(key);
  folder->read = _round;
  const bool isFirst = !folder->row.scanned;
  if (isFirst) {
    folder->row.scanned = true;
    folder->isCountUntold = true;
    _folders.touch(key);
  }
  if (_isBulk) {
    if (isFirst) loadFolder(key, snapshot);
    return;
  }
  if (!_reconciler.addFolder(key, snapshot, isOld)) {
    // It is on its way elsewhere; its parent tells where it went.
    _later.folders[key].whole = true;
    if (folder->row.parent != kNoFolder) {
      _later.folders[folder->row.parent].names.insert(folder->row.name);
    }
  }
  _reconciler.decide(inRound);
  afterDecisions();
  if (inRound) enqueueSubfolders(key);
}

// The bulk load of a folder that nothing is known of.
void StoreWriter::loadFolder(FolderKey key, const FolderSnapshot& snapshot) {
  std::vector<FolderKey> subfolders;
  ItemRow row;
  row.parent = key;
  for (const DiskEntry& entry : snapshot.entries) {
    row.name = entry.name;
    row.state = entry.state;
    row.folder = kNoFolder;
    row.hasDetails = false;
    row.isUploaded = entry.state.isEvicted;
    if (entry.state.kind == ItemKind::Document) {
      row.id = VLFileObjectID::documentWithRawID(drawDocumentNumber());
      // A marker names its document; a second one is a copy.
      const std::uint64_t marked = entry.state.markedDocument;
      if (marked != 0 && _bulkIDs.insert(marked).second) {
        row.id = VLFileObjectID::documentWithRawID(marked);
      }
    } else {
      std::uint32_t attempt = 0;
      do {
        row.id = VLFileObjectID::folderOrAliasWithRawID(inodeNumber(entry.state.key, attempt++));
      } while (_folders.folderWithID(row.id) != kNoFolder || _bulkIDs.contains(row.id.rawID()));
    }
    if (entry.state.kind == ItemKind::Alias) _bulkIDs.insert(row.id.rawID());
    if (entry.state.kind == ItemKind::Folder) {
      FolderRow folder;
      folder.id = row.id;
      folder.parent = key;
      folder.name = row.name;
      folder.key = entry.state.key;
      row.folder = _folders.add(std::move(folder));
      subfolders.push_back(row.folder);
    }
    if (++_bulkItems <= kMostToldInBulk) {
      _journal.insert(row);
    } else {
      _index.insert(row);
      Folder* parent = _folders.find(key);
      ++parent->row.children;
      parent->isCountUntold = true;
    }
  }
  const Folder* folder = _folders.find(key);
  _folders.touch(key);
  if (key != kDriveFolder) {
    const FolderKey parent = folder->row.parent != kNoFolder ? folder->row.parent : kDriveFolder;
    for (ItemRow& self : _index.rowsNamed(parent, folder->row.name)) {
      if (self.folder != key) continue;
      self.state = snapshot.self;
      _journal.update(self, self.parent);
    }
  }
  enqueue(subfolders);
}

void StoreWriter::endBulkLoad() {
  if (!_isBulk) return;
  if (!commit()) return;
  _isBulk = false;
  checkpointAfter(kPages);
  _bulkIDs.clear();
  _attributesUntil = _index.rank();
  _isReadingAttributes = _attributesAt < _attributesUntil;
  _index.setSetting(kAttributesUntil, std::to_string(_attributesUntil));
  if (!buildSecondaryIndexes(*_database)) {
    fail();
    return;
  }
  if (_bulkItems > kMostToldInBulk) _listener.storeDidOverflow(std::nullopt);
}

Look StoreWriter::lookAtFolder(FolderKey key, int& error) {
  _disk.forget();
  int descriptor = -1;
  FolderSnapshot snapshot;
  snapshot.look = _disk.open(key, descriptor, error);
  if (snapshot.look == Look::Seen) {
    noteWatch(key, _watcher.watch(key, descriptor));
    snapshot = readFolder(descriptor, _isBulk ? Detail::Quick : Detail::Full);
  } else {
    snapshot.error = error;
  }
  error = snapshot.error;
  begin();
  if (Folder* folder = _folders.find(key)) folder->round = _round;
  accept(key, snapshot, false, false);
  if (_inRound && !_isBulk) enqueueSubfolders(key);
  commit();
  return snapshot.look;
}

Look StoreWriter::catchUp(FolderKey key, int& error) {
  if (_isBroken || _reload) return Look::Seen;
  _watcher.drain();
  // A bulk load goes on while nothing changed where somebody looks.
  if (_isBulk && !_watcher.isDirty(key)) return Look::Seen;
  if (_isBulk) endBulkLoad();
  reconcileDirt(_watcher.take());
  const Folder* folder = _folders.find(key);
  if (folder == nullptr) {
    error = ENOENT;
    return Look::Gone;
  }
  const bool isAhead = _inRound && (_roundAgain || folder->read != _round);
  return isAhead || isUnwatched(key) ? lookAtFolder(key, error) : Look::Seen;
}

Look StoreWriter::lookAtName(FolderKey folder, const std::string& name) {
  return lookAtNames({{folder, name}});
}

Look StoreWriter::lookAtNames(const std::vector<Place>& places) {
  if (_isBulk) endBulkLoad();
  _disk.forget();
  begin();
  checkTrashes(true);
  std::vector<std::pair<Look, FileState>> seen;
  const auto lookAtAll = [&] {
    _disk.forget();
    seen.clear();
    bool isReplaced = false;
    for (const auto& [folder, name] : places) {
      FileState state;
      seen.emplace_back(_disk.at(folder, name, state), state);
      isReplaced = isReplaced || (seen.back().first == Look::Seen &&
                                  _reconciler.isReplacement(folder, name, state));
    }
    return isReplaced;
  };
  // Where another file has the name now, the watcher may tell where the old one is, without which
  // that looks like a save: all of it is decided together.
  for (int look = 0; lookAtAll(); ++look) {
    _watcher.drain();
    if (look > 0 && !_watcher.dirtySince()) break;
    if (look == kMostLooks) {
      _reconciler.noteThatItGoesOn();
      break;
    }
    reconcileDirt(_watcher.take());
    begin();
  }
  Look look = Look::Gone;
  for (std::size_t at = 0; at < places.size(); ++at) {
    const auto& [folder, name] = places[at];
    look = seen[at].first;
    if (look == Look::Seen) _reconciler.addName(folder, name, seen[at].second);
    if (look == Look::Gone) _reconciler.addName(folder, name, std::nullopt);
  }
  _reconciler.decide(false, [this](FolderKey folder) { return _watcher.isWatched(folder); });
  afterDecisions();
  commit();
  return look;
}

bool StoreWriter::takeCopy(const Copy& copy) {
  if (_isBulk) endBulkLoad();
  if (!commit()) return false;
  _disk.forget();
  forgetCopy(copy);
  FileState state;
  if (_disk.at(copy.to.folder, copy.to.name, state) != Look::Seen) return false;
  begin(Durability::Now);
  const bool isTaken = _reconciler.takeCopy(copy.from, copy.to, state);
  for (auto folders = _reconciler.takeCopiedFolders(); !folders.empty();
       folders = _reconciler.takeCopiedFolders()) {
    for (const FolderKey key : folders) {
      // The watch is of the folder that it was.
      _watcher.unwatch(key);
      int descriptor = -1;
      int error = 0;
      if (!_folders.find(key)->row.scanned) {
        enqueue({key});
      } else if (_disk.open(key, descriptor, error) == Look::Seen) {
        noteWatch(key, _watcher.watch(key, descriptor));
        const FolderSnapshot snapshot = readFolder(descriptor, Detail::Full);
        if (snapshot.look == Look::Seen) {
          _reconciler.takeCopies(key, snapshot);
          _reconciler.addFolder(key, snapshot);
        } else {
          noteUnreadable(key, snapshot.error);
        }
      }
    }
  }
  _reconciler.decide(false, [this](FolderKey folder) { return _watcher.isWatched(folder); });
  afterDecisions();
  return commit() && isTaken;
}

void StoreWriter::tellAnew(VLFileObjectID id, bool withContents) {
  if (_isBulk) endBulkLoad();
  begin();
  std::vector<ItemRow> rows;
  if (auto row = _index.rowWithID(id)) rows.push_back(std::move(*row));
  while (!rows.empty()) {
    ItemRow row = std::move(rows.back());
    rows.pop_back();
    _journal.updateDetails(row);
    if (!withContents || row.folder == kNoFolder) continue;
    std::vector<ItemRow> children = _index.childrenOf(row.folder);
    rows.insert(rows.end(), std::make_move_iterator(children.begin()),
                std::make_move_iterator(children.end()));
  }
  commit();
}

}  // namespace skein::vald
