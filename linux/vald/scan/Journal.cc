#include "linux/vald/scan/Journal.h"

#include <algorithm>

namespace skein::vald {

void Journal::count(FolderKey folder, int by) {
  Folder* found = _folders.find(folder);
  if (found == nullptr) return;
  found->row.children += static_cast<std::uint64_t>(by);
  found->isCountUntold = true;
  _folders.touch(folder);
}

void Journal::note(const ItemRow& row, bool isDead, FolderKey previousParent, bool isOfFile) {
  const auto [entry, isNew] = _changes.try_emplace(row.id);
  Change& change = entry->second;
  if (isNew) {
    change.previousParent = previousParent;
    change.previousHolder = _folders.holder(previousParent).id;
  }
  change.row = row;
  change.isOfFile = change.isOfFile || isOfFile;
  change.isDead = isDead;
  change.holder = _folders.holder(row.parent);
}

void Journal::insert(ItemRow& row) {
  _index.insert(row);
  count(row.parent, 1);
  note(row, false, row.parent);
}

void Journal::update(ItemRow& row, FolderKey previousParent) {
  _index.update(row);
  if (Folder* folder = _folders.find(row.folder)) folder->isCountUntold = false;
  if (previousParent != row.parent) {
    count(previousParent, -1);
    count(row.parent, 1);
  }
  note(row, false, previousParent);
}

void Journal::updateDetails(ItemRow& row) {
  _index.update(row);
  note(row, false, row.parent, false);
}

void Journal::bury(const ItemRow& row, std::int64_t now) {
  ItemRow dead = row;
  dead.rank = _index.bury(row, _folders.holder(row.parent).id, now).rank;
  count(row.parent, -1);
  note(dead, true, row.parent);
}

void Journal::finish(std::uint64_t retention) {
  for (const FolderKey folder : _folders.takeTouched()) {
    if (const Folder* found = _folders.find(folder)) {
      _index.putFolder(found->row);
    } else {
      _index.eraseFolder(folder);
    }
  }
  _index.pruneTombstones(retention);
  _index.store();
}

std::vector<StoreChange> Journal::takeChanges() {
  std::vector<StoreChange> changes;
  changes.reserve(_changes.size());
  for (auto& [id, change] : _changes) {
    const ItemHolder& holder = change.holder;
    StoreChange told;
    told.rank = change.row.rank;
    told.folder = holder.id;
    told.isOfFile = change.isOfFile;
    told.previousFolder = change.previousHolder;
    if (change.isDead) {
      told.item = makeDeadItem(id, change.row.state.kind, holder);
    } else {
      std::optional<std::uint64_t> children;
      if (const Folder* folder = _folders.find(change.row.folder)) {
        if (folder->row.scanned) children = folder->row.children;
      }
      const ItemDetails details =
          change.row.hasDetails ? _index.details(change.row.id) : ItemDetails();
      told.item = makeItem(change.row, holder, children, details);
    }
    changes.push_back(std::move(told));
  }
  _changes.clear();
  std::sort(changes.begin(), changes.end(),
            [](const StoreChange& a, const StoreChange& b) { return a.rank < b.rank; });
  return changes;
}

void Journal::discard() { _changes.clear(); }

}  // namespace skein::vald
