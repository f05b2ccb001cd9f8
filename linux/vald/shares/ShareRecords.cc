#include "linux/vald/shares/ShareRecords.h"

#include <string_view>
#include <utility>

#include "linux/vald/RandomToken.h"
#include "vellum/VLErrors.h"

namespace skein::vald {
namespace {

// Items by the string form of their identifiers.
constexpr char kSchema1[] = R"sql(
  CREATE TABLE shares(
    item TEXT PRIMARY KEY, owner TEXT NOT NULL, url TEXT NOT NULL, token TEXT NOT NULL,
    public_permission INTEGER NOT NULL);
  CREATE UNIQUE INDEX shares_by_url ON shares(url);
  CREATE TABLE share_values(
    item TEXT NOT NULL, key TEXT NOT NULL, value TEXT NOT NULL, PRIMARY KEY(item, key));
  CREATE TABLE participants(
    item TEXT NOT NULL, position INTEGER NOT NULL, name TEXT NOT NULL, role INTEGER NOT NULL,
    acceptance INTEGER NOT NULL, permission INTEGER NOT NULL, PRIMARY KEY(item, position));
  CREATE TABLE base_tokens(item TEXT PRIMARY KEY, token TEXT NOT NULL);
  CREATE TABLE zones(folder TEXT PRIMARY KEY, zone TEXT NOT NULL, owner TEXT NOT NULL);
  CREATE TABLE untold(item TEXT PRIMARY KEY);
)sql";

constexpr char kColumns[] = "SELECT item, owner, url, token, public_permission FROM shares ";

NSErrorPtr unreadable(const std::string& item) {
  return NSError::errorWithDomain(
      NSCocoaErrorDomain, NSFileWriteUnknownError,
      {{NSLocalizedDescriptionKey,
        "The shares are damaged: \"" + item + "\" is no identifier of an item."}});
}

template <class Code>
Code code(std::int64_t number, Code last) {
  return number >= 0 && number <= static_cast<std::int64_t>(last) ? static_cast<Code>(number)
                                                                  : Code::Unknown;
}

}  // namespace

Outcome<std::unique_ptr<ShareRecords>> ShareRecords::open(const std::string& path) {
  auto database = CloudDatabase::open(path, {kSchema1});
  if (!database) return database.error();
  return std::unique_ptr<ShareRecords>(new ShareRecords(std::move(*database)));
}

// ---- shares

Outcome<ShareRecord> ShareRecords::read(CloudStatement& row) {
  ShareRecord record;
  const std::string item = row.text(0);
  const auto id = VLFileObjectID::fileObjectIDWithString(item);
  if (!id) return unreadable(item);
  record.item = *id;
  record.ownerName = row.text(1);
  record.shareToken = row.text(3);
  CKShare& share = record.share;
  share.rootRecordName = item;
  share.isKnownToServer = true;
  share.url = NSURL::URLWithString(row.text(2));
  share.publicPermission = row.integer(4);

  const auto values = _database->prepare("SELECT key, value FROM share_values WHERE item = ?");
  values->bind(1, std::string_view(item));
  while (values->step()) share.values.emplace(values->text(0), values->text(1));
  if (NSErrorPtr error = values->error()) return error;

  const auto people = _database->prepare(
      "SELECT name, role, acceptance, permission FROM participants WHERE item = ? "
      "ORDER BY position");
  people->bind(1, std::string_view(item));
  while (people->step()) {
    share.participants.push_back(
        {people->text(0), code(people->integer(1), CKShareParticipantRole::PublicUser),
         code(people->integer(2), CKShareParticipantAcceptanceStatus::Removed),
         people->integer(3)});
  }
  if (NSErrorPtr error = people->error()) return error;
  return record;
}

Outcome<std::optional<ShareRecord>> ShareRecords::share(VLFileObjectID item) {
  MutexLock lock(_mutex);
  const auto row = _database->prepare(std::string(kColumns) + "WHERE item = ?");
  const bool found = row->bind(1, std::string_view(item.asString())).step();
  if (NSErrorPtr error = row->error()) return error;
  if (!found) return std::optional<ShareRecord>();
  auto record = read(*row);
  if (!record) return record.error();
  return std::optional(std::move(*record));
}

Outcome<std::vector<ShareRecord>> ShareRecords::shares() {
  MutexLock lock(_mutex);
  std::vector<ShareRecord> found;
  const auto row = _database->prepare(std::string(kColumns) + "ORDER BY item");
  while (row->step()) {
    auto record = read(*row);
    if (!record) return record.error();
    found.push_back(std::move(*record));
  }
  if (NSErrorPtr error = row->error()) return error;
  return found;
}

Outcome<std::optional<VLFileObjectID>> ShareRecords::itemOfURL(const std::string& url) {
  MutexLock lock(_mutex);
  const auto row = _database->prepare("SELECT item FROM shares WHERE url = ?");
  const bool found = row->bind(1, std::string_view(url)).step();
  if (NSErrorPtr error = row->error()) return error;
  return found ? VLFileObjectID::fileObjectIDWithString(row->text(0)) : std::nullopt;
}

NSErrorPtr ShareRecords::run(const char* sql, VLFileObjectID item) {
  return _database->prepare(sql)->bind(1, std::string_view(item.asString())).run();
}

NSErrorPtr ShareRecords::erase(VLFileObjectID item) {
  for (const char* sql :
       {"DELETE FROM shares WHERE item = ?", "DELETE FROM share_values WHERE item = ?",
        "DELETE FROM participants WHERE item = ?", "INSERT OR IGNORE INTO untold VALUES(?)"}) {
    if (NSErrorPtr error = run(sql, item)) return error;
  }
  return nullptr;
}

NSErrorPtr ShareRecords::write(const ShareRecord& record) {
  if (NSErrorPtr error = erase(record.item)) return error;
  const std::string item = record.item.asString();
  const CKShare& share = record.share;
  NSErrorPtr error = _database->prepare("INSERT INTO shares VALUES(?, ?, ?, ?, ?)")
                         ->bind(1, std::string_view(item))
                         .bind(2, std::string_view(record.ownerName))
                         .bind(3, std::string_view(share.url->absoluteString()))
                         .bind(4, std::string_view(record.shareToken))
                         .bind(5, share.publicPermission)
                         .run();
  for (const auto& [key, value] : share.values) {
    if (error != nullptr) return error;
    error = _database->prepare("INSERT INTO share_values VALUES(?, ?, ?)")
                ->bind(1, std::string_view(item))
                .bind(2, std::string_view(key))
                .bind(3, std::string_view(value))
                .run();
  }
  std::int64_t position = 0;
  for (const CKShareParticipant& participant : share.participants) {
    if (error != nullptr) return error;
    error = _database->prepare("INSERT INTO participants VALUES(?, ?, ?, ?, ?, ?)")
                ->bind(1, std::string_view(item))
                .bind(2, position++)
                .bind(3, std::string_view(participant.name))
                .bind(4, static_cast<std::int64_t>(participant.role))
                .bind(5, static_cast<std::int64_t>(participant.acceptanceStatus))
                .bind(6, participant.permission)
                .run();
  }
  return error;
}

NSErrorPtr ShareRecords::put(const ShareRecord& record) {
  MutexLock lock(_mutex);
  return _database->transact([&]() SKEIN_NO_THREAD_SAFETY_ANALYSIS { return write(record); });
}

NSErrorPtr ShareRecords::remove(VLFileObjectID item) {
  MutexLock lock(_mutex);
  return _database->transact([&]() SKEIN_NO_THREAD_SAFETY_ANALYSIS { return erase(item); });
}

// ---- tokens

Outcome<std::string> ShareRecords::baseToken(VLFileObjectID item) {
  MutexLock lock(_mutex);
  const std::string key = item.asString();
  const auto row = _database->prepare("SELECT token FROM base_tokens WHERE item = ?");
  const bool found = row->bind(1, std::string_view(key)).step();
  if (NSErrorPtr error = row->error()) return error;
  if (found) return row->text(0);
  std::string token = randomToken();
  NSErrorPtr error = _database->prepare("INSERT INTO base_tokens VALUES(?, ?)")
                         ->bind(1, std::string_view(key))
                         .bind(2, std::string_view(token))
                         .run();
  if (error != nullptr) return error;
  return token;
}

// ---- zones

Outcome<std::vector<ZoneRecord>> ShareRecords::zones() {
  MutexLock lock(_mutex);
  std::vector<ZoneRecord> zones;
  const auto row = _database->prepare("SELECT folder, zone, owner FROM zones ORDER BY folder");
  while (row->step()) {
    const auto folder = VLFileObjectID::fileObjectIDWithString(row->text(0));
    if (!folder) return unreadable(row->text(0));
    zones.push_back({*folder, {row->text(1), row->text(2)}});
  }
  if (NSErrorPtr error = row->error()) return error;
  return zones;
}

NSErrorPtr ShareRecords::putZone(const ZoneRecord& zone, const ShareRecord& share) {
  MutexLock lock(_mutex);
  return _database->transact([&]() SKEIN_NO_THREAD_SAFETY_ANALYSIS {
    NSErrorPtr error = _database->prepare("INSERT OR REPLACE INTO zones VALUES(?, ?, ?)")
                           ->bind(1, std::string_view(zone.folder.asString()))
                           .bind(2, std::string_view(zone.zone.zoneName))
                           .bind(3, std::string_view(zone.zone.ownerName))
                           .run();
    return error != nullptr ? error : write(share);
  });
}

NSErrorPtr ShareRecords::removeZone(VLFileObjectID folder) {
  MutexLock lock(_mutex);
  return _database->transact([&]() SKEIN_NO_THREAD_SAFETY_ANALYSIS {
    NSErrorPtr error = run("DELETE FROM zones WHERE folder = ?", folder);
    return error != nullptr ? error : erase(folder);
  });
}

// ---- what the store has yet to tell

Outcome<std::vector<VLFileObjectID>> ShareRecords::untold() {
  MutexLock lock(_mutex);
  std::vector<VLFileObjectID> items;
  const auto row = _database->prepare("SELECT item FROM untold ORDER BY item");
  while (row->step()) {
    const auto item = VLFileObjectID::fileObjectIDWithString(row->text(0));
    if (!item) return unreadable(row->text(0));
    items.push_back(*item);
  }
  if (NSErrorPtr error = row->error()) return error;
  return items;
}

NSErrorPtr ShareRecords::didTell(VLFileObjectID item) {
  MutexLock lock(_mutex);
  // A power cut may lose it: the item is then told of once more.
  return _database->withoutWaiting([&]() SKEIN_NO_THREAD_SAFETY_ANALYSIS {
    return run("DELETE FROM untold WHERE item = ?", item);
  });
}

}  // namespace skein::vald
