#pragma once

#include <cstdint>
#include <functional>
#include <initializer_list>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "linux/vald/cloud/Outcome.h"
#include "linux/vald/files/DiskReserve.h"

struct sqlite3;
struct sqlite3_stmt;

namespace skein::vald {

// A prepared statement, bound by position from 1 and read by column from 0. The first
// failure sticks: steps after it do nothing. Same thread rule as its database.
class CloudStatement {
 public:
  CloudStatement(sqlite3* database, std::string_view sql);
  ~CloudStatement();
  CloudStatement(const CloudStatement&) = delete;
  CloudStatement& operator=(const CloudStatement&) = delete;

  CloudStatement& bind(int position, std::int64_t value);
  CloudStatement& bind(int position, std::string_view text);
  CloudStatement& bindBytes(int position, std::string_view bytes);
  // What is not bound is NULL.
  template <class T>
  CloudStatement& bind(int position, const std::optional<T>& value) {
    return value ? bind(position, *value) : *this;
  }

  // Whether there is another row.
  bool step();
  // Ready to be bound and stepped again, with nothing bound.
  void reset();
  // Runs a statement that answers no rows; null on success.
  NSErrorPtr run();

  std::int64_t integer(int column) const;
  std::string text(int column) const;
  bool isNull(int column) const;

  // Null unless something failed.
  NSErrorPtr error() const { return _error; }

 private:
  void fail();

  sqlite3* _database;
  sqlite3_stmt* _statement = nullptr;
  NSErrorPtr _error;
};

// The one connection to an SQLite file: WAL, durable at each commit. One thread at a time.
class CloudDatabase {
 public:
  // `schemas` are the steps from one version to the next; those that the file has not seen
  // yet are run, each in a transaction of its own.
  static Outcome<std::unique_ptr<CloudDatabase>> open(const std::string& path,
                                                      std::initializer_list<const char*> schemas);
  ~CloudDatabase();

  std::unique_ptr<CloudStatement> prepare(std::string_view sql);
  // Runs `body` and commits, or undoes all of it when it answers an error.
  NSErrorPtr transact(const std::function<NSErrorPtr()>& body);
  // The same with the room that is kept for this beside the database (`DATABASE-reserve`), where
  // the disk has no other: for what lets go of something.
  NSErrorPtr transactWithReserve(const std::function<NSErrorPtr()>& body);
  NSErrorPtr execute(const char* sql);
  // Runs `body` without waiting for the disk: what it commits is durable with the next
  // commit that is. For what is found again when a power cut loses it.
  NSErrorPtr withoutWaiting(const std::function<NSErrorPtr()>& body);
  std::int64_t lastInsertedRow() const;

 private:
  CloudDatabase(sqlite3* database, const std::string& path);
  NSErrorPtr withReserve(const std::function<NSErrorPtr()>& body);

  sqlite3* const _database;
  DiskReserve _reserve;
  bool _usesReserve = false;
};

}  // namespace skein::vald
