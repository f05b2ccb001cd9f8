#pragma once

#include <sqlite3.h>

#include <concepts>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

namespace skein::vald {

// One connection to a SQLite database, for one thread at a time. The first failure is
// latched: from then on statements deliver nothing and commit() rolls back, so that a
// caller may ask once, at the end.
class SqliteDatabase {
 public:
  // Null when the file cannot be opened; `code` and `message` say why.
  static std::unique_ptr<SqliteDatabase> open(const std::string& path, bool writable, int& code,
                                              std::string& message);
  ~SqliteDatabase();
  SqliteDatabase(const SqliteDatabase&) = delete;
  SqliteDatabase& operator=(const SqliteDatabase&) = delete;

  // Runs statements without results; false when one failed.
  bool execute(const char* sql);
  // The first column of the first row; 0 without one.
  std::int64_t integer(const char* sql);

  // A transaction that writes; and one that only reads, of one moment.
  bool begin() { return run(_begin, "BEGIN IMMEDIATE"); }
  bool beginReading() { return run(_beginReading, "BEGIN"); }
  bool commit();
  void rollback();

  // How many rows this connection has written so far.
  std::int64_t written() const { return sqlite3_total_changes64(_handle); }

  bool failed() const { return _code != SQLITE_OK; }
  int code() const { return _code; }
  const std::string& message() const { return _message; }
  void clearFailure() { _code = SQLITE_OK; }
  void latchFailure();

  sqlite3* handle() { return _handle; }

 private:
  explicit SqliteDatabase(sqlite3* handle) : _handle(handle) {}
  // Runs what is run again and again; prepared when it is first.
  bool run(sqlite3_stmt*& statement, const char* sql);

  sqlite3* _handle;
  sqlite3_stmt* _begin = nullptr;
  sqlite3_stmt* _beginReading = nullptr;
  sqlite3_stmt* _commit = nullptr;
  int _code = SQLITE_OK;
  std::string _message;
};

// A prepared statement. What is bound must live until the statement ran to its end, was
// started again or reset.
class SqliteStatement {
 public:
  SqliteStatement(SqliteDatabase& database, const char* sql);
  ~SqliteStatement() { sqlite3_finalize(_statement); }
  SqliteStatement(const SqliteStatement&) = delete;
  SqliteStatement& operator=(const SqliteStatement&) = delete;

  // Begins anew with these parameters: integers, names (as blobs), nullopt.
  template <class... Args>
  SqliteStatement& start(const Args&... args) {
    sqlite3_reset(_statement);
    int index = 0;
    (bind(++index, args), ...);
    return *this;
  }
  // Whether there is another row.
  bool step();
  // Runs to the end; false when it failed.
  bool run();
  void reset() { sqlite3_reset(_statement); }

  std::int64_t integer(int column) { return sqlite3_column_int64(_statement, column); }
  std::uint64_t number(int column) { return static_cast<std::uint64_t>(integer(column)); }
  bool isNull(int column) { return sqlite3_column_type(_statement, column) == SQLITE_NULL; }
  // Valid until the next step.
  std::string_view bytes(int column);

 private:
  void bind(int index, std::integral auto value) {
    sqlite3_bind_int64(_statement, index, static_cast<sqlite3_int64>(value));
  }
  void bind(int index, std::string_view value) {
    // An empty view may have no address, which would bind NULL.
    sqlite3_bind_blob64(_statement, index, value.empty() ? "" : value.data(), value.size(),
                        SQLITE_STATIC);
  }
  void bind(int index, std::nullopt_t) { sqlite3_bind_null(_statement, index); }
  template <class T>
  void bind(int index, const std::optional<T>& value) {
    value ? bind(index, *value) : bind(index, std::nullopt);
  }
  void bind(int index, const std::string& value) { bind(index, std::string_view(value)); }

  SqliteDatabase& _database;
  sqlite3_stmt* _statement = nullptr;
};

}  // namespace skein::vald
