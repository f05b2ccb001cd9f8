#include "linux/vald/scan/Reconciler.h"

#include <algorithm>

#include "linux/vald/scan/BackupNames.h"
#include "linux/vald/scan/DocumentNumbers.h"

namespace skein::vald {
namespace {

constexpr std::int64_t kYouth = 60'000;

std::string departureKey(FolderKey folder, const std::string& name) {
  return std::to_string(folder) + '/' + name;
}

}  // namespace

Reconciler::Reconciler(IndexWriter& index, Journal& journal, FolderTable& folders, Disk& disk,
                       Details& details, std::chrono::milliseconds graceWindow, Clock clock)
    : _index(index),
      _journal(journal),
      _folders(folders),
      _disk(disk),
      _details(details),
      _grace(graceWindow.count()),
      _clock(std::move(clock)) {}

void Reconciler::forget() {
  _appeared.clear();
  _replaced.clear();
  _vanished.clear();
  _vanishedInRound.clear();
  _replacedInRound.clear();
  _selves.clear();
  _newFolders.clear();
  _removedFolders.clear();
  _copiedFolders.clear();
  _deciding.clear();
  _decidingByInode.clear();
  _departures.clear();
}

// ---- gathering

bool Reconciler::addFolder(FolderKey folder, const FolderSnapshot& snapshot, bool isOld) {
  std::vector<std::string> again;
  const auto lookAgain = [&](std::string_view name) {
    if (isOld) again.emplace_back(name);
    return isOld;
  };
  std::vector<ItemRow> rows = _index.childrenOf(folder);
  // The containers' folders are listed at the drive's root, but do not live in it.
  std::erase_if(rows, [](const ItemRow& row) { return row.containerID.has_value(); });
  auto row = rows.begin();
  auto entry = snapshot.entries.begin();
  while (row != rows.end() || entry != snapshot.entries.end()) {
    if (entry == snapshot.entries.end() || (row != rows.end() && row->name < entry->name)) {
      if (!lookAgain(row->name)) _vanished.push_back(*row);
      ++row;
    } else if (row == rows.end() || entry->name < row->name) {
      if (!lookAgain(entry->name)) {
        _appeared.push_back({{folder, std::string(entry->name)}, entry->state});
      }
      ++entry;
    } else {
      if (!differs(*row, entry->state) || !lookAgain(row->name)) compare(*row, entry->state);
      ++row;
      ++entry;
    }
  }
  _selves.insert(folder);
  if (again.empty()) return true;
  int descriptor = -1;
  int error = 0;
  _disk.forget();
  if (_disk.open(folder, descriptor, error) != Look::Seen) return false;
  for (const std::string& name : again) {
    FileState state;
    const Look look = readEntry(descriptor, name, state, error);
    if (look == Look::Seen) addName(folder, name, state);
    if (look == Look::Gone) addName(folder, name, std::nullopt);
  }
  return true;
}

void Reconciler::addName(FolderKey folder, const std::string& name,
                         const std::optional<FileState>& state) {
  const std::optional<ItemRow> row = rowAt({folder, name});
  if (row && state) {
    compare(*row, *state);
  } else if (row) {
    _vanished.push_back(*row);
  } else if (state) {
    _appeared.push_back({{folder, name}, *state});
  }
  _selves.insert(folder);
}

bool Reconciler::isReplacement(FolderKey folder, const std::string& name, const FileState& state) {
  if (const auto row = rowAt({folder, name})) return !row->state.key.names(state.key);
  return _index.tombstoneAt(folder, name, _clock() - _grace).has_value();
}

bool Reconciler::differs(const ItemRow& row, const FileState& state) {
  return row.state.kind != state.kind || !row.state.key.names(state.key) ||
         (row.folder == kNoFolder && !row.state.looksLike(state));
}

void Reconciler::compare(const ItemRow& row, const FileState& state) {
  if (row.state.kind != state.kind || !row.state.key.names(state.key)) {
    _replaced.push_back({{row.parent, row.name}, state});
  } else if (differs(row, state)) {
    retarget(row, state);
  } else if (!row.state.looksLike(state)) {
    _selves.insert(row.folder);
  }
}

// ---- deciding

void Reconciler::decide(bool inRound, const IsFollowed& isFollowed) {
  _now = _clock();
  std::erase_if(_departures, [&](const auto& d) { return d.second.when + _grace < _now; });
  // A decision may free a name that holds something else by now.
  constexpr int kMostPasses = 4;
  for (int pass = 0; pass < kMostPasses; ++pass) {
    decideOnce(inRound);
    if (_appeared.empty() && _replaced.empty() && _vanished.empty()) break;
  }
  refreshSelves(isFollowed);
  _disk.forget();
}

void Reconciler::decideOnce(bool inRound) {
  _disk.forget();
  _deciding = std::exchange(_appeared, {});
  _decidingByInode.clear();
  for (std::size_t at = 0; at < _deciding.size(); ++at) {
    _decidingByInode.emplace(_deciding[at].state.key.inode, at);
  }
  // Folders first: the ways to everything else lead through them.
  for (const Difference& difference : _deciding) {
    if (difference.state.kind == ItemKind::Folder) appeared(difference);
  }
  _disk.forget();
  const auto replacements = std::exchange(_replaced, {});
  for (const Difference& difference : replacements) {
    if (inRound) {
      _replacedInRound.push_back(difference.place);
    } else {
      replaced(difference);
    }
  }
  for (const Difference& difference : _deciding) {
    if (difference.state.kind != ItemKind::Folder) appeared(difference);
  }
  _deciding.clear();
  _decidingByInode.clear();
  const auto losses = std::exchange(_vanished, {});
  for (const ItemRow& row : losses) {
    if (inRound) {
      _vanishedInRound.push_back(row);
    } else {
      vanished(row);
    }
  }
}

const Reconciler::Difference* Reconciler::appearedDocument(const FileKey& file) const {
  std::size_t first = _deciding.size();
  const auto [begin, end] = _decidingByInode.equal_range(file.inode);
  for (auto one = begin; one != end; ++one) {
    const FileState& state = _deciding[one->second].state;
    if (state.kind == ItemKind::Document && file.names(state.key)) {
      first = std::min(first, one->second);
    }
  }
  return first < _deciding.size() ? &_deciding[first] : nullptr;
}

void Reconciler::endRound() {
  const auto places = std::exchange(_replacedInRound, {});
  for (const Place& place : places) {
    FileState state;
    const Look look = _disk.at(place.folder, place.name, state);
    if (look == Look::Seen) addName(place.folder, place.name, state);
    if (look == Look::Gone) addName(place.folder, place.name, std::nullopt);
  }
  auto rows = std::exchange(_vanishedInRound, {});
  _vanished.insert(_vanished.end(), std::make_move_iterator(rows.begin()),
                   std::make_move_iterator(rows.end()));
  decide(false);
}

void Reconciler::appeared(const Difference& difference) {
  const Place& place = difference.place;
  if (_folders.find(place.folder) == nullptr) return;
  if (std::any_of(_expected.begin(), _expected.end(),
                  [&](const auto& copy) { return copy.second == place; })) {
    return;
  }
  if (const auto row = rowAt(place)) {
    // Another decision has filled the name meanwhile.
    if (row->state.kind == difference.state.kind && row->state.key.names(difference.state.key)) {
      return;
    }
    replaced(difference);
    return;
  }
  const std::optional<ItemRow> mover = moverTo(place, difference.state);
  if (difference.state.kind == ItemKind::Document && handBack(place, difference.state, mover)) {
    return;
  }
  if (mover) {
    recordDeparture(*mover, place);
    move(*mover, place, difference.state);
  } else if (!returned(place, difference.state)) {
    insertNew(place, difference.state);
  }
}

void Reconciler::replaced(const Difference& difference) {
  const Place& place = difference.place;
  const FileState& state = difference.state;
  std::optional<ItemRow> old = rowAt(place);
  if (!old) {
    appeared(difference);
    return;
  }
  if (old->state.kind == state.kind && old->state.key.names(state.key)) return;
  if (old->state.kind != ItemKind::Document || state.kind != ItemKind::Document) {
    // Folders and aliases are their inodes: the old one went, unless it turns up elsewhere.
    _vanished.push_back(*old);
    if (const auto mover = moverTo(place, state)) {
      move(*mover, place, state);
    } else if (!returned(place, state)) {
      insertNew(place, state);
    }
    return;
  }

  // Where the old file went decides whether this was a save.
  const Difference* const whereItWent = appearedDocument(old->state.key);
  const bool livesElsewhere =
      whereItWent != nullptr && !isBackupNameOf(whereItWent->place.name, place.name);
  if (const std::optional<ItemRow> mover = moverTo(place, state)) {
    const Place from{mover->parent, mover->name};
    FileState there;
    const Whereabouts where = whereabouts(*mover, there);
    if (livesElsewhere) {
      move(*old, whereItWent->place, whereItWent->state);
      move(*mover, place, state);
    } else if (where == Whereabouts::Displaced && old->state.key.names(there.key)) {
      if (isYoung(*mover) || isYoung(*old)) {
        retarget(*old, state);
        retarget(*mover, there);
      } else {
        move(*old, from, there);
        move(*mover, place, state);
      }
    } else if (isYoung(*mover)) {
      retarget(*old, state);
      _journal.bury(*mover, _now);
      if (where == Whereabouts::Displaced) _appeared.push_back({from, there});
    } else {
      _vanished.push_back(*old);
      recordDeparture(*mover, place);
      move(*mover, place, state);
    }
    return;
  }

  if (livesElsewhere) {
    move(*old, whereItWent->place, whereItWent->state);
    insertNew(place, state);
    return;
  }
  retarget(*old, state);
}

void Reconciler::vanished(const ItemRow& seen) {
  const std::optional<ItemRow> row = _index.rowWithID(seen.id);
  if (!row || row->parent != seen.parent || row->name != seen.name) return;
  if (std::any_of(_expected.begin(), _expected.end(), [&](const auto& copy) {
        return copy.first == Place{row->parent, row->name};
      })) {
    return;
  }
  FileState there;
  const Whereabouts where = whereabouts(*row, there);
  if (where == Whereabouts::StillThere || where == Whereabouts::Unknown) return;
  if (row->state.kind == ItemKind::Document) {
    for (const ItemRow& other : _index.rowsWithInode(row->state.key.inode)) {
      if (other.id == row->id || other.state.kind != ItemKind::Document || !isYoung(other) ||
          !other.state.key.names(row->state.key)) {
        continue;
      }
      // The younger of the two links goes: the other is who it was. So it is when both came in
      // the same millisecond: what stays is not renumbered without a reason.
      if (row->seen >= other.seen) continue;
      if (whereabouts(other, there) != Whereabouts::StillThere) continue;
      _journal.bury(other, _now);
      recordDeparture(*row, {other.parent, other.name});
      move(*row, {other.parent, other.name}, there);
      return;
    }
  }
  buryTree(*row);
}

bool Reconciler::takeCopy(const Place& from, const Place& to, const FileState& state) {
  _now = _clock();
  const std::optional<ItemRow> row = rowAt(from);
  if (!row || row->state.kind != state.kind || rowAt(to)) return false;
  FileState there;
  const Whereabouts where = whereabouts(*row, there);
  if (where == Whereabouts::StillThere || where == Whereabouts::Unknown) return false;
  becomeCopy(*row, to, state);
  return true;
}

void Reconciler::takeCopies(FolderKey folder, const FolderSnapshot& snapshot) {
  for (const DiskEntry& entry : snapshot.entries) {
    const Place place{folder, std::string(entry.name)};
    const std::optional<ItemRow> row = rowAt(place);
    if (row && row->state.kind == entry.state.kind && !row->state.key.names(entry.state.key)) {
      becomeCopy(*row, place, entry.state);
    }
  }
}

void Reconciler::becomeCopy(ItemRow row, const Place& place, const FileState& state) {
  // The copy was made now, the item was not.
  ItemDetails details = row.hasDetails ? _index.details(row.id) : ItemDetails();
  if (!details.created && !row.state.isEvicted && row.state.key.born != 0) {
    details.created = row.state.key.born;
    _details.put(row, details);
  }
  if (Folder* folder = _folders.find(row.folder)) {
    folder->row.key = state.key;
    _folders.touch(row.folder);
    _copiedFolders.push_back(row.folder);
  }
  move(std::move(row), place, state);
}

void Reconciler::buryTree(const ItemRow& row) {
  if (row.folder != kNoFolder) {
    for (const ItemRow& child : _index.childrenOf(row.folder)) buryTree(child);
  }
  _journal.bury(row, _now != 0 ? _now : _clock());
  if (row.folder != kNoFolder) {
    _folders.touch(row.folder);
    _folders.remove(row.folder);
    _removedFolders.push_back(row.folder);
  }
}

void Reconciler::refreshSelves(const IsFollowed& isFollowed) {
  const auto selves = std::exchange(_selves, {});
  for (const FolderKey key : selves) {
    if (isFollowed && isFollowed(key)) continue;
    const Folder* folder = _folders.find(key);
    if (folder == nullptr) continue;
    int descriptor = -1;
    int error = 0;
    FileState state;
    if (_disk.open(key, descriptor, error) != Look::Seen || !readSelf(descriptor, state)) continue;
    const FolderKey parent = folder->row.parent != kNoFolder ? folder->row.parent : kDriveFolder;
    for (ItemRow& row : _index.rowsNamed(parent, folder->row.name)) {
      if (row.folder != key) continue;
      // A folder whose children came or went is told even if its dates stand.
      if (row.state.looksLike(state) && !folder->isCountUntold) continue;
      const bool isChanged = row.state.changed != state.changed;
      row.state = state;
      if (isChanged) _details.refresh(row, true);
      _journal.update(row, row.parent);
    }
  }
}

// ---- the rules' pieces

bool Reconciler::isYoung(const ItemRow& row) const {
  return row.seen != 0 && _now - row.seen < kYouth;
}

std::optional<ItemRow> Reconciler::rowAt(const Place& place) {
  for (ItemRow& row : _index.rowsNamed(place.folder, place.name)) {
    if (row.containerID) continue;
    // One that was replaced and waits for its end is not at its name any more.
    const bool waits = std::any_of(_vanished.begin(), _vanished.end(),
                                   [&](const ItemRow& other) { return other.id == row.id; });
    if (!waits) return std::move(row);
  }
  return std::nullopt;
}

Reconciler::Whereabouts Reconciler::whereabouts(const ItemRow& row, FileState& there) {
  switch (_disk.at(row.parent, row.name, there)) {
    case Look::Gone: return Whereabouts::Gone;
    case Look::Seen: break;
    case Look::Unreadable:
    case Look::RootLost: return Whereabouts::Unknown;
  }
  return there.kind == row.state.kind && there.key.names(row.state.key) ? Whereabouts::StillThere
                                                                        : Whereabouts::Displaced;
}

// The known item whose file now stands at `place`, if it left its own name for it.
std::optional<ItemRow> Reconciler::moverTo(const Place& place, const FileState& state) {
  for (ItemRow& row : _index.rowsWithInode(state.key.inode)) {
    if (row.state.kind != state.kind || !row.state.key.names(state.key) || row.containerID ||
        (row.parent == place.folder && row.name == place.name)) {
      continue;
    }
    FileState there;
    switch (whereabouts(row, there)) {
      case Whereabouts::StillThere:
      case Whereabouts::Unknown: continue;
      case Whereabouts::Gone: return std::move(row);
      case Whereabouts::Displaced:
        if (row.state.kind != ItemKind::Document || !nameKeeps(row, there, place)) {
          return std::move(row);
        }
    }
  }
  return std::nullopt;
}

// Whether a document whose file turned up at `candidate`, while its name holds the file
// `there`, stays with its name.
bool Reconciler::nameKeeps(const ItemRow& row, const FileState& there, const Place& candidate) {
  for (const ItemRow& other : _index.rowsWithInode(there.key.inode)) {
    if (other.id == row.id || other.state.kind != ItemKind::Document || isYoung(other) ||
        !other.state.key.names(there.key)) {
      continue;
    }
    // An old document came to the name: then this one is where its file is.
    FileState ignored;
    if (whereabouts(other, ignored) != Whereabouts::StillThere) return false;
  }
  if (isBackupNameOf(candidate.name, row.name)) return true;
  const std::optional<ItemRow> resident = rowAt(candidate);
  // An exchange of two names is settled as a whole, in replaced().
  return resident && isYoung(*resident) && !resident->state.key.names(there.key);
}

void Reconciler::recordDeparture(const ItemRow& row, const Place& to) {
  if (row.state.kind == ItemKind::Document && isBackupNameOf(to.name, row.name)) {
    _departures[departureKey(row.parent, row.name)] = {_now, row.id};
  }
}

// Gives the name's former document its number back, when it left within the grace window.
bool Reconciler::handBack(const Place& place, const FileState& state,
                          const std::optional<ItemRow>& mover) {
  if (mover && !isYoung(*mover)) return false;
  const auto departure = _departures.find(departureKey(place.folder, place.name));
  if (departure != _departures.end()) {
    const VLFileObjectID id = departure->second.id;
    _departures.erase(departure);
    std::optional<ItemRow> row = _index.rowWithID(id);
    if (row && !row->state.key.names(state.key)) {
      if (mover) _journal.bury(*mover, _now);
      const Place backup{row->parent, row->name};
      const FileState backupState = row->state;
      move(*row, place, state);
      insertNew(backup, backupState);
      return true;
    }
  }
  const auto tombstone = _index.tombstoneAt(place.folder, place.name, _now - _grace);
  if (!tombstone || _index.rowWithID(tombstone->id)) return false;
  // What died there was another link to the mover's own file: nothing was saved.
  if (mover && tombstone->key.names(state.key)) return false;
  if (!tombstone->key.names(state.key)) {
    // Nor when its file turned up elsewhere: it was renamed.
    const Difference* const other = appearedDocument(tombstone->key);
    if (other != nullptr && !isBackupNameOf(other->place.name, place.name)) return false;
    // The very file of another document that died comes back as that one.
    for (const Tombstone& dead : _index.tombstonesWithInode(state.key.inode)) {
      if (dead.id != tombstone->id && dead.kind == state.kind && dead.key.names(state.key)) {
        return false;
      }
    }
  }
  if (mover) _journal.bury(*mover, _now);
  _index.dropTombstone(tombstone->rank);
  ItemRow row;
  row.parent = place.folder;
  row.name = place.name;
  row.id = tombstone->id;
  row.state = state;
  _details.recall(row);
  _details.refresh(row, tombstone->key.names(state.key));
  _journal.insert(row);
  return true;
}

bool Reconciler::returned(const Place& place, const FileState& state) {
  for (const Tombstone& tombstone : _index.tombstonesWithInode(state.key.inode)) {
    if (tombstone.kind != state.kind || !tombstone.key.names(state.key) ||
        _index.rowWithID(tombstone.id) || _folders.folderWithID(tombstone.id) != kNoFolder) {
      continue;
    }
    _index.dropTombstone(tombstone.rank);
    ItemRow row;
    row.parent = place.folder;
    row.name = place.name;
    row.id = tombstone.id;
    row.state = state;
    if (state.kind == ItemKind::Folder) {
      FolderRow folder;
      folder.id = row.id;
      folder.parent = place.folder;
      folder.name = place.name;
      folder.key = state.key;
      row.folder = _folders.add(std::move(folder));
      _newFolders.push_back(row.folder);
    }
    _details.recall(row);
    _details.refresh(row, true);
    _journal.insert(row);
    return true;
  }
  return false;
}

VLFileObjectID Reconciler::newID(const FileState& state) {
  for (std::uint32_t attempt = 0;; ++attempt) {
    const VLFileObjectID id =
        idOfKind(state.kind, state.kind == ItemKind::Document ? drawDocumentNumber()
                                                              : inodeNumber(state.key, attempt));
    if (!_index.rowWithID(id) && _folders.folderWithID(id) == kNoFolder) return id;
    if (attempt > 1000) return id;  // the index fails; the transaction will not be committed
  }
}

void Reconciler::insertNew(const Place& place, const FileState& state) {
  ItemRow row;
  row.parent = place.folder;
  row.name = place.name;
  row.state = state;
  bool waits = false;
  const auto hinted = _details.hinted(row, waits);
  row.id = hinted ? *hinted : newID(state);
  if (waits) _details.wait(row.id);
  // A file that a round finds was there before, unless its dates say otherwise.
  const std::int64_t changed = state.changed / 1'000'000;
  row.seen = _now - changed < kYouth ? _now : 0;
  if (state.kind == ItemKind::Folder) {
    FolderRow folder;
    folder.id = row.id;
    folder.parent = place.folder;
    folder.name = place.name;
    folder.key = state.key;
    row.folder = _folders.add(std::move(folder));
    _newFolders.push_back(row.folder);
  }
  if (hinted) _details.recall(row);
  _details.refresh(row, false);
  _journal.insert(row);
}

void Reconciler::take(ItemRow& row, const FileState& state) {
  const FileState before = std::exchange(row.state, state);
  const bool isSameFile = before.key.names(state.key);
  if (isSameFile && row.state.key.generation == 0) {
    row.state.key.generation = before.key.generation;
  }
  if (state.kind != ItemKind::Document) {
    if (!before.looksLike(state)) _details.refresh(row, isSameFile);
    return;
  }
  // Evicting and downloading change neither size nor date.
  const bool isEqual = before.size == state.size && before.modified == state.modified;
  if (!isEqual || (!isSameFile && before.isEvicted == state.isEvicted)) row.isUploaded = false;
  row.isUploaded = row.isUploaded || state.isEvicted;
  row.isSettled = false;
  _details.refresh(row, isSameFile);
}

void Reconciler::move(ItemRow row, const Place& place, const FileState& state) {
  const FolderKey from = row.parent;
  row.parent = place.folder;
  row.name = place.name;
  if (Folder* folder = _folders.find(row.folder)) {
    folder->row.parent = place.folder;
    folder->row.name = place.name;
    _folders.touch(row.folder);
    _disk.forget();
  }
  take(row, state);
  _journal.update(row, from);
  _selves.insert(from);
  _selves.insert(place.folder);
}

void Reconciler::retarget(ItemRow row, const FileState& state) {
  take(row, state);
  _journal.update(row, row.parent);
}

}  // namespace skein::vald
