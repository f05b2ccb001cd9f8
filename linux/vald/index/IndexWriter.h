#pragma once

#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "linux/vald/index/Rows.h"

namespace skein::vald {

// How many items of each kind the index holds.
struct ItemCounts {
  std::uint64_t documents = 0;
  std::uint64_t folders = 0;
  std::uint64_t aliases = 0;

  std::uint64_t& of(ItemKind kind) {
    return kind == ItemKind::Document ? documents : kind == ItemKind::Folder ? folders : aliases;
  }
};

// One folder as the index keeps it. `name` is its name in `parent`; a root has neither.
struct FolderRow {
  FolderKey number = kNoFolder;
  VLFileObjectID id = VLFileObjectID::folderOrAliasWithRawID(0);
  FolderKey parent = kNoFolder;
  std::string name;
  bool scanned = false;
  std::uint64_t children = 0;
  FileKey key;
};

struct RootRow {
  FolderKey folder = kNoFolder;
  std::optional<std::string> containerID;
  std::string path;
  // Of this very folder; the birth time is not kept.
  FileKey key;
};

// The write side of the index, on the writer thread, inside a transaction of the caller's.
// Every insertion, update and deletion of an item draws the next rank. Failures are
// latched in the database.
class IndexWriter {
 public:
  explicit IndexWriter(SqliteDatabase& database);

  // Reads ranks and counts; again after a rollback.
  void load();
  std::uint64_t rank() const { return _rank; }
  std::uint64_t oldestRank() const { return _oldestRank; }
  const ItemCounts& counts() const { return _counts; }

  void insert(ItemRow& row);
  // Rewrites the row that has row.rank, under a new rank. Its kind stays.
  void update(ItemRow& row);
  // Writes the row's flags alone, without a new rank: nobody is told.
  void putFlags(const ItemRow& row);

  // Empty when the item has none.
  ItemDetails details(VLFileObjectID id);
  // The caller sees to the row's hasDetails.
  void putDetails(VLFileObjectID id, const ItemDetails& details);

  // Takes the row away without a trace: for items that go on under another row.
  void erase(const ItemRow& row);
  // Takes the row away and leaves a tombstone.
  Tombstone bury(const ItemRow& row, VLFileObjectID holder, std::int64_t now);

  std::vector<ItemRow> childrenOf(FolderKey folder);  // by name
  std::vector<FolderKey> subfoldersOf(FolderKey folder);
  std::vector<ItemRow> rowsNamed(FolderKey folder, std::string_view name);
  std::vector<ItemRow> rowsWithInode(std::uint64_t inode);
  // With ranks above `rank` up to `until`, in that order.
  std::vector<ItemRow> rowsAfter(std::uint64_t rank, std::uint64_t until, std::size_t limit);
  std::optional<ItemRow> rowWithID(VLFileObjectID id);

  // The latest with this inode that fits.
  std::optional<Tombstone> tombstoneWithInode(std::uint64_t inode,
                                              const std::function<bool(const Tombstone&)>& fits);
  // The latest that died at this place at `since` or after.
  std::optional<Tombstone> tombstoneAt(FolderKey folder, std::string_view name, std::int64_t since);
  void dropTombstone(std::uint64_t rank);
  // Keeps the newest `retention` tombstones; older tokens expire thereby.
  void pruneTombstones(std::uint64_t retention);

  std::vector<FolderRow> folders();
  // A key above all that the index mentions.
  FolderKey nextFolder();
  void putFolder(const FolderRow& folder);
  void eraseFolder(FolderKey folder);
  std::vector<RootRow> roots();
  void putRoot(const RootRow& root);
  void eraseRoot(FolderKey folder);

  std::optional<std::string> setting(const std::string& name);
  void setSetting(const std::string& name, const std::optional<std::string>& value);
  // Writes what load() reads. Before each commit.
  void store();

 private:
  std::vector<ItemRow> rows(SqliteStatement& statement);

  SqliteDatabase& _database;
  std::uint64_t _rank = 0;
  std::uint64_t _oldestRank = 0;
  // What the settings say.
  struct {
    std::string counts;
    std::uint64_t oldestRank = 0;
  } _stored;
  std::uint64_t _tombstones = 0;
  ItemCounts _counts;

  SqliteStatement _insert, _update, _erase, _children, _subfolders, _named, _withInode, _withID;
  SqliteStatement _bury, _tombstoneWithInode, _tombstoneAt, _dropTombstone;
  SqliteStatement _putFolder, _eraseFolder, _setFlags, _details, _putDetails, _dropTag, _putTag;
};

}  // namespace skein::vald
