#include "linux/vald/scan/Reconciler.h"

#include <algorithm>

#include "linux/vald/scan/BackupNames.h"
#include "linux/vald/scan/DocumentNumbers.h"

namespace skein::vald {
namespace {

constexpr std::int64_t kYouth = 60'000;
// More links of one file than this are not all looked at again for each decision.
constexpr std::size_t kManyLinks = 8;

bool isTemporaryFor(std::string_view name, std::string_view original) {
  return isBackupNameOf(name, original) || (name.starts_with('.') && !original.starts_with('.'));
}

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
  _appearedByInode.clear();
  _replacedByInode.clear();
  _departures.clear();
  beginGathering();
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

void Reconciler::beginGathering() {
  _appearedBefore = _appeared.size();
  _replacedBefore = _replaced.size();
  _vanishedBefore = _vanished.size();
}

bool Reconciler::mayBeSave() {
  const std::int64_t since = _clock() - _grace;
  return _replaced.size() > _replacedBefore ||
         std::any_of(_appeared.begin() + static_cast<std::ptrdiff_t>(_appearedBefore),
                     _appeared.end(), [&](const Difference& difference) {
                       return _index
                           .tombstoneAt(difference.place.folder, difference.place.name, since)
                           .has_value();
                     });
}

void Reconciler::gatherAgain() {
  _appeared.resize(_appearedBefore);
  _replaced.resize(_replacedBefore);
  _vanished.erase(_vanished.begin() + static_cast<std::ptrdiff_t>(_vanishedBefore),
                  _vanished.end());
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
  _goesOn = false;
}

void Reconciler::decideOnce(bool inRound) {
  _disk.forget();
  _left.clear();
  _youngLinks.clear();
  _deciding = std::exchange(_appeared, {});
  const auto replacements = std::exchange(_replaced, {});
  const auto sortByInode = [](const std::vector<Difference>& differences, auto& byInode) {
    byInode.clear();
    for (const Difference& difference : differences) {
      if (difference.state.kind != ItemKind::Document) continue;
      byInode.emplace(difference.state.key.inode, &difference);
    }
  };
  sortByInode(_deciding, _appearedByInode);
  sortByInode(replacements, _replacedByInode);
  // Folders first: the ways to everything else lead through them.
  for (const Difference& difference : _deciding) {
    if (difference.state.kind == ItemKind::Folder) appeared(difference);
  }
  _disk.forget();
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
  _appearedByInode.clear();
  _replacedByInode.clear();
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
  const auto found = _appearedByInode.find(file.inode);
  return found != _appearedByInode.end() && file.names(found->second->state.key) ? found->second
                                                                                 : nullptr;
}

bool Reconciler::hasReplacedAnother(const ItemRow& row) {
  const auto found = _replacedByInode.find(row.state.key.inode);
  if (found == _replacedByInode.end()) return false;
  const auto& [place, state] = *found->second;
  if (!row.state.key.names(state.key) || (place.folder == row.parent && place.name == row.name) ||
      isBackupNameOf(place.name, row.name)) {
    return false;
  }
  const std::optional<ItemRow> resident = rowAt(place);
  return !resident || !isStandIn(*resident, row.name);
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
  std::optional<ItemRow> old = rowAt(place);
  if (!old) {
    appeared(difference);
    return;
  }
  // The disk goes on meanwhile, and a number must not go to a file that has gone on.
  FileState state;
  const Look look = _disk.at(place.folder, place.name, state);
  if (look == Look::Gone) {
    _vanished.push_back(*old);
    return;
  }
  if (look != Look::Seen) state = difference.state;
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

  const std::optional<ItemRow> mover = moverTo(place, state);
  FileState there;
  const Whereabouts where = mover ? whereabouts(*mover, there) : Whereabouts::Gone;
  if (mover && where == Whereabouts::Displaced && old->state.key.names(there.key)) {
    const Place from{mover->parent, mover->name};
    if (isStandIn(*mover, place.name)) {
      _journal.bury(*mover, _now);
      retarget(*old, state);
      insertNew(from, there);
    } else if (isStandIn(*old, from.name)) {
      _journal.bury(*old, _now);
      retarget(*mover, there);
      insertNew(place, state);
    } else {
      move(*old, from, there);
      move(*mover, place, state);
    }
    return;
  }

  // Where the old file went decides whether this was a save.
  const Difference* const whereItWent = appearedDocument(old->state.key);
  if (whereItWent != nullptr && !isBackupNameOf(whereItWent->place.name, place.name)) {
    move(*old, whereItWent->place, whereItWent->state);
  } else if (!hasReplacedAnother(*old) && !isKnownAsAnother(place, state, {old, mover}) &&
             (mover ? isStandIn(*mover, place.name) || (isYoung(*mover) && !_goesOn)
                    : !wasAnother(state, place.name))) {
    retarget(*old, state);
    if (!mover) return;
    _journal.bury(*mover, _now);
    if (where == Whereabouts::Displaced) {
      _appeared.push_back({{mover->parent, mover->name}, there});
    }
    return;
  } else {
    _vanished.push_back(*old);
  }
  if (mover) {
    recordDeparture(*mover, place);
    move(*mover, place, state);
  } else if (!returned(place, state)) {
    insertNew(place, state);
  }
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
    if (const auto other = youngLinkOf(*row, there)) {
      _journal.bury(*other, _now);
      recordDeparture(*row, {other->parent, other->name});
      move(*row, {other->parent, other->name}, there);
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

// The youngest link to the document's file that is at its name and came after it; `there` is it.
// When both came in the same millisecond, what stays is not renumbered without a reason.
std::optional<ItemRow> Reconciler::youngLinkOf(const ItemRow& row, FileState& there) {
  const auto [known, isNew] = _youngLinks.try_emplace(row.state.key.inode);
  std::vector<YoungLink>& links = known->second;
  if (isNew) {
    for (const ItemRow& other : _index.rowsWithInode(row.state.key.inode)) {
      if (other.state.kind == ItemKind::Document && isYoung(other)) {
        links.push_back({other.seen, other.id});
      }
    }
    std::stable_sort(links.begin(), links.end(),
                     [](const YoungLink& a, const YoungLink& b) { return a.seen < b.seen; });
  }
  while (!links.empty() && links.back().seen > row.seen) {
    std::optional<ItemRow> other = _index.rowWithID(links.back().id);
    if (other && other->state.key.names(row.state.key) &&
        whereabouts(*other, there) == Whereabouts::StillThere) {
      return other;
    }
    links.pop_back();
  }
  return std::nullopt;
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

bool Reconciler::isStandIn(const ItemRow& row, const std::string& name) const {
  if (row.state.kind != ItemKind::Document || !isYoung(row)) return false;
  return isTemporaryFor(row.name, name) || (row.seen > _asked && _now - row.seen < _grace);
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

Reconciler::Move Reconciler::moveTo(const Place& place, const FileState& state,
                                    const ItemRow& row) {
  if (row.state.kind != state.kind || !row.state.key.names(state.key) || row.containerID ||
      (row.parent == place.folder && row.name == place.name)) {
    return Move::DidNotLeave;
  }
  FileState there;
  switch (whereabouts(row, there)) {
    case Whereabouts::StillThere:
    case Whereabouts::Unknown: return Move::DidNotLeave;
    case Whereabouts::Gone: return Move::Moved;
    case Whereabouts::Displaced: break;
  }
  return row.state.kind == ItemKind::Document && nameKeeps(row, there, place) ? Move::KeepsItsName
                                                                              : Move::Moved;
}

// The known item whose file now stands at `place`, if it left its own name for it.
std::optional<ItemRow> Reconciler::moverTo(const Place& place, const FileState& state) {
  auto left = _left.find(state.key.inode);
  if (left == _left.end()) {
    std::vector<ItemRow> rows = _index.rowsWithInode(state.key.inode);
    if (rows.size() <= kManyLinks) {
      for (ItemRow& row : rows) {
        if (moveTo(place, state, row) == Move::Moved) return std::move(row);
      }
      return std::nullopt;
    }
    left = _left.try_emplace(state.key.inode).first;
    for (const ItemRow& row : rows) left->second.push_back(row.id);
  }
  std::list<VLFileObjectID>& ids = left->second;
  for (auto id = ids.begin(); id != ids.end();) {
    std::optional<ItemRow> row = _index.rowWithID(*id);
    const Move found = row ? moveTo(place, state, *row) : Move::DidNotLeave;
    if (found == Move::Moved) return row;
    id = found == Move::DidNotLeave ? ids.erase(id) : std::next(id);
  }
  return std::nullopt;
}

// Whether a document whose file turned up at `candidate`, while its name holds the file
// `there`, stays with its name.
bool Reconciler::nameKeeps(const ItemRow& row, const FileState& there, const Place& candidate) {
  for (const ItemRow& other : _index.rowsWithInode(there.key.inode)) {
    if (other.id == row.id || isStandIn(other, row.name) ||
        other.state.kind != ItemKind::Document || !other.state.key.names(there.key)) {
      continue;
    }
    // Another document came to the name: then this one is where its file is.
    FileState ignored;
    if (whereabouts(other, ignored) != Whereabouts::StillThere) return false;
  }
  if (isBackupNameOf(candidate.name, row.name)) return true;
  const std::optional<ItemRow> resident = rowAt(candidate);
  // An exchange of two names is settled as a whole, in replaced().
  return resident && isStandIn(*resident, row.name) && !resident->state.key.names(there.key);
}

// Whether the file at `place` is that of a document other than these, which does not give it up:
// whether that is still at its name is not for the disk to say, which goes on.
bool Reconciler::isKnownAsAnother(const Place& place, const FileState& state,
                                  const std::vector<std::optional<ItemRow>>& these) {
  if (_left.contains(state.key.inode)) return true;  // it has many links
  const auto rows = _index.rowsWithInode(state.key.inode);
  return std::any_of(rows.begin(), rows.end(), [&](const ItemRow& row) {
    return row.state.kind == ItemKind::Document && row.state.key.names(state.key) &&
           !row.containerID && !isStandIn(row, place.name) &&
           std::none_of(these.begin(), these.end(),
                        [&](const auto& other) { return other && other->id == row.id; }) &&
           moveTo(place, state, row) != Move::KeepsItsName;
  });
}

void Reconciler::recordDeparture(const ItemRow& row, const Place& to) {
  if (row.state.kind == ItemKind::Document && isBackupNameOf(to.name, row.name)) {
    _departures[departureKey(row.parent, row.name)] = {_now, row.id};
  }
}

// Gives the name's former document its number back, when it left within the grace window.
bool Reconciler::handBack(const Place& place, const FileState& state,
                          const std::optional<ItemRow>& mover) {
  if (mover && !isStandIn(*mover, place.name)) return false;
  const auto departure = _departures.find(departureKey(place.folder, place.name));
  if (departure != _departures.end()) {
    const VLFileObjectID id = departure->second.id;
    _departures.erase(departure);
    std::optional<ItemRow> row = _index.rowWithID(id);
    if (row && !row->state.key.names(state.key) && isBackupNameOf(row->name, place.name) &&
        !isKnownAsAnother(place, state, {row, mover})) {
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
    // The very file of another document that lives, or that died and comes back, is that one's.
    if (isKnownAsAnother(place, state, {mover}) || deadWith(state)) return false;
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

// The latest item that died with this very file and did not come back.
std::optional<Tombstone> Reconciler::deadWith(const FileState& state) {
  return _index.tombstoneWithInode(state.key.inode, [&](const Tombstone& tombstone) {
    return tombstone.kind == state.kind && tombstone.key.names(state.key) &&
           !_index.rowWithID(tombstone.id) && _folders.folderWithID(tombstone.id) == kNoFolder;
  });
}

// Whether the file that came to `name` was another document's until that died. What a save wrote
// may have been seen to go before it was seen to come.
bool Reconciler::wasAnother(const FileState& state, const std::string& name) {
  const auto dead = deadWith(state);
  return dead && !isTemporaryFor(dead->name, name);
}

bool Reconciler::returned(const Place& place, const FileState& state) {
  const auto tombstone = deadWith(state);
  if (!tombstone) return false;
  _index.dropTombstone(tombstone->rank);
  ItemRow row;
  row.parent = place.folder;
  row.name = place.name;
  row.id = tombstone->id;
  row.state = state;
  // One of several links is one that came later.
  if (state.kind == ItemKind::Document && isKnownAsAnother(place, state, {})) row.seen = _now;
  if (state.kind == ItemKind::Folder) addFolderOf(row);
  _details.recall(row);
  _details.refresh(row, true);
  _journal.insert(row);
  return true;
}

void Reconciler::addFolderOf(ItemRow& row) {
  FolderRow folder;
  folder.id = row.id;
  folder.parent = row.parent;
  folder.name = row.name;
  folder.key = row.state.key;
  row.folder = _folders.add(std::move(folder));
  _newFolders.push_back(row.folder);
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
  if (state.kind == ItemKind::Folder) addFolderOf(row);
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
