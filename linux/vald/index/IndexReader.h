#pragma once

#include <memory>
#include <optional>
#include <string>
#include <unordered_map>
#include <utility>
#include <vector>

#include "base/Mutex.h"
#include "linux/vald/index/IndexWriter.h"
#include "linux/vald/index/ItemMaking.h"
#include "linux/vald/index/ListingPlaces.h"

namespace skein::vald {

// An item with what surrounds it.
struct FoundItem {
  ItemRow row;
  ItemHolder holder;
  std::optional<std::uint64_t> children;
  ItemDetails details;

  VLQueryItemPtr item() const { return makeItem(row, holder, children, details); }
  // About as many bytes of text as item() has.
  std::size_t bytes() const { return row.name.size() + 2 * details.tags.size(); }
};

// The read side of the index: one connection, for one thread at a time. Failures are
// latched in the database.
class IndexReader {
 public:
  explicit IndexReader(std::unique_ptr<SqliteDatabase> database);

  // What is read until end() is of one moment.
  void begin() {
    _trashed.clear();
    _roots.reset();
    _database->beginReading();
  }
  void end() { _database->commit(); }
  bool failed() const { return _database->failed(); }
  const std::string& message() const { return _database->message(); }

  std::optional<FolderRow> folder(FolderKey key);
  std::optional<FolderRow> folderWithID(VLFileObjectID id);
  std::optional<RootRow> root(FolderKey folder);
  const std::vector<RootRow>& roots();
  // The roots' trash folders.
  std::vector<FolderRow> trashes();
  // Whether the folder is a trash, or lies in one.
  bool isTrashed(FolderKey folder);

  std::optional<FoundItem> itemWithID(VLFileObjectID id);
  // Where an item is, without the rest of it.
  struct Name {
    FolderKey folder = kNoFolder;
    std::string name;
  };
  std::optional<Name> nameWithID(VLFileObjectID id);
  std::optional<FoundItem> itemNamed(FolderKey folder, std::string_view name);
  std::vector<ItemRow> children(FolderKey folder);

  // A page of a folder's children, or (folder 0) of all folders: after `place`, or from
  // `offset` on. It ends early, with the first that is too much for an AnswerRoom.
  std::vector<FoundItem> page(FolderKey folder, SortOrder order,
                              const std::optional<ListingPlace>& place, std::uint64_t offset,
                              std::uint64_t limit);

  // Ends early as page() does.
  std::vector<FoundItem> itemsAfter(std::uint64_t rank, std::uint64_t limit);
  std::vector<Tombstone> tombstonesAfter(std::uint64_t rank, std::uint64_t limit);
  // What was removed under a name, newest first.
  std::vector<Tombstone> tombstonesAt(FolderKey folder, std::string_view name, std::uint64_t limit);
  // Documents after `rank`, in that order, whose upload is to be looked at.
  std::vector<ItemRow> unsettledAfter(std::uint64_t rank, std::uint64_t limit);
  // A page of them, with the number of their items, by name.
  std::vector<std::pair<std::string, std::uint64_t>> tags(std::string_view after);
  std::uint64_t number(const char* sql);
  std::optional<std::string> setting(const std::string& name);

 private:
  FoundItem found(SqliteStatement& statement);
  std::vector<FoundItem> all(SqliteStatement& statement);

  std::unique_ptr<SqliteDatabase> _database;
  // Of this moment; forgotten at its end.
  std::unordered_map<FolderKey, bool> _trashed;
  std::optional<std::vector<RootRow>> _roots;
  SqliteStatement _folder, _folderWithID, _itemWithID, _nameWithID, _itemNamed, _itemsAfter,
      _tombstonesAfter;
  SqliteStatement _rootRows, _setting;
  SqliteStatement _byName, _byAge, _byNameAfter, _byAgeAfter;
  SqliteStatement _allByName, _allByAge, _allByNameAfter, _allByAgeAfter;
};

// Read connections, as many as there are callers at once. Any thread.
class IndexReaders {
 public:
  explicit IndexReaders(std::string path) : _path(std::move(path)) {}

  // A reader for the scope of a call; holds one moment of the index.
  class Lease {
   public:
    Lease(IndexReaders& readers, std::unique_ptr<IndexReader> reader);
    ~Lease();
    Lease(const Lease&) = delete;
    Lease& operator=(const Lease&) = delete;
    // Whether the index could be opened.
    explicit operator bool() const { return _reader != nullptr; }
    IndexReader* operator->() { return _reader.get(); }
    IndexReader* get() { return _reader.get(); }

   private:
    IndexReaders& _readers;
    std::unique_ptr<IndexReader> _reader;
  };
  Lease lease() SKEIN_EXCLUDES(_mutex);

 private:
  void giveBack(std::unique_ptr<IndexReader> reader) SKEIN_EXCLUDES(_mutex);

  const std::string _path;
  Mutex _mutex;
  std::vector<std::unique_ptr<IndexReader>> _idle SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein::vald
