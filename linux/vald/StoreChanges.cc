// The writer's changes: what the watcher saw, what was asked for, and what is read late.
#include <algorithm>
#include <set>

#include "linux/vald/StoreWriter.h"
#include "linux/vald/scan/StoreNames.h"

namespace skein::vald {
namespace {

constexpr int kMostTries = 25;
constexpr auto kLongestGathering = std::chrono::milliseconds(100);
constexpr std::size_t kAttributesAtOnce = 256;
constexpr std::uint64_t kAttributesUnsaved = 16'384;

}  // namespace

// ---- changes that the watcher saw

void StoreWriter::gather(FolderKey key, int descriptor, const DirtyFolder& changes) {
  std::set<std::string> names;
  bool isWhole = changes.whole;
  for (const std::string& name : changes.names) {
    isWhole = !addConcernedNames(name, names) || isWhole;
  }
  const std::uint64_t children = _folders.find(key)->row.children;
  if (isWhole || (names.size() > 64 && names.size() * 2 > children)) {
    const FolderSnapshot snapshot = readFolder(descriptor, Detail::Full);
    if (snapshot.look == Look::Seen) {
      _reconciler.addFolder(key, snapshot);
    } else {
      noteUnreadable(key, snapshot.error);
    }
  } else {
    for (const std::string& name : names) {
      FileState state;
      int error = 0;
      const Look there = readEntry(descriptor, name, state, error);
      if (there == Look::Seen) _reconciler.addName(key, name, state);
      if (there == Look::Gone) _reconciler.addName(key, name, std::nullopt);
    }
  }
  _reconciler.addSelf(key);
}

bool StoreWriter::gatherFolders(DirtySet& dirty, DirtySet& gathered, DirtySet& unread) {
  bool isProgress = false;
  _disk.forget();
  for (auto entry = dirty.folders.begin(); entry != dirty.folders.end();) {
    const FolderKey key = entry->first;
    const Folder* folder = _folders.find(key);
    int descriptor = -1;
    int error = 0;
    // A folder that was not read yet will be. It may be on its way here, read before this
    // change: then the change waits until the folder has arrived.
    const bool isKnown = folder != nullptr && folder->row.scanned;
    if (!isKnown && _scanner.pending() > 0) {
      unread.folders[key].add(std::move(entry->second));
      entry = dirty.folders.erase(entry);
      continue;
    }
    const Look look = isKnown ? _disk.open(key, descriptor, error) : Look::RootLost;
    if (look == Look::Gone) {
      ++entry;
      continue;
    }
    if (look == Look::Unreadable) noteUnreadable(key, error);
    if (look == Look::Seen) gather(key, descriptor, entry->second);
    isProgress = true;
    gathered.folders[key].add(std::move(entry->second));
    entry = dirty.folders.erase(entry);
  }
  return isProgress;
}

void StoreWriter::reconcile(DirtySet& dirty) {
  begin();
  const auto checkTrashesOf = [&](const DirtySet& changed) {
    const bool concernsTrash =
        std::any_of(changed.folders.begin(), changed.folders.end(), [&](const auto& folder) {
          const auto& names = folder.second.names;
          return _folders.roots().contains(folder.first) &&
                 (folder.second.whole ||
                  std::any_of(names.begin(), names.end(),
                              [](const std::string& name) { return name.starts_with(".Trash-"); }));
        });
    if (concernsTrash) checkTrashes(true);
  };
  // Before anything is decided: what is missing may be in a trash that was made for it.
  checkTrashesOf(dirty);
  DirtySet unread;
  DirtySet gathered;
  const auto start = std::chrono::steady_clock::now();
  // A folder whose way changed in this very batch is found once its own change is decided.
  for (bool isProgress = true; isProgress && !dirty.folders.empty(); gathered.folders.clear()) {
    isProgress = false;
    for (int look = 0;; ++look) {
      _reconciler.beginGathering();
      isProgress = gatherFolders(dirty, gathered, unread) || isProgress;
      // What was renamed before a name was looked at may have been told after that.
      if (!_reconciler.mayBeSave()) break;
      _watcher.drain();
      if (!_watcher.dirtySince()) break;
      if (look == kMostLooks || std::chrono::steady_clock::now() - start > kLongestGathering) {
        _reconciler.noteThatItGoesOn();
        break;
      }
      DirtySet more = _watcher.take();
      _reconciler.gatherAgain();
      noteLosses(more);
      checkTrashesOf(more);
      for (DirtySet* part : {&more, &gathered}) {
        for (auto& [key, changes] : part->folders) dirty.folders[key].add(std::move(changes));
      }
      gathered.folders.clear();
    }
    _reconciler.decide(false);
    afterDecisions();
  }
  // What is left is on its way: its parent's change was not seen yet.
  const bool mayRetry = !dirty.folders.empty() && ++_laterTries < kMostTries;
  if (!mayRetry) {
    _laterTries = 0;
    dirty.folders.clear();
  }
  for (DirtySet* left : {&dirty, &unread}) {
    for (auto& [key, changes] : left->folders) _later.folders[key].add(std::move(changes));
  }
  commit();
}

void StoreWriter::retain(VLFileObjectID id, bool isRetained) {
  const FolderKey key = _folders.folderWithID(id);
  Folder* folder = _folders.find(key);
  if (folder == nullptr) return;
  if (!isRetained) {
    if (folder->retained > 0) --folder->retained;
    return;
  }
  ++folder->retained;
  if (_watcher.isWatched(key)) return;
  int descriptor = -1;
  int error = 0;
  _disk.forget();
  if (_disk.open(key, descriptor, error) != Look::Seen) return;
  if (!_watcher.watch(key, descriptor)) {
    const auto victim = _watcher.victim([&](FolderKey candidate) {
      const Folder* other = _folders.find(candidate);
      return other == nullptr || (other->retained == 0 && !_folders.roots().contains(candidate));
    });
    if (!victim) return;
    _watcher.unwatch(*victim);
    noteWatch(*victim, false);
  }
  lookAtFolder(key, error);
}

// ---- what the index alone knows

bool StoreWriter::changeDetails(VLFileObjectID id,
                                const std::function<void(ItemDetails&)>& change) {
  if (_isBulk) endBulkLoad();
  if (!commit()) return false;
  std::optional<ItemRow> row = _index.rowWithID(id);
  if (!row) return false;
  const ItemDetails before = row->hasDetails ? _index.details(id) : ItemDetails();
  ItemDetails details = before;
  change(details);
  if (details == before) return true;
  begin(Durability::Now);
  _details.put(*row, details);
  _journal.updateDetails(*row);
  return commit();
}

void StoreWriter::noteUploads(const std::vector<UploadedFile>& files) {
  // Told of while a first scan goes on, it is told again by the next start.
  if (_isBulk || !commit()) return;
  begin();
  for (const UploadedFile& file : files) {
    std::optional<ItemRow> row = _index.rowWithID(file.document);
    if (!row || row->state.key.inode != file.state.key.inode || !row->state.looksLike(file.state)) {
      continue;
    }
    const bool wasUploaded = std::exchange(row->isUploaded, true);
    row->isSettled = true;
    if (wasUploaded) {
      _index.putFlags(*row);
    } else {
      _journal.updateDetails(*row);
    }
  }
  commit();
}

bool StoreWriter::takeHint(ItemRow& row, bool& waits) {
  const auto hinted = _details.hinted(row, waits);
  if (!hinted || *hinted == row.id) return false;
  // The index was lost, and the file has kept its number.
  const std::int64_t now = std::chrono::duration_cast<std::chrono::milliseconds>(
                               std::chrono::system_clock::now().time_since_epoch())
                               .count();
  _journal.bury(row, now);
  row.id = *hinted;
  _details.recall(row);
  _details.refresh(row, true);
  _journal.insert(row);
  return true;
}

void StoreWriter::takeWaitingHints() {
  _attributesWaiting = kNothingWaits;
  _disk.forget();
  for (const VLFileObjectID id : _details.endExpecting()) {
    auto row = _index.rowWithID(id);
    bool waits = false;
    if (!row) continue;
    begin();
    takeHint(*row, waits);
  }
}

void StoreWriter::readSomeAttributes() {
  if (!_isReadingAttributes || _isBulk || _inRound || _inTransaction) return;
  _disk.forget();
  std::vector<ItemRow> rows = _index.rowsAfter(_attributesAt, _attributesUntil, kAttributesAtOnce);
  const std::uint64_t before = _attributesAt;
  for (ItemRow& row : rows) {
    _attributesAt = row.rank;
    if (!_details.mayHaveAttributes(row)) continue;
    begin();
    bool waits = false;
    const std::uint64_t rank = row.rank;
    if (takeHint(row, waits)) continue;
    if (waits) {
      _details.wait(row.id);
      _attributesWaiting = std::min(_attributesWaiting, rank - 1);
    }
    if (_details.refresh(row, true)) _journal.updateDetails(row);
  }
  const bool isDone = rows.size() < kAttributesAtOnce;
  if (isDone) {
    _attributesAt = _attributesUntil;
    takeWaitingHints();
  }
  // What a power cut makes it forget is read again.
  if (_inTransaction || isDone ||
      before / kAttributesUnsaved != _attributesAt / kAttributesUnsaved) {
    begin();
    // After a crash those that waited are asked again.
    _index.setSetting(kAttributesRead, std::to_string(std::min(_attributesAt, _attributesWaiting)));
    if (!commit()) return;
  }
  _isReadingAttributes = !isDone;
}

}  // namespace skein::vald
