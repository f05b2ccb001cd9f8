#include "linux/vald/index/Sqlite.h"

#include "linux/vald/files/DatabaseFile.h"

namespace skein::vald {

std::unique_ptr<SqliteDatabase> SqliteDatabase::open(const std::string& path, bool writable,
                                                     int& code, std::string& message) {
  if (writable) makeDatabasePrivate(path);
  sqlite3* handle = nullptr;
  const int flags = SQLITE_OPEN_NOMUTEX |
                    (writable ? SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE : SQLITE_OPEN_READONLY);
  code = sqlite3_open_v2(path.c_str(), &handle, flags, nullptr);
  if (code != SQLITE_OK) {
    message = handle != nullptr ? sqlite3_errmsg(handle) : sqlite3_errstr(code);
    sqlite3_close(handle);
    return nullptr;
  }
  // Readers wait for a checkpoint's short lock rather than fail.
  sqlite3_busy_timeout(handle, 5000);
  // A listing by date reads rows all over a folder: a hundred thousand of them fit.
  if (!writable) sqlite3_exec(handle, "PRAGMA cache_size = -20480", nullptr, nullptr, nullptr);
  return std::unique_ptr<SqliteDatabase>(new SqliteDatabase(handle));
}

SqliteDatabase::~SqliteDatabase() {
  for (sqlite3_stmt* statement : {_begin, _beginReading, _commit}) sqlite3_finalize(statement);
  sqlite3_close_v2(_handle);
}

bool SqliteDatabase::execute(const char* sql) {
  if (failed()) return false;
  if (sqlite3_exec(_handle, sql, nullptr, nullptr, nullptr) != SQLITE_OK) latchFailure();
  return !failed();
}

std::int64_t SqliteDatabase::integer(const char* sql) {
  SqliteStatement statement(*this, sql);
  return statement.step() ? statement.integer(0) : 0;
}

bool SqliteDatabase::run(sqlite3_stmt*& statement, const char* sql) {
  if (failed()) return false;
  if (statement == nullptr && sqlite3_prepare_v3(_handle, sql, -1, SQLITE_PREPARE_PERSISTENT,
                                                 &statement, nullptr) != SQLITE_OK) {
    latchFailure();
    return false;
  }
  if (sqlite3_step(statement) != SQLITE_DONE) latchFailure();
  sqlite3_reset(statement);
  return !failed();
}

bool SqliteDatabase::commit() {
  if (run(_commit, "COMMIT")) return true;
  rollback();
  return false;
}

void SqliteDatabase::rollback() {
  if (sqlite3_get_autocommit(_handle) == 0) {
    sqlite3_exec(_handle, "ROLLBACK", nullptr, nullptr, nullptr);
  }
}

void SqliteDatabase::latchFailure() {
  if (failed()) return;
  _code = sqlite3_errcode(_handle);
  if (_code == SQLITE_OK) _code = SQLITE_ERROR;
  _message = sqlite3_errmsg(_handle);
}

SqliteStatement::SqliteStatement(SqliteDatabase& database, const char* sql) : _database(database) {
  if (sqlite3_prepare_v3(database.handle(), sql, -1, SQLITE_PREPARE_PERSISTENT, &_statement,
                         nullptr) != SQLITE_OK) {
    database.latchFailure();
  }
}

bool SqliteStatement::step() {
  if (_statement == nullptr || _database.failed()) return false;
  const int result = sqlite3_step(_statement);
  if (result == SQLITE_ROW) return true;
  if (result != SQLITE_DONE) _database.latchFailure();
  sqlite3_reset(_statement);
  return false;
}

bool SqliteStatement::run() {
  while (step()) {
  }
  return !_database.failed();
}

std::string_view SqliteStatement::bytes(int column) {
  const auto* data = static_cast<const char*>(sqlite3_column_blob(_statement, column));
  const auto size = static_cast<std::size_t>(sqlite3_column_bytes(_statement, column));
  return data != nullptr ? std::string_view(data, size) : std::string_view();
}

}  // namespace skein::vald
