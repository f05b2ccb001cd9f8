#pragma once

#include <unordered_map>
#include <vector>

#include "linux/vald/Store.h"
#include "linux/vald/index/IndexWriter.h"
#include "linux/vald/scan/FolderTable.h"

namespace skein::vald {

// What one transaction does to items: writes it, keeps the folders' counts, and gathers
// the changes for the listener, one per item: its latest. On the writer thread.
class Journal {
 public:
  Journal(IndexWriter& index, FolderTable& folders) : _index(index), _folders(folders) {}

  void insert(ItemRow& row);
  // `previousParent`: the folder that holds the row as it stands in the index.
  void update(ItemRow& row, FolderKey previousParent);
  // The file stands as it was; what the index alone knows of the item changed.
  void updateDetails(ItemRow& row);
  void bury(const ItemRow& row, std::int64_t now);

  // Writes the folders' rows and what else the transaction leaves. Before the commit.
  void finish(std::uint64_t retention);
  // After the commit: by rising rank.
  std::vector<StoreChange> takeChanges();
  void discard();
  bool isEmpty() const { return _changes.empty(); }

 private:
  struct Change {
    ItemRow row;
    bool isDead = false;
    bool isOfFile = false;
    FolderKey previousParent = kNoFolder;
    ItemHolder holder{VLFileObjectID::folderOrAliasWithRawID(0)};
    VLFileObjectID previousHolder = VLFileObjectID::folderOrAliasWithRawID(0);
  };
  void note(const ItemRow& row, bool isDead, FolderKey previousParent, bool isOfFile = true);
  void count(FolderKey folder, int by);

  IndexWriter& _index;
  FolderTable& _folders;
  std::unordered_map<VLFileObjectID, Change> _changes;
};

}  // namespace skein::vald
