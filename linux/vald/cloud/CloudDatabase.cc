#include "linux/vald/cloud/CloudDatabase.h"

#include <sqlite3.h>

#include <cerrno>
#include <string>

#include "linux/vald/files/DatabaseFile.h"
#include "linux/vald/files/FileErrors.h"
#include "vellum/VLErrors.h"

namespace skein::vald {
namespace {

// The domain of SQLite's own codes, which say more than any POSIX code would.
constexpr char kDatabaseErrorDomain[] = "SkeinDatabaseErrorDomain";

// What is written when something is removed or given up; a few of these are enough.
constexpr off_t kReserve = off_t{512} << 10;
constexpr off_t kReservedPart = off_t{128} << 10;

NSErrorPtr databaseError(sqlite3* database) {
  if (sqlite3_errcode(database) == SQLITE_FULL) {
    return fileError(ENOSPC, "can't write", sqlite3_db_filename(database, "main"));
  }
  return NSError::errorWithDomain(
      kDatabaseErrorDomain, sqlite3_extended_errcode(database),
      {{NSLocalizedDescriptionKey,
        std::string("The cloud's records failed: ") + sqlite3_errmsg(database) + "."}});
}

}  // namespace

CloudStatement::CloudStatement(sqlite3* database, std::string_view sql) : _database(database) {
  if (sqlite3_prepare_v2(database, sql.data(), static_cast<int>(sql.size()), &_statement,
                         nullptr) != SQLITE_OK) {
    fail();
  }
}

CloudStatement::~CloudStatement() { sqlite3_finalize(_statement); }

void CloudStatement::fail() {
  if (_error == nullptr) _error = databaseError(_database);
}

CloudStatement& CloudStatement::bind(int position, std::int64_t value) {
  if (_error == nullptr && sqlite3_bind_int64(_statement, position, value) != SQLITE_OK) fail();
  return *this;
}

CloudStatement& CloudStatement::bind(int position, std::string_view text) {
  if (_error == nullptr && sqlite3_bind_text64(_statement, position, text.data(), text.size(),
                                               SQLITE_TRANSIENT, SQLITE_UTF8) != SQLITE_OK) {
    fail();
  }
  return *this;
}

CloudStatement& CloudStatement::bindBytes(int position, std::string_view bytes) {
  if (_error == nullptr && sqlite3_bind_blob64(_statement, position, bytes.data(), bytes.size(),
                                               SQLITE_TRANSIENT) != SQLITE_OK) {
    fail();
  }
  return *this;
}

bool CloudStatement::step() {
  if (_error != nullptr) return false;
  const int code = sqlite3_step(_statement);
  if (code != SQLITE_ROW && code != SQLITE_DONE) fail();
  return code == SQLITE_ROW;
}

void CloudStatement::reset() {
  sqlite3_reset(_statement);
  sqlite3_clear_bindings(_statement);
}

NSErrorPtr CloudStatement::run() {
  while (step()) {
  }
  return _error;
}

std::int64_t CloudStatement::integer(int column) const {
  return sqlite3_column_int64(_statement, column);
}

std::string CloudStatement::text(int column) const {
  const auto* bytes = static_cast<const char*>(sqlite3_column_blob(_statement, column));
  const int size = sqlite3_column_bytes(_statement, column);
  return bytes == nullptr ? std::string() : std::string(bytes, static_cast<std::size_t>(size));
}

bool CloudStatement::isNull(int column) const {
  return sqlite3_column_type(_statement, column) == SQLITE_NULL;
}

Outcome<std::unique_ptr<CloudDatabase>> CloudDatabase::open(
    const std::string& path, std::initializer_list<const char*> schemas) {
  makeDatabasePrivate(path);
  sqlite3* handle = nullptr;
  const int code =
      sqlite3_open_v2(path.c_str(), &handle,
                      SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE | SQLITE_OPEN_NOFOLLOW, nullptr);
  std::unique_ptr<CloudDatabase> database(new CloudDatabase(handle, path));
  if (code != SQLITE_OK) return databaseError(handle);
  sqlite3_busy_timeout(handle, 5000);
  // Nobody else reads it, and what several would share takes room on the disk when it is opened.
  NSErrorPtr failed = database->withReserve([&] {
    return database->execute(
        "PRAGMA locking_mode=EXCLUSIVE; PRAGMA journal_mode=WAL; PRAGMA synchronous=FULL;");
  });
  if (failed != nullptr) return failed;
  const auto version = database->prepare("PRAGMA user_version");
  if (!version->step()) return version->error();
  const auto seen = version->integer(0);
  version->run();
  const auto newest = static_cast<std::int64_t>(schemas.size());
  if (seen > newest) {
    return NSError::errorWithDomain(
        kDatabaseErrorDomain, SQLITE_SCHEMA,
        {{NSLocalizedDescriptionKey,
          "The cloud's records in " + path + " were made by a newer version of this program."}});
  }
  for (auto step = seen; step < newest; ++step) {
    NSErrorPtr error = database->transactWithReserve([&] {
      const std::string next = "PRAGMA user_version=" + std::to_string(step + 1);
      NSErrorPtr refused = database->execute(schemas.begin()[step]);
      return refused != nullptr ? refused : database->execute(next.c_str());
    });
    if (error != nullptr) return error;
  }
  return database;
}

CloudDatabase::CloudDatabase(sqlite3* database, const std::string& path)
    : _database(database), _reserve(path + "-reserve", kReserve, kReservedPart) {}

CloudDatabase::~CloudDatabase() { sqlite3_close(_database); }

std::unique_ptr<CloudStatement> CloudDatabase::prepare(std::string_view sql) {
  return std::make_unique<CloudStatement>(_database, sql);
}

NSErrorPtr CloudDatabase::transact(const std::function<NSErrorPtr()>& body) {
  if (!_usesReserve) _reserve.take();
  if (NSErrorPtr error = execute("BEGIN IMMEDIATE")) return error;
  NSErrorPtr error = body();
  if (error == nullptr) error = execute("COMMIT");
  if (error != nullptr) execute("ROLLBACK");
  return error;
}

NSErrorPtr CloudDatabase::withReserve(const std::function<NSErrorPtr()>& body) {
  // What is given up here is not taken again at once.
  _usesReserve = true;
  NSErrorPtr error = body();
  while (error != nullptr && error->code() == NSFileWriteOutOfSpaceError && _reserve.giveUp()) {
    error = body();
  }
  _usesReserve = false;
  return error;
}

NSErrorPtr CloudDatabase::transactWithReserve(const std::function<NSErrorPtr()>& body) {
  return withReserve([&] { return transact(body); });
}

NSErrorPtr CloudDatabase::withoutWaiting(const std::function<NSErrorPtr()>& body) {
  if (NSErrorPtr error = execute("PRAGMA synchronous=NORMAL")) return error;
  NSErrorPtr error = body();
  NSErrorPtr restored = execute("PRAGMA synchronous=FULL");
  return error != nullptr ? error : restored;
}

NSErrorPtr CloudDatabase::execute(const char* sql) {
  return sqlite3_exec(_database, sql, nullptr, nullptr, nullptr) == SQLITE_OK
             ? nullptr
             : databaseError(_database);
}

std::int64_t CloudDatabase::lastInsertedRow() const { return sqlite3_last_insert_rowid(_database); }

}  // namespace skein::vald
