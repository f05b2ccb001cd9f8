#include "linux/vald/cloud/CloudRecords.h"

#include <algorithm>
#include <cstring>
#include <limits>
#include <utility>

namespace skein::vald {
namespace {

// References to contents are counted from the records themselves, so that no count can
// disagree with them after a crash.
constexpr char kSchema1[] = R"sql(
  CREATE TABLE records(
    document INTEGER PRIMARY KEY, zone TEXT NOT NULL, owner TEXT NOT NULL,
    hash BLOB NOT NULL, size INTEGER NOT NULL, modified INTEGER NOT NULL, created INTEGER,
    uploaded INTEGER NOT NULL, revision INTEGER NOT NULL, thumbnail BLOB);
  CREATE INDEX records_by_hash ON records(hash);
  CREATE INDEX records_by_zone ON records(owner, zone);
  CREATE TABLE stamps(
    document INTEGER PRIMARY KEY, size INTEGER NOT NULL, modified INTEGER NOT NULL,
    changed INTEGER NOT NULL, inode INTEGER NOT NULL);
  CREATE TABLE pins(document INTEGER PRIMARY KEY);
  CREATE TABLE work(number INTEGER PRIMARY KEY, path BLOB NOT NULL);
)sql";

// What recovery needs to know the file again, wherever its folder is by now.
constexpr char kSchema2[] = R"sql(
  ALTER TABLE work ADD COLUMN folder INTEGER NOT NULL DEFAULT 0;
  ALTER TABLE work ADD COLUMN hash BLOB NOT NULL DEFAULT x'';
)sql";

constexpr char kSchema3[] = R"sql(
  CREATE TABLE unreferenced(
    hash BLOB PRIMARY KEY, since INTEGER NOT NULL, missed INTEGER, size INTEGER NOT NULL);
  CREATE TABLE given_up(hash BLOB PRIMARY KEY) WITHOUT ROWID;
  CREATE TABLE settings(name TEXT PRIMARY KEY, value INTEGER NOT NULL);
)sql";
constexpr char kDays[] = "keep_days";
constexpr char kPercent[] = "keep_percent";
constexpr char kAdopted[] = "adopted";

constexpr char kColumns[] =
    "SELECT document, zone, owner, hash, size, modified, created, uploaded, revision, thumbnail "
    "FROM records ";

// Numbers of 64 bits without a sign keep their bits.
std::int64_t key(VLFileObjectID document) { return static_cast<std::int64_t>(document.rawID()); }
std::int64_t nanoseconds(NSDate date) { return date.time_since_epoch().count(); }
NSDate date(std::int64_t nanoseconds) { return NSDate(std::chrono::nanoseconds(nanoseconds)); }

std::string_view bytesOf(const ContentHash& hash) {
  return {reinterpret_cast<const char*>(hash.bytes().data()), hash.bytes().size()};
}

ContentHash hashOf(const std::string& bytes) {
  ContentHash::Bytes hash{};
  std::memcpy(hash.data(), bytes.data(), std::min(bytes.size(), hash.size()));
  return ContentHash(hash);
}

CloudRecord recordOf(const CloudStatement& row) {
  CloudRecord record;
  record.document = VLFileObjectID::documentWithRawID(static_cast<std::uint64_t>(row.integer(0)));
  record.zone = {row.text(1), row.text(2)};
  record.contents = {hashOf(row.text(3)), static_cast<std::uint64_t>(row.integer(4))};
  record.modified = date(row.integer(5));
  if (!row.isNull(6)) record.created = date(row.integer(6));
  record.uploaded = date(row.integer(7));
  record.revision = row.integer(8);
  if (!row.isNull(9)) record.thumbnail = row.text(9);
  return record;
}

Outcome<std::vector<CloudRecord>> allOf(CloudStatement& statement) {
  std::vector<CloudRecord> records;
  while (statement.step()) records.push_back(recordOf(statement));
  if (NSErrorPtr error = statement.error()) return error;
  return records;
}

bool countsForQuota(const CloudRecord& record) {
  return record.zone.ownerName == CKCurrentUserDefaultName;
}

}  // namespace

Outcome<std::unique_ptr<CloudRecords>> CloudRecords::open(const std::string& path) {
  auto database = CloudDatabase::open(path, {kSchema1, kSchema2, kSchema3});
  if (!database) return database.error();
  std::unique_ptr<CloudRecords> records(new CloudRecords(std::move(*database)));
  if (NSErrorPtr error = records->measure()) return error;
  return records;
}

NSErrorPtr CloudRecords::measure() {
  MutexLock lock(_mutex);
  const auto sum = _database->prepare("SELECT COALESCE(SUM(size), 0) FROM records WHERE owner = ?");
  if (!sum->bind(1, std::string_view(CKCurrentUserDefaultName)).step()) return sum->error();
  _usedBytes = static_cast<std::uint64_t>(sum->integer(0));
  return nullptr;
}

Outcome<CloudRecord> CloudRecords::put(CloudRecord record, const UploadStamp& stamp,
                                       const CloudContents::Hold& /*hold*/) {
  MutexLock lock(_mutex);
  const auto before = find(record.document);
  if (!before) return before.error();
  record.revision = 1;
  record.thumbnail = std::nullopt;
  if (*before) {
    const bool same = (*before)->contents.hash == record.contents.hash;
    record.revision = (*before)->revision + (same ? 0 : 1);
    if (same) record.thumbnail = (*before)->thumbnail;
    if (same) record.uploaded = (*before)->uploaded;
    record.zone = (*before)->zone;
  }
  NSErrorPtr error = _database->transact([&]() SKEIN_NO_THREAD_SAFETY_ANALYSIS {
    NSErrorPtr failed = write(record);
    if (failed == nullptr) {
      failed = _database->prepare("DELETE FROM unreferenced WHERE hash = ?")
                   ->bindBytes(1, bytesOf(record.contents.hash))
                   .run();
    }
    if (failed == nullptr && *before) {
      failed = noteUnreferenced((*before)->contents, record.uploaded);
    }
    return failed != nullptr ? failed : writeStamp(record.document, stamp);
  });
  if (error != nullptr) return error;
  if (*before && countsForQuota(**before)) _usedBytes -= (*before)->contents.size;
  if (countsForQuota(record)) _usedBytes += record.contents.size;
  return record;
}

NSErrorPtr CloudRecords::write(const CloudRecord& record) {
  return _database->prepare("INSERT OR REPLACE INTO records VALUES(?, ?, ?, ?, ?, ?, ?, ?, ?, ?)")
      ->bind(1, key(record.document))
      .bind(2, std::string_view(record.zone.zoneName))
      .bind(3, std::string_view(record.zone.ownerName))
      .bindBytes(4, bytesOf(record.contents.hash))
      .bind(5, static_cast<std::int64_t>(record.contents.size))
      .bind(6, nanoseconds(record.modified))
      .bind(7, record.created ? std::optional(nanoseconds(*record.created)) : std::nullopt)
      .bind(8, nanoseconds(record.uploaded))
      .bind(9, record.revision)
      .bind(10, record.thumbnail)
      .run();
}

Outcome<std::optional<CloudRecord>> CloudRecords::find(VLFileObjectID document) {
  const auto row = _database->prepare(std::string(kColumns) + "WHERE document = ?");
  const bool found = row->bind(1, key(document)).step();
  if (NSErrorPtr error = row->error()) return error;
  return found ? std::optional(recordOf(*row)) : std::nullopt;
}

Outcome<std::optional<CloudRecord>> CloudRecords::record(VLFileObjectID document) {
  MutexLock lock(_mutex);
  return find(document);
}

Outcome<std::vector<CloudRecord>> CloudRecords::records(
    const std::vector<VLFileObjectID>& documents) {
  MutexLock lock(_mutex);
  std::vector<CloudRecord> found;
  const auto row = _database->prepare(std::string(kColumns) + "WHERE document = ?");
  // One transaction: the file is locked once, and not for each of many.
  NSErrorPtr error = _database->transact([&]() -> NSErrorPtr {
    for (const VLFileObjectID& document : documents) {
      if (row->bind(1, key(document)).step()) found.push_back(recordOf(*row));
      if (NSErrorPtr failed = row->error()) return failed;
      row->reset();
    }
    return nullptr;
  });
  if (error) return error;
  return found;
}

Outcome<std::vector<CloudRecord>> CloudRecords::recordsInZone(const CKRecordZoneID& zone) {
  MutexLock lock(_mutex);
  const auto rows = _database->prepare(std::string(kColumns) + "WHERE owner = ? AND zone = ?");
  rows->bind(1, std::string_view(zone.ownerName)).bind(2, std::string_view(zone.zoneName));
  return allOf(*rows);
}

NSErrorPtr CloudRecords::remove(VLFileObjectID document) {
  MutexLock lock(_mutex);
  const auto before = find(document);
  if (!before) return before.error();
  NSErrorPtr error =
      _database->transactWithReserve([&]() SKEIN_NO_THREAD_SAFETY_ANALYSIS -> NSErrorPtr {
        for (const char* table : {"records", "stamps", "pins"}) {
          const auto statement =
              _database->prepare(std::string("DELETE FROM ") + table + " WHERE document = ?");
          if (NSErrorPtr failed = statement->bind(1, key(document)).run()) return failed;
        }
        return *before ? noteUnreferenced((*before)->contents, std::chrono::system_clock::now())
                       : nullptr;
      });
  if (error == nullptr && *before && countsForQuota(**before)) {
    _usedBytes -= (*before)->contents.size;
  }
  return error;
}

NSErrorPtr CloudRecords::setThumbnail(VLFileObjectID document, const ContentHash& contents,
                                      const std::optional<std::string>& path) {
  MutexLock lock(_mutex);
  return _database->withoutWaiting([&]() SKEIN_NO_THREAD_SAFETY_ANALYSIS {
    return _database->prepare("UPDATE records SET thumbnail = ? WHERE document = ? AND hash = ?")
        ->bind(1, path)
        .bind(2, key(document))
        .bindBytes(3, bytesOf(contents))
        .run();
  });
}

Outcome<std::vector<VLFileObjectID>> CloudRecords::documentsWithoutThumbnail(
    std::optional<VLFileObjectID> last, std::size_t limit) {
  MutexLock lock(_mutex);
  const auto row = _database->prepare(
      "SELECT document FROM records WHERE thumbnail IS NULL AND document >= ? AND document IS NOT "
      "? "
      "ORDER BY document LIMIT ?");
  const std::int64_t from = last ? key(*last) : std::numeric_limits<std::int64_t>::min();
  row->bind(1, from)
      .bind(2, last ? std::optional(from) : std::nullopt)
      .bind(3, static_cast<std::int64_t>(limit));
  std::vector<VLFileObjectID> documents;
  while (row->step()) {
    documents.push_back(
        VLFileObjectID::documentWithRawID(static_cast<std::uint64_t>(row->integer(0))));
  }
  if (NSErrorPtr error = row->error()) return error;
  return documents;
}

Outcome<std::uint64_t> CloudRecords::references(const ContentHash& hash) {
  MutexLock lock(_mutex);
  const auto count = _database->prepare("SELECT COUNT(*) FROM records WHERE hash = ?");
  if (!count->bindBytes(1, bytesOf(hash)).step()) return count->error();
  return static_cast<std::uint64_t>(count->integer(0));
}

NSErrorPtr CloudRecords::noteUnreferenced(const HashedContents& contents, NSDate since) {
  return _database
      ->prepare(
          "INSERT OR REPLACE INTO unreferenced(hash, since, size) SELECT ?1, ?2, ?3 "
          "WHERE NOT EXISTS (SELECT 1 FROM records WHERE hash = ?1)")
      ->bindBytes(1, bytesOf(contents.hash))
      .bind(2, nanoseconds(since))
      .bind(3, static_cast<std::int64_t>(contents.size))
      .run();
}

NSErrorPtr CloudRecords::noteGivenUp(const ContentHash& hash) {
  return _database->prepare("INSERT OR IGNORE INTO given_up VALUES(?)")
      ->bindBytes(1, bytesOf(hash))
      .run();
}

Outcome<std::vector<CloudRecords::Unreferenced>> CloudRecords::noteLook(
    const std::vector<ContentHash>& named, NSDate look) {
  MutexLock lock(_mutex);
  std::vector<Unreferenced> all;
  NSErrorPtr error = _database->transact([&]() SKEIN_NO_THREAD_SAFETY_ANALYSIS -> NSErrorPtr {
    const auto row = _database->prepare(
        "SELECT hash, size, since, missed, EXISTS (SELECT 1 FROM given_up "
        "WHERE given_up.hash = unreferenced.hash) FROM unreferenced ORDER BY since");
    while (row->step()) {
      Unreferenced one{{hashOf(row->text(0)), static_cast<std::uint64_t>(row->integer(1))},
                       date(row->integer(2)),
                       std::nullopt,
                       row->integer(4) != 0};
      if (!row->isNull(3)) one.missed = date(row->integer(3));
      all.push_back(one);
    }
    if (NSErrorPtr failed = row->error()) return failed;
    const auto note = _database->prepare(
        "UPDATE unreferenced SET since = ?2, missed = ?3 WHERE hash = ?1 "
        "AND (since IS NOT ?2 OR missed IS NOT ?3)");
    for (Unreferenced& one : all) {
      const bool isNamed = std::binary_search(named.begin(), named.end(), one.contents.hash);
      // A clock that was put back makes nothing stay longer than that.
      one.since = isNamed ? look : std::min(one.since, look);
      if (one.missed) one.missed = std::min(*one.missed, look);
      if (isNamed) {
        one.missed = std::nullopt;
        one.givenUp = true;
        if (NSErrorPtr failed = noteGivenUp(one.contents.hash)) return failed;
      }
      note->bindBytes(1, bytesOf(one.contents.hash)).bind(2, nanoseconds(one.since));
      if (!isNamed) note->bind(3, nanoseconds(one.missed.value_or(look)));
      if (NSErrorPtr failed = note->run()) return failed;
      note->reset();
    }
    return nullptr;
  });
  if (error != nullptr) return error;
  return all;
}

Outcome<std::vector<ContentHash>> CloudRecords::release(const std::vector<ContentHash>& contents,
                                                        NSDate look) {
  MutexLock lock(_mutex);
  std::vector<ContentHash> released;
  NSErrorPtr error = _database->transact([&]() SKEIN_NO_THREAD_SAFETY_ANALYSIS -> NSErrorPtr {
    const auto row = _database->prepare(
        "DELETE FROM unreferenced WHERE hash = ?1 AND since < ?2 "
        "AND NOT EXISTS (SELECT 1 FROM records WHERE hash = ?1) RETURNING 1");
    const auto mark = _database->prepare("DELETE FROM given_up WHERE hash = ?");
    for (const ContentHash& hash : contents) {
      row->bindBytes(1, bytesOf(hash)).bind(2, nanoseconds(look));
      bool isReleased = false;
      while (row->step()) isReleased = true;
      if (NSErrorPtr failed = row->error()) return failed;
      row->reset();
      if (!isReleased) continue;
      released.push_back(hash);
      if (NSErrorPtr failed = mark->bindBytes(1, bytesOf(hash)).run()) return failed;
      mark->reset();
    }
    return nullptr;
  });
  if (error != nullptr) return error;
  return released;
}

Outcome<bool> CloudRecords::isKnown(const ContentHash& hash) {
  MutexLock lock(_mutex);
  const auto row = _database->prepare(
      "SELECT EXISTS (SELECT 1 FROM records WHERE hash = ?1) "
      "OR EXISTS (SELECT 1 FROM unreferenced WHERE hash = ?1)");
  if (!row->bindBytes(1, bytesOf(hash)).step()) return row->error();
  return row->integer(0) != 0;
}

NSErrorPtr CloudRecords::addUnknown(const HashedContents& contents, NSDate now) {
  MutexLock lock(_mutex);
  return _database->transact([&]() SKEIN_NO_THREAD_SAFETY_ANALYSIS {
    NSErrorPtr failed = noteGivenUp(contents.hash);
    return failed != nullptr ? failed : noteUnreferenced(contents, now);
  });
}

NSErrorPtr CloudRecords::adopt(const std::vector<HashedContents>& contents, NSDate now) {
  MutexLock lock(_mutex);
  return _database->transact([&]() SKEIN_NO_THREAD_SAFETY_ANALYSIS -> NSErrorPtr {
    for (const HashedContents& one : contents) {
      if (NSErrorPtr failed = noteGivenUp(one.hash)) return failed;
      if (NSErrorPtr failed = noteUnreferenced(one, now)) return failed;
    }
    return writeSetting(kAdopted, 1);
  });
}

Outcome<bool> CloudRecords::hasAdopted() {
  MutexLock lock(_mutex);
  const auto value = setting(kAdopted, 0);
  return value ? Outcome<bool>(*value != 0) : value.error();
}

Outcome<CloudRecords::Kept> CloudRecords::kept() {
  MutexLock lock(_mutex);
  const auto sum = _database->prepare(
      "SELECT COUNT(*), COALESCE(SUM(size), 0), "
      "COALESCE(SUM(size) FILTER (WHERE hash IN (SELECT hash FROM given_up)), 0) "
      "FROM unreferenced");
  if (!sum->step()) return sum->error();
  return Kept{static_cast<std::uint64_t>(sum->integer(0)),
              static_cast<std::uint64_t>(sum->integer(1)),
              static_cast<std::uint64_t>(sum->integer(2))};
}

Outcome<CloudRecords::Keeping> CloudRecords::keeping() {
  MutexLock lock(_mutex);
  const auto days = setting(kDays, Keeping().days);
  if (!days) return days.error();
  const auto percent = setting(kPercent, Keeping().percent);
  if (!percent) return percent.error();
  return Keeping{static_cast<std::uint32_t>(*days), static_cast<std::uint32_t>(*percent)};
}

NSErrorPtr CloudRecords::setKeeping(const Keeping& keeping) {
  MutexLock lock(_mutex);
  return _database->transact([&]() SKEIN_NO_THREAD_SAFETY_ANALYSIS {
    NSErrorPtr failed = writeSetting(kDays, keeping.days);
    return failed != nullptr ? failed : writeSetting(kPercent, keeping.percent);
  });
}

Outcome<std::int64_t> CloudRecords::setting(const char* name, std::int64_t unset) {
  const auto row = _database->prepare("SELECT value FROM settings WHERE name = ?");
  const bool found = row->bind(1, std::string_view(name)).step();
  if (NSErrorPtr error = row->error()) return error;
  return found ? row->integer(0) : unset;
}

NSErrorPtr CloudRecords::writeSetting(const char* name, std::int64_t value) {
  return _database->prepare("INSERT OR REPLACE INTO settings VALUES(?, ?)")
      ->bind(1, std::string_view(name))
      .bind(2, value)
      .run();
}

std::uint64_t CloudRecords::usedBytes() {
  MutexLock lock(_mutex);
  return _usedBytes;
}

Outcome<std::optional<UploadStamp>> CloudRecords::stamp(VLFileObjectID document) {
  MutexLock lock(_mutex);
  const auto row =
      _database->prepare("SELECT size, modified, changed, inode FROM stamps WHERE document = ?");
  const bool found = row->bind(1, key(document)).step();
  if (NSErrorPtr error = row->error()) return error;
  if (!found) return std::optional<UploadStamp>();
  return std::optional(UploadStamp{static_cast<std::uint64_t>(row->integer(0)),
                                   date(row->integer(1)), date(row->integer(2)),
                                   static_cast<std::uint64_t>(row->integer(3))});
}

NSErrorPtr CloudRecords::setStamp(VLFileObjectID document,
                                  const std::optional<UploadStamp>& stamp) {
  MutexLock lock(_mutex);
  return _database->withoutWaiting(
      [&]() SKEIN_NO_THREAD_SAFETY_ANALYSIS { return writeStamp(document, stamp); });
}

NSErrorPtr CloudRecords::writeStamp(VLFileObjectID document,
                                    const std::optional<UploadStamp>& stamp) {
  if (!stamp) {
    return _database->prepare("DELETE FROM stamps WHERE document = ?")
        ->bind(1, key(document))
        .run();
  }
  return _database->prepare("INSERT OR REPLACE INTO stamps VALUES(?, ?, ?, ?, ?)")
      ->bind(1, key(document))
      .bind(2, static_cast<std::int64_t>(stamp->size))
      .bind(3, nanoseconds(stamp->modified))
      .bind(4, nanoseconds(stamp->changed))
      .bind(5, static_cast<std::int64_t>(stamp->inode))
      .run();
}

NSErrorPtr CloudRecords::setPinned(VLFileObjectID document, bool pinned) {
  MutexLock lock(_mutex);
  return _database
      ->prepare(pinned ? "INSERT OR REPLACE INTO pins VALUES(?)"
                       : "DELETE FROM pins WHERE document = ?")
      ->bind(1, key(document))
      .run();
}

Outcome<bool> CloudRecords::isPinned(VLFileObjectID document) {
  MutexLock lock(_mutex);
  const auto row = _database->prepare("SELECT 1 FROM pins WHERE document = ?");
  const bool pinned = row->bind(1, key(document)).step();
  if (NSErrorPtr error = row->error()) return error;
  return pinned;
}

Outcome<CloudRecords::Work> CloudRecords::beginWork(Work work) {
  MutexLock lock(_mutex);
  // An eviction makes room.
  NSErrorPtr error = _database->transactWithReserve([&]() SKEIN_NO_THREAD_SAFETY_ANALYSIS {
    NSErrorPtr failed = noteGivenUp(work.contents);
    if (failed != nullptr) return failed;
    return _database->prepare("INSERT INTO work(path, folder, hash) VALUES(?, ?, ?)")
        ->bindBytes(1, work.path)
        .bind(2, static_cast<std::int64_t>(work.folder))
        .bindBytes(3, bytesOf(work.contents))
        .run();
  });
  if (error != nullptr) return error;
  work.number = _database->lastInsertedRow();
  return work;
}

NSErrorPtr CloudRecords::endWork(const Work& work) {
  MutexLock lock(_mutex);
  return _database->withoutWaiting([&]() SKEIN_NO_THREAD_SAFETY_ANALYSIS {
    return _database->prepare("DELETE FROM work WHERE number = ?")->bind(1, work.number).run();
  });
}

Outcome<std::vector<CloudRecords::Work>> CloudRecords::unfinishedWork() {
  MutexLock lock(_mutex);
  std::vector<Work> works;
  const auto row =
      _database->prepare("SELECT number, path, folder, hash FROM work ORDER BY number");
  while (row->step())
    works.push_back({row->integer(0), row->text(1), static_cast<std::uint64_t>(row->integer(2)),
                     hashOf(row->text(3))});
  if (NSErrorPtr error = row->error()) return error;
  return works;
}

}  // namespace skein::vald
