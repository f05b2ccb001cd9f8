#include "linux/vald/index/IndexWriter.h"

#include <algorithm>
#include <sstream>

#include "linux/vald/files/TagAttributes.h"

namespace skein::vald {
namespace {

constexpr char kCounts[] = "counts";
constexpr char kOldestRank[] = "oldest rank";

int isDocument(VLFileObjectID id) { return id.isFolderOrAliasID() ? 0 : 1; }

Tombstone tombstoneFromRow(SqliteStatement& statement) {
  Tombstone tombstone;
  tombstone.rank = statement.number(0);
  tombstone.kind = static_cast<ItemKind>(statement.integer(2));
  tombstone.id = idOfKind(tombstone.kind, statement.number(1));
  tombstone.folder = VLFileObjectID::folderOrAliasWithRawID(statement.number(3));
  tombstone.parent = statement.integer(4);
  tombstone.name = statement.bytes(5);
  tombstone.key = {statement.number(6), static_cast<std::uint32_t>(statement.integer(7)),
                   statement.integer(8)};
  tombstone.died = statement.integer(9);
  return tombstone;
}

}  // namespace

IndexWriter::IndexWriter(SqliteDatabase& database)
    : _database(database),
      _insert(database,
              "INSERT INTO item(rank, parent, name, id, kind, inode, generation, size, age, "
              "changed, born, seen, folder, container, flags) "
              "VALUES(?,?,?,?,?,?,?,?,?,?,?,?,?,?,?)"),
      _update(database,
              "UPDATE item SET rank=?, parent=?, name=?, id=?, kind=?, inode=?, generation=?, "
              "size=?, age=?, changed=?, born=?, seen=?, folder=?, container=?, flags=? "
              "WHERE rank=?"),
      _erase(database, "DELETE FROM item WHERE rank=?"),
      _children(database,
                "SELECT " SKEIN_ITEM_COLUMNS " FROM item WHERE parent=? ORDER BY name, rank"),
      _subfolders(database,
                  "SELECT folder FROM item WHERE parent=? AND kind=1 AND container IS NULL "
                  "ORDER BY name"),
      _named(database, "SELECT " SKEIN_ITEM_COLUMNS " FROM item WHERE parent=? AND name=?"),
      _withInode(database, "SELECT " SKEIN_ITEM_COLUMNS " FROM item WHERE inode=?"),
      _withID(database, "SELECT " SKEIN_ITEM_COLUMNS " FROM item WHERE id=? AND (kind=0)=?"),
      _bury(database,
            "INSERT INTO tombstone(rank, id, kind, holder, parent, name, inode, generation, born, "
            "died) VALUES(?,?,?,?,?,?,?,?,?,?)"),
      _tombstoneWithInode(database, "SELECT * FROM tombstone WHERE inode=? ORDER BY rank DESC"),
      _tombstoneAt(database,
                   "SELECT * FROM tombstone WHERE parent=? AND name=? AND died>=? AND kind=0 "
                   "ORDER BY rank DESC LIMIT 1"),
      _dropTombstone(database, "DELETE FROM tombstone WHERE rank=?"),
      _putFolder(database,
                 // A folder's identifier stays, and with it what stands in the index of them.
                 "INSERT INTO folder(key, id, parent, name, scanned, children, changes, inode, "
                 "generation, born) VALUES(?,?,?,?,?,?,0,?,?,?) ON CONFLICT(key) DO UPDATE SET "
                 "parent=excluded.parent, name=excluded.name, scanned=excluded.scanned, "
                 "children=excluded.children, inode=excluded.inode, "
                 "generation=excluded.generation, born=excluded.born"),
      _eraseFolder(database, "DELETE FROM folder WHERE key=?"),
      _setFlags(database, "UPDATE item SET flags=? WHERE rank=?"),
      _details(database,
               "SELECT " SKEIN_DETAIL_COLUMNS " FROM detail WHERE id=? AND is_document=?"),
      _putDetails(database,
                  "INSERT OR REPLACE INTO detail(id, is_document, tags, on_file, created, used, "
                  "favorite) VALUES(?,?,?,?,?,?,?)"),
      _dropTag(database, "DELETE FROM tag WHERE name=? AND id=? AND is_document=?"),
      _putTag(database, "INSERT INTO tag(name, id, is_document) VALUES(?,?,?)") {
  load();
}

void IndexWriter::load() {
  _counts = {};
  _stored.counts = setting(kCounts).value_or("");
  std::istringstream(_stored.counts) >> _counts.documents >> _counts.folders >> _counts.aliases;
  _oldestRank = 0;
  std::istringstream(setting(kOldestRank).value_or("")) >> _oldestRank;
  _stored.oldestRank = _oldestRank;
  const auto rankOf = [&](const char* sql) {
    return static_cast<std::uint64_t>(_database.integer(sql));
  };
  _rank = std::max({rankOf("SELECT max(rank) FROM item"), rankOf("SELECT max(rank) FROM tombstone"),
                    _oldestRank});
  _tombstones = rankOf("SELECT count(*) FROM tombstone");
}

void IndexWriter::store() {
  std::ostringstream counts;
  counts << _counts.documents << ' ' << _counts.folders << ' ' << _counts.aliases;
  // Most changes leave both as they are.
  if (_stored.counts != counts.str()) {
    _stored.counts = counts.str();
    setSetting(kCounts, _stored.counts);
  }
  if (_stored.oldestRank != _oldestRank) {
    _stored.oldestRank = _oldestRank;
    setSetting(kOldestRank, std::to_string(_oldestRank));
  }
}

void IndexWriter::insert(ItemRow& row) {
  row.rank = ++_rank;
  const FileState& state = row.state;
  _insert
      .start(row.rank, row.parent, row.name, row.id.rawID(), static_cast<int>(state.kind),
             state.key.inode, state.key.generation, state.size, difference(0, state.modified),
             difference(state.modified, state.changed), difference(state.modified, state.key.born),
             row.seen, row.folder, row.containerID, flagsOf(row))
      .run();
  ++_counts.of(state.kind);
}

void IndexWriter::update(ItemRow& row) {
  const std::uint64_t previous = row.rank;
  row.rank = ++_rank;
  const FileState& state = row.state;
  _update
      .start(row.rank, row.parent, row.name, row.id.rawID(), static_cast<int>(state.kind),
             state.key.inode, state.key.generation, state.size, difference(0, state.modified),
             difference(state.modified, state.changed), difference(state.modified, state.key.born),
             row.seen, row.folder, row.containerID, flagsOf(row), previous)
      .run();
}

void IndexWriter::putFlags(const ItemRow& row) { _setFlags.start(flagsOf(row), row.rank).run(); }

ItemDetails IndexWriter::details(VLFileObjectID id) {
  ItemDetails details;
  _details.start(id.rawID(), isDocument(id));
  if (_details.step()) details = detailsFromRow(_details, 0);
  _details.reset();
  return details;
}

void IndexWriter::putDetails(VLFileObjectID id, const ItemDetails& details) {
  const std::uint64_t rawID = id.rawID();
  for (const std::string& name : splitTags(this->details(id).tags)) {
    _dropTag.start(name, rawID, isDocument(id)).run();
  }
  if (details.isEmpty()) {
    SqliteStatement erase(_database, "DELETE FROM detail WHERE id=? AND is_document=?");
    erase.start(rawID, isDocument(id)).run();
    return;
  }
  _putDetails
      .start(rawID, isDocument(id), details.tags, details.tagsAreOnFile ? 1 : 0, details.created,
             details.used, details.favorite)
      .run();
  for (const std::string& name : splitTags(details.tags)) {
    _putTag.start(name, rawID, isDocument(id)).run();
  }
}

void IndexWriter::erase(const ItemRow& row) {
  _erase.start(row.rank).run();
  --_counts.of(row.state.kind);
}

Tombstone IndexWriter::bury(const ItemRow& row, VLFileObjectID holder, std::int64_t now) {
  erase(row);
  Tombstone tombstone{++_rank,  row.id,         holder,        row.parent,
                      row.name, row.state.kind, row.state.key, now};
  _bury
      .start(tombstone.rank, row.id.rawID(), static_cast<int>(tombstone.kind), holder.rawID(),
             row.parent, row.name, tombstone.key.inode, tombstone.key.generation,
             tombstone.key.born, now)
      .run();
  ++_tombstones;
  return tombstone;
}

std::vector<ItemRow> IndexWriter::rows(SqliteStatement& statement) {
  std::vector<ItemRow> rows;
  while (statement.step()) rows.push_back(itemFromRow(statement));
  return rows;
}

std::vector<ItemRow> IndexWriter::childrenOf(FolderKey folder) {
  return rows(_children.start(folder));
}

std::vector<FolderKey> IndexWriter::subfoldersOf(FolderKey folder) {
  std::vector<FolderKey> folders;
  _subfolders.start(folder);
  while (_subfolders.step()) folders.push_back(_subfolders.integer(0));
  return folders;
}

FolderKey IndexWriter::nextFolder() {
  return 1 + std::max(_database.integer("SELECT max(key) FROM folder"),
                      _database.integer("SELECT max(parent) FROM tombstone"));
}

std::vector<ItemRow> IndexWriter::rowsNamed(FolderKey folder, std::string_view name) {
  return rows(_named.start(folder, name));
}

std::vector<ItemRow> IndexWriter::rowsWithInode(std::uint64_t inode) {
  return rows(_withInode.start(inode));
}

std::vector<ItemRow> IndexWriter::rowsAfter(std::uint64_t rank, std::uint64_t until,
                                            std::size_t limit) {
  SqliteStatement statement(_database, "SELECT " SKEIN_ITEM_COLUMNS
                                       " FROM item WHERE rank>? AND rank<=? ORDER BY rank LIMIT ?");
  return rows(statement.start(rank, until, limit));
}

std::optional<ItemRow> IndexWriter::rowWithID(VLFileObjectID id) {
  auto found = rows(_withID.start(id.rawID(), id.isFolderOrAliasID() ? 0 : 1));
  if (found.empty()) return std::nullopt;
  return std::move(found.front());
}

std::optional<Tombstone> IndexWriter::tombstoneWithInode(
    std::uint64_t inode, const std::function<bool(const Tombstone&)>& fits) {
  _tombstoneWithInode.start(inode);
  while (_tombstoneWithInode.step()) {
    Tombstone tombstone = tombstoneFromRow(_tombstoneWithInode);
    if (!fits(tombstone)) continue;
    _tombstoneWithInode.reset();
    return tombstone;
  }
  return std::nullopt;
}

std::optional<Tombstone> IndexWriter::tombstoneAt(FolderKey folder, std::string_view name,
                                                  std::int64_t since) {
  std::optional<Tombstone> tombstone;
  _tombstoneAt.start(folder, name, since);
  while (_tombstoneAt.step()) tombstone = tombstoneFromRow(_tombstoneAt);
  return tombstone;
}

void IndexWriter::dropTombstone(std::uint64_t rank) {
  if (_dropTombstone.start(rank).run()) --_tombstones;
}

void IndexWriter::pruneTombstones(std::uint64_t retention) {
  if (_tombstones <= retention) return;
  SqliteStatement last(_database, "SELECT rank FROM tombstone ORDER BY rank LIMIT 1 OFFSET ?");
  last.start(_tombstones - retention - 1);
  if (!last.step()) return;
  _oldestRank = last.number(0);
  last.reset();
  // What came back under its identifier has a row.
  for (const char* table : {"detail", "tag"}) {
    const std::string sql = std::string("DELETE FROM ") + table +
                            " WHERE (id, is_document) IN (SELECT id, kind=0 FROM tombstone WHERE "
                            "rank<=?) AND NOT EXISTS (SELECT 1 FROM item WHERE item.id=" +
                            table + ".id AND (item.kind=0)=" + table + ".is_document)";
    SqliteStatement forget(_database, sql.c_str());
    forget.start(_oldestRank).run();
  }
  SqliteStatement prune(_database, "DELETE FROM tombstone WHERE rank<=?");
  if (prune.start(_oldestRank).run()) _tombstones = retention;
}

std::vector<FolderRow> IndexWriter::folders() {
  std::vector<FolderRow> folders;
  SqliteStatement statement(
      _database,
      "SELECT key, id, parent, name, scanned, children, inode, generation, born FROM folder");
  while (statement.step()) {
    folders.push_back({statement.integer(0),
                       VLFileObjectID::folderOrAliasWithRawID(statement.number(1)),
                       statement.integer(2),
                       std::string(statement.bytes(3)),
                       statement.integer(4) != 0,
                       statement.number(5),
                       {statement.number(6), static_cast<std::uint32_t>(statement.integer(7)),
                        statement.integer(8)}});
  }
  return folders;
}

void IndexWriter::putFolder(const FolderRow& folder) {
  _putFolder
      .start(folder.number, folder.id.rawID(), folder.parent, folder.name, folder.scanned ? 1 : 0,
             folder.children, folder.key.inode, folder.key.generation, folder.key.born)
      .run();
}

void IndexWriter::eraseFolder(FolderKey folder) { _eraseFolder.start(folder).run(); }

std::vector<RootRow> IndexWriter::roots() {
  std::vector<RootRow> roots;
  SqliteStatement statement(_database,
                            "SELECT folder, container, path, inode, generation FROM root");
  while (statement.step()) {
    RootRow root;
    root.folder = statement.integer(0);
    if (!statement.isNull(1)) root.containerID = statement.bytes(1);
    root.path = statement.bytes(2);
    root.key.inode = statement.number(3);
    root.key.generation = static_cast<std::uint32_t>(statement.integer(4));
    roots.push_back(std::move(root));
  }
  return roots;
}

void IndexWriter::putRoot(const RootRow& root) {
  SqliteStatement statement(_database,
                            "INSERT OR REPLACE INTO root(folder, container, path, inode, "
                            "generation) VALUES(?,?,?,?,?)");
  statement.start(root.folder, root.containerID, root.path, root.key.inode, root.key.generation)
      .run();
}

void IndexWriter::eraseRoot(FolderKey folder) {
  SqliteStatement statement(_database, "DELETE FROM root WHERE folder=?");
  statement.start(folder).run();
}

std::optional<std::string> IndexWriter::setting(const std::string& name) {
  SqliteStatement statement(_database, "SELECT value FROM setting WHERE name=?");
  statement.start(name);
  if (!statement.step()) return std::nullopt;
  return std::string(statement.bytes(0));
}

void IndexWriter::setSetting(const std::string& name, const std::optional<std::string>& value) {
  if (value) {
    SqliteStatement put(_database, "INSERT OR REPLACE INTO setting(name, value) VALUES(?,?)");
    put.start(name, *value).run();
  } else {
    SqliteStatement drop(_database, "DELETE FROM setting WHERE name=?");
    drop.start(name).run();
  }
}

}  // namespace skein::vald
