#include "linux/vald/index/IndexReader.h"

#include "base/Numbers.h"
#include "linux/protocol/AnswerRoom.h"
#include "linux/vald/scan/StoreNames.h"

namespace skein::vald {
namespace {

constexpr std::size_t kMostIdle = 4;

// The item, its holder's number, and what its own folder row says.
#define SKEIN_FOUND                                                                              \
  "SELECT " SKEIN_ITEM_COLUMNS ", holder.id, self.scanned, self.children, " SKEIN_DETAIL_COLUMNS \
  " FROM item "                                                                                  \
  "LEFT JOIN folder AS holder ON holder.key = item.parent "                                      \
  "LEFT JOIN folder AS self ON self.key = item.folder "                                          \
  "LEFT JOIN detail ON item.flags & 8 AND detail.id = item.id AND detail.is_document = "         \
  "(item.kind=0) "
#define SKEIN_FOLDER \
  "SELECT key, id, parent, name, scanned, children, inode, generation, born FROM folder "

FolderRow folderFromRow(SqliteStatement& statement) {
  return {statement.integer(0),
          VLFileObjectID::folderOrAliasWithRawID(statement.number(1)),
          statement.integer(2),
          std::string(statement.bytes(3)),
          statement.integer(4) != 0,
          statement.number(5),
          {statement.number(6), static_cast<std::uint32_t>(statement.integer(7)),
           statement.integer(8)}};
}

std::optional<FolderRow> oneFolder(SqliteStatement& statement) {
  std::optional<FolderRow> folder;
  if (statement.step()) folder = folderFromRow(statement);
  statement.reset();
  return folder;
}

}  // namespace

IndexReader::IndexReader(std::unique_ptr<SqliteDatabase> database)
    : _database(std::move(database)),
      _folder(*_database, SKEIN_FOLDER "WHERE key=?"),
      _folderWithID(*_database, SKEIN_FOLDER "WHERE id=?"),
      _itemWithID(*_database, SKEIN_FOUND "WHERE item.id=? AND (item.kind=0)=?"),
      _nameWithID(*_database, "SELECT parent, name FROM item WHERE id=? AND (kind=0)=?"),
      _itemNamed(*_database, SKEIN_FOUND "WHERE item.parent=? AND item.name=?"),
      _itemsAfter(*_database, SKEIN_FOUND "WHERE item.rank>? ORDER BY item.rank LIMIT ?"),
      _tombstonesAfter(*_database,
                       "SELECT rank, id, kind, holder FROM tombstone WHERE rank>? ORDER BY rank "
                       "LIMIT ?"),
      _rootRows(*_database, "SELECT folder, container, path, inode, generation FROM root"),
      _setting(*_database, "SELECT value FROM setting WHERE name=?"),
      _byName(*_database,
              SKEIN_FOUND "WHERE item.parent=? ORDER BY item.name, item.id LIMIT ? OFFSET ?"),
      _byAge(*_database, SKEIN_FOUND
             "WHERE item.parent=? ORDER BY item.age, item.name, item.id LIMIT ? OFFSET ?"),
      _byNameAfter(*_database, SKEIN_FOUND
                   "WHERE item.parent=? AND (item.name, item.id) > (?, ?) "
                   "ORDER BY item.name, item.id LIMIT ?"),
      _byAgeAfter(*_database, SKEIN_FOUND
                  "WHERE item.parent=? AND (item.age, item.name, item.id) > (?, ?, ?) "
                  "ORDER BY item.age, item.name, item.id LIMIT ?"),
      _allByName(*_database,
                 SKEIN_FOUND "WHERE item.kind=1 ORDER BY item.name, item.id LIMIT ? OFFSET ?"),
      _allByAge(*_database, SKEIN_FOUND
                "WHERE item.kind=1 ORDER BY item.age, item.name, item.id LIMIT ? OFFSET ?"),
      _allByNameAfter(*_database, SKEIN_FOUND
                      "WHERE item.kind=1 AND (item.name, item.id) > (?, ?) "
                      "ORDER BY item.name, item.id LIMIT ?"),
      _allByAgeAfter(*_database, SKEIN_FOUND
                     "WHERE item.kind=1 AND (item.age, item.name, item.id) > (?, ?, ?) "
                     "ORDER BY item.age, item.name, item.id LIMIT ?") {}

FoundItem IndexReader::found(SqliteStatement& statement) {
  FoundItem found{itemFromRow(statement),
                  {VLFileObjectID::folderOrAliasWithRawID(statement.number(kItemColumns))},
                  std::nullopt,
                  {}};
  found.holder.isDrive = found.row.parent == kDriveFolder;
  if (statement.integer(kItemColumns + 1) != 0) {
    found.children = statement.number(kItemColumns + 2);
  }
  if (found.row.hasDetails) found.details = detailsFromRow(statement, kItemColumns + 3);
  return found;
}

std::vector<FoundItem> IndexReader::all(SqliteStatement& statement) {
  std::vector<FoundItem> items;
  AnswerRoom room;
  bool isRoom = true;
  while (isRoom && statement.step())
    isRoom = room.take(items.emplace_back(found(statement)).bytes());
  if (!isRoom) statement.reset();
  for (FoundItem& item : items) item.holder.isTrashed = isTrashed(item.row.parent);
  return items;
}

std::optional<FolderRow> IndexReader::folder(FolderKey key) {
  return oneFolder(_folder.start(key));
}

std::optional<FolderRow> IndexReader::folderWithID(VLFileObjectID id) {
  if (!id.isFolderOrAliasID()) return std::nullopt;
  return oneFolder(_folderWithID.start(id.rawID()));
}

const std::vector<RootRow>& IndexReader::roots() {
  if (_roots) return *_roots;
  std::vector<RootRow>& roots = _roots.emplace();
  _rootRows.start();
  while (_rootRows.step()) {
    RootRow root;
    root.folder = _rootRows.integer(0);
    if (!_rootRows.isNull(1)) root.containerID = _rootRows.bytes(1);
    root.path = _rootRows.bytes(2);
    root.key.inode = _rootRows.number(3);
    root.key.generation = static_cast<std::uint32_t>(_rootRows.integer(4));
    roots.push_back(std::move(root));
  }
  return roots;
}

std::vector<FolderRow> IndexReader::trashes() {
  std::vector<FolderRow> trashes;
  for (const RootRow& root : roots()) {
    const auto key = setting(trashSetting(root.folder));
    const auto number = key ? parseNumber<FolderKey>(*key) : std::nullopt;
    auto trash = number ? folder(*number) : std::nullopt;
    if (trash) trashes.push_back(std::move(*trash));
  }
  return trashes;
}

bool IndexReader::isTrashed(FolderKey folder) {
  bool answer = false;
  std::vector<FolderKey> below;
  while (folder != kNoFolder && folder != kDriveFolder) {
    // A ring ends where it began.
    const auto [known, isNew] = _trashed.try_emplace(folder, false);
    answer = known->second;
    if (!isNew) break;
    below.push_back(folder);
    const auto row = this->folder(folder);
    answer = row && isTrashFolderName(row->name);
    if (!row || answer) break;
    folder = row->parent;
  }
  for (const FolderKey key : below) _trashed[key] = answer;
  return answer;
}

std::vector<Tombstone> IndexReader::tombstonesAt(FolderKey folder, std::string_view name,
                                                 std::uint64_t limit) {
  std::vector<Tombstone> tombstones;
  SqliteStatement statement(*_database,
                            "SELECT rank, id, kind, died FROM tombstone WHERE parent=? AND name=? "
                            "ORDER BY rank DESC LIMIT ?");
  statement.start(folder, name, limit);
  while (statement.step()) {
    Tombstone tombstone;
    tombstone.rank = statement.number(0);
    tombstone.kind = static_cast<ItemKind>(statement.integer(2));
    tombstone.id = idOfKind(tombstone.kind, statement.number(1));
    tombstone.died = statement.integer(3);
    tombstones.push_back(std::move(tombstone));
  }
  return tombstones;
}

std::vector<ItemRow> IndexReader::unsettledAfter(std::uint64_t rank, std::uint64_t limit) {
  std::vector<ItemRow> rows;
  SqliteStatement statement(*_database, "SELECT " SKEIN_ITEM_COLUMNS
                                        " FROM item WHERE rank>? AND kind=0 AND flags & 5 = 0 "
                                        "ORDER BY rank LIMIT ?");
  statement.start(rank, limit);
  while (statement.step()) rows.push_back(itemFromRow(statement));
  return rows;
}

std::vector<std::pair<std::string, std::uint64_t>> IndexReader::tags(std::string_view after) {
  std::vector<std::pair<std::string, std::uint64_t>> tags;
  SqliteStatement statement(
      *_database,
      "SELECT tag.name, count(*) FROM tag WHERE tag.name>? AND EXISTS (SELECT "
      "1 FROM item WHERE item.id=tag.id AND (item.kind=0)=tag.is_document) "
      "GROUP BY tag.name ORDER BY tag.name");
  statement.start(after);
  AnswerRoom room;
  while (statement.step() && room.take(statement.bytes(0).size())) {
    tags.emplace_back(statement.bytes(0), statement.number(1));
  }
  return tags;
}

std::optional<RootRow> IndexReader::root(FolderKey folder) {
  for (const RootRow& root : roots()) {
    if (root.folder == folder) return root;
  }
  return std::nullopt;
}

std::optional<FoundItem> IndexReader::itemWithID(VLFileObjectID id) {
  auto items = all(_itemWithID.start(id.rawID(), id.isFolderOrAliasID() ? 0 : 1));
  if (items.empty()) return std::nullopt;
  return std::move(items.front());
}

std::optional<IndexReader::Name> IndexReader::nameWithID(VLFileObjectID id) {
  std::optional<Name> name;
  _nameWithID.start(id.rawID(), id.isFolderOrAliasID() ? 0 : 1);
  if (_nameWithID.step()) name = {_nameWithID.integer(0), std::string(_nameWithID.bytes(1))};
  _nameWithID.reset();
  return name;
}

std::optional<FoundItem> IndexReader::itemNamed(FolderKey folder, std::string_view name) {
  // A container may be shown under the name of a file: the file goes first.
  std::optional<FoundItem> best;
  for (FoundItem& item : all(_itemNamed.start(folder, name))) {
    if (!best || !item.row.containerID) best = std::move(item);
  }
  return best;
}

std::vector<ItemRow> IndexReader::children(FolderKey folder) {
  std::vector<ItemRow> rows;
  SqliteStatement statement(
      *_database, "SELECT " SKEIN_ITEM_COLUMNS " FROM item WHERE parent=? ORDER BY name, rank");
  statement.start(folder);
  while (statement.step()) rows.push_back(itemFromRow(statement));
  return rows;
}

std::vector<FoundItem> IndexReader::page(FolderKey folder, SortOrder order,
                                         const std::optional<ListingPlace>& place,
                                         std::uint64_t offset, std::uint64_t limit) {
  const bool isByName = order == SortOrder::Name;
  if (folder == kNoFolder) {
    if (!place) return all((isByName ? _allByName : _allByAge).start(limit, offset));
    if (isByName) return all(_allByNameAfter.start(place->name, place->rawID, limit));
    return all(_allByAgeAfter.start(place->age, place->name, place->rawID, limit));
  }
  if (!place) return all((isByName ? _byName : _byAge).start(folder, limit, offset));
  if (isByName) return all(_byNameAfter.start(folder, place->name, place->rawID, limit));
  return all(_byAgeAfter.start(folder, place->age, place->name, place->rawID, limit));
}

std::vector<FoundItem> IndexReader::itemsAfter(std::uint64_t rank, std::uint64_t limit) {
  return all(_itemsAfter.start(rank, limit));
}

std::vector<Tombstone> IndexReader::tombstonesAfter(std::uint64_t rank, std::uint64_t limit) {
  std::vector<Tombstone> tombstones;
  _tombstonesAfter.start(rank, limit);
  while (_tombstonesAfter.step()) {
    Tombstone tombstone;
    tombstone.rank = _tombstonesAfter.number(0);
    tombstone.kind = static_cast<ItemKind>(_tombstonesAfter.integer(2));
    tombstone.id = idOfKind(tombstone.kind, _tombstonesAfter.number(1));
    tombstone.folder = VLFileObjectID::folderOrAliasWithRawID(_tombstonesAfter.number(3));
    tombstones.push_back(std::move(tombstone));
  }
  return tombstones;
}

std::uint64_t IndexReader::number(const char* sql) {
  return static_cast<std::uint64_t>(_database->integer(sql));
}

std::optional<std::string> IndexReader::setting(const std::string& name) {
  std::optional<std::string> value;
  _setting.start(name);
  if (_setting.step()) value = std::string(_setting.bytes(0));
  _setting.reset();
  return value;
}

IndexReaders::Lease::Lease(IndexReaders& readers, std::unique_ptr<IndexReader> reader)
    : _readers(readers), _reader(std::move(reader)) {
  if (_reader) _reader->begin();
}

IndexReaders::Lease::~Lease() {
  if (!_reader) return;
  _reader->end();
  // One that failed is opened anew next time.
  if (!_reader->failed()) _readers.giveBack(std::move(_reader));
}

IndexReaders::Lease IndexReaders::lease() {
  {
    MutexLock lock(_mutex);
    if (!_idle.empty()) {
      auto reader = std::move(_idle.back());
      _idle.pop_back();
      return {*this, std::move(reader)};
    }
  }
  int code = 0;
  std::string message;
  auto database = SqliteDatabase::open(_path, false, code, message);
  if (!database) return {*this, nullptr};
  return {*this, std::make_unique<IndexReader>(std::move(database))};
}

void IndexReaders::giveBack(std::unique_ptr<IndexReader> reader) {
  MutexLock lock(_mutex);
  if (_idle.size() < kMostIdle) _idle.push_back(std::move(reader));
}

}  // namespace skein::vald
