#include "linux/vald/index/IndexFile.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <ctime>
#include <fstream>
#include <string_view>

#include "linux/protocol/FileDescriptor.h"
#include "linux/vald/RandomToken.h"
#include "linux/vald/files/DatabaseFile.h"
#include "vellum/VLErrors.h"

namespace skein::vald {
namespace {

constexpr int kApplicationID = 0x534b4e49;  // "SKNI"
constexpr int kVersion = 2;
constexpr std::string_view kOpenMark = "open since";
// How many that could not be used are kept.
constexpr std::size_t kMostAside = 3;

constexpr const char* kParts[] = {"", "-wal", "-shm"};

constexpr char kTables[] = R"(
PRAGMA page_size = 8192;
PRAGMA journal_mode = WAL;
BEGIN IMMEDIATE;
CREATE TABLE item (
  rank INTEGER PRIMARY KEY,
  parent INTEGER NOT NULL,
  name BLOB NOT NULL,
  id INTEGER NOT NULL,
  kind INTEGER NOT NULL,
  inode INTEGER NOT NULL,
  generation INTEGER NOT NULL,
  size INTEGER NOT NULL,
  age INTEGER NOT NULL,      -- the modification date, negated
  changed INTEGER NOT NULL,  -- modification less change
  born INTEGER NOT NULL,     -- modification less birth
  seen INTEGER NOT NULL,
  folder INTEGER NOT NULL,
  container BLOB,
  flags INTEGER NOT NULL DEFAULT 0
);
CREATE INDEX item_by_name ON item(parent, name);
CREATE TABLE folder (
  key INTEGER PRIMARY KEY,
  id INTEGER NOT NULL,
  parent INTEGER NOT NULL,
  name BLOB NOT NULL,
  scanned INTEGER NOT NULL,
  children INTEGER NOT NULL,
  changes INTEGER NOT NULL,  -- not used any more
  inode INTEGER NOT NULL,
  generation INTEGER NOT NULL,
  born INTEGER NOT NULL
);
CREATE INDEX folder_by_id ON folder(id);
CREATE TABLE root (
  folder INTEGER PRIMARY KEY,
  container BLOB,
  path BLOB NOT NULL,
  inode INTEGER NOT NULL,
  generation INTEGER NOT NULL
);
CREATE TABLE tombstone (
  rank INTEGER PRIMARY KEY,
  id INTEGER NOT NULL,
  kind INTEGER NOT NULL,
  holder INTEGER NOT NULL,
  parent INTEGER NOT NULL,
  name BLOB NOT NULL,
  inode INTEGER NOT NULL,
  generation INTEGER NOT NULL,
  born INTEGER NOT NULL,
  died INTEGER NOT NULL
);
CREATE INDEX tombstone_by_inode ON tombstone(inode);
CREATE INDEX tombstone_by_name ON tombstone(parent, name);
CREATE TABLE setting (name BLOB PRIMARY KEY, value BLOB NOT NULL) WITHOUT ROWID;
COMMIT;
)";

constexpr char kDetailTables[] = R"(
BEGIN IMMEDIATE;
CREATE TABLE detail (
  id INTEGER NOT NULL,
  is_document INTEGER NOT NULL,
  tags BLOB NOT NULL,
  on_file INTEGER NOT NULL,
  created INTEGER,
  used INTEGER,
  favorite INTEGER,
  PRIMARY KEY (id, is_document)
) WITHOUT ROWID;
CREATE TABLE tag (
  name BLOB NOT NULL,
  id INTEGER NOT NULL,
  is_document INTEGER NOT NULL,
  PRIMARY KEY (name, id, is_document)
) WITHOUT ROWID;
COMMIT;
)";

// An index of version 1 knew nothing but what the disk tells.
constexpr char kFromVersion1[] =
    "ALTER TABLE item ADD COLUMN flags INTEGER NOT NULL DEFAULT 0; PRAGMA user_version = 2";

enum class Verdict { Usable, Empty, Foreign };

Verdict judge(SqliteDatabase& database) {
  if (database.integer("SELECT count(*) FROM sqlite_schema") == 0 && !database.failed()) {
    return Verdict::Empty;
  }
  bool ours = database.integer("PRAGMA application_id") == kApplicationID;
  const std::int64_t version = database.integer("PRAGMA user_version");
  if (ours && version == 1) {
    ours = database.execute(kDetailTables) && database.execute(kFromVersion1);
  } else {
    ours = ours && version == kVersion;
  }
  // Touches every table's first page.
  for (const char* sql : {"SELECT count(*) FROM root", "SELECT max(rank) FROM item",
                          "SELECT max(rank) FROM tombstone", "SELECT max(key) FROM folder",
                          "SELECT count(*) FROM setting", "SELECT max(id) FROM detail"}) {
    if (ours) database.integer(sql);
  }
  return ours && !database.failed() ? Verdict::Usable : Verdict::Foreign;
}

std::string damageMark(const std::string& path) { return path + ".damaged"; }

// Another after each start of the machine.
std::string startOfMachine() {
  std::string start;
  std::getline(std::ifstream("/proc/sys/kernel/random/boot_id"), start);
  // Where it cannot be read, no two openings are of the same.
  return start.empty() ? randomToken() : start;
}

std::string openMark(SqliteDatabase& database) {
  SqliteStatement mark(database, "SELECT value FROM setting WHERE name=?");
  return mark.start(kOpenMark).step() ? std::string(mark.bytes(0)) : std::string();
}

void runDurably(SqliteDatabase& database, SqliteStatement& statement) {
  database.execute("PRAGMA synchronous = FULL");
  statement.run();
  database.execute("PRAGMA synchronous = NORMAL");
}

}  // namespace

bool indexLacksRoom(SqliteDatabase& database) {
  // What its connections share is a file as well.
  return database.code() == SQLITE_FULL ||
         sqlite3_extended_errcode(database.handle()) == SQLITE_IOERR_SHMSIZE;
}

bool setIndexFileAside(const std::string& path, const std::string& suffix) {
  bool moved = true;
  for (const char* part : kParts) {
    const std::string from = path + part;
    if (std::rename(from.c_str(), (path + suffix + part).c_str()) != 0 && errno != ENOENT) {
      moved = false;
    }
  }
  return moved;
}

bool takeIndexFileBack(const std::string& path, const std::string& suffix) {
  if (::access((path + suffix).c_str(), F_OK) != 0) return false;
  bool moved = true;
  for (const char* part : kParts) {
    const std::string from = path + suffix + part;
    if (std::rename(from.c_str(), (path + part).c_str()) != 0 && errno != ENOENT) moved = false;
  }
  return moved;
}

void markIndexFileDamaged(const std::string& path) {
  FileDescriptor mark(::open(damageMark(path).c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600));
}

std::unique_ptr<SqliteDatabase> openIndexFile(const std::string& path, Log& log, NSErrorOut error) {
  std::string reason;
  bool setAside = ::access(damageMark(path).c_str(), F_OK) == 0;
  if (setAside) reason = "it was found damaged while it was used";
  for (int attempt = 0; attempt < 2; ++attempt) {
    if (setAside) {
      const std::string suffix = ".set-aside-" + std::to_string(std::time(nullptr));
      VL_ERROR(log,
               "[ERROR] the index %@ cannot be used (%@); it is kept as %@ and a new one is made",
               path, reason, path + suffix);
      if (!setIndexFileAside(path, suffix)) {
        error.store(vl_errorWithPOSIXCode(
            errno,
            "The unusable index " + path + " could not be renamed; move it away and start again."));
        return nullptr;
      }
      ::unlink(damageMark(path).c_str());
      pruneSetAside(path, ".set-aside-", kMostAside);
    }
    int code = 0;
    auto database = SqliteDatabase::open(path, true, code, reason);
    if (!database) {
      error.store(vl_errorWithPOSIXCode(
          EIO, "The index " + path + " could not be opened: " + reason +
                   ". Check that its folder exists, is writable and has space left."));
      return nullptr;
    }
    const Verdict verdict = judge(*database);
    if (verdict == Verdict::Empty) {
      database->execute(kTables);
      database->execute(kDetailTables);
      const std::string marks = "PRAGMA application_id = " + std::to_string(kApplicationID) +
                                "; PRAGMA user_version = " + std::to_string(kVersion);
      database->execute(marks.c_str());
    }
    if (verdict != Verdict::Foreign && database->execute("PRAGMA journal_mode = WAL;"
                                                         "PRAGMA synchronous = NORMAL;"
                                                         "PRAGMA threads = 1;"
                                                         "PRAGMA temp_store = MEMORY;"
                                                         "PRAGMA cache_size = -32768")) {
      return database;
    }
    reason = database->failed() ? database->message() : "it is of another program or version";
    const int failure = database->code();
    if (verdict == Verdict::Empty || failure == SQLITE_FULL || failure == SQLITE_BUSY ||
        failure == SQLITE_READONLY || failure == SQLITE_CANTOPEN || failure == SQLITE_IOERR) {
      error.store(
          vl_errorWithPOSIXCode(indexLacksRoom(*database) ? ENOSPC : EIO,
                                "The index " + path + " could not be used: " + reason + "."));
      return nullptr;
    }
    setAside = true;
  }
  error.store(vl_errorWithPOSIXCode(EIO, "The index " + path + " could not be made anew."));
  return nullptr;
}

bool mayIndexLackCommits(SqliteDatabase& database) {
  const std::string mark = openMark(database);
  return !mark.empty() && mark != startOfMachine();
}

void markIndexOpen(SqliteDatabase& database) {
  const std::string start = startOfMachine();
  if (openMark(database) == start) return;
  SqliteStatement put(database, "INSERT OR REPLACE INTO setting(name, value) VALUES(?,?)");
  runDurably(database, put.start(kOpenMark, start));
}

void markIndexClosed(SqliteDatabase& database) {
  SqliteStatement drop(database, "DELETE FROM setting WHERE name=?");
  runDurably(database, drop.start(kOpenMark));
}

bool hasSecondaryIndexes(SqliteDatabase& database) {
  return database.integer("SELECT count(*) FROM sqlite_schema WHERE name = 'item_by_inode'") > 0;
}

bool buildSecondaryIndexes(SqliteDatabase& database) {
  // The one that is asked for above comes last.
  return database.begin() &&
         database.execute(
             "CREATE INDEX IF NOT EXISTS item_by_age ON item(parent, age, name);"
             "CREATE INDEX IF NOT EXISTS item_by_id ON item(id);"
             "CREATE INDEX IF NOT EXISTS folder_item_by_name ON item(name) WHERE kind = 1;"
             "CREATE INDEX IF NOT EXISTS folder_item_by_age ON item(age, name) WHERE kind = 1;"
             "CREATE INDEX IF NOT EXISTS item_by_inode ON item(inode)") &&
         database.commit();
}

}  // namespace skein::vald
