#include "linux/vald/files/OperationJournal.h"

#include <fcntl.h>
#include <sqlite3.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <iterator>
#include <utility>

#include "linux/vald/files/DatabaseFile.h"
#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"

namespace skein::vald {
namespace {

constexpr int kVersion = 2;
constexpr char kTables[] = R"(
  CREATE TABLE IF NOT EXISTS operation(
    id INTEGER PRIMARY KEY AUTOINCREMENT, kind INTEGER NOT NULL, state INTEGER NOT NULL,
    time INTEGER NOT NULL, origin TEXT NOT NULL, document TEXT NOT NULL, path BLOB NOT NULL,
    destination BLOB NOT NULL, aside BLOB NOT NULL);
  CREATE INDEX IF NOT EXISTS operationPath ON operation(path);
  CREATE INDEX IF NOT EXISTS operationDestination ON operation(destination);
  CREATE INDEX IF NOT EXISTS operationDocument ON operation(document) WHERE document <> '';
  DROP INDEX IF EXISTS operationOpen;
  CREATE INDEX IF NOT EXISTS operationUnended ON operation(state) WHERE state IN (0, 3);
)";
#define SKEIN_COLUMNS "kind, state, time, origin, document, path, destination, aside"
constexpr char kInsert[] =
    "INSERT INTO operation(" SKEIN_COLUMNS ") VALUES(?, 0, ?, ?, ?, ?, ?, ?)";
constexpr std::int64_t kPruneEvery = 256;
constexpr off_t kReserve = off_t{2} << 20;
// For some entries with long paths, and what the index notes of what went.
constexpr off_t kReservedPart = off_t{256} << 10;

void bindText(sqlite3_stmt* statement, int at, const std::string& text) {
  sqlite3_bind_text(statement, at, text.data(), static_cast<int>(text.size()), SQLITE_TRANSIENT);
}
// Paths are bytes.
void bindPath(sqlite3_stmt* statement, int at, const std::string& path) {
  // An empty blob, not NULL, which is what a null pointer would bind.
  sqlite3_bind_blob(statement, at, path.empty() ? "" : path.data(), static_cast<int>(path.size()),
                    SQLITE_TRANSIENT);
}
std::string column(sqlite3_stmt* statement, int at) {
  const auto* bytes = static_cast<const char*>(sqlite3_column_blob(statement, at));
  return bytes == nullptr
             ? std::string()
             : std::string(bytes, static_cast<std::size_t>(sqlite3_column_bytes(statement, at)));
}

// The disk's own words where SQLite has passed them on.
int posixOf(sqlite3* database, int code) {
  switch (code & 0xff) {
    case SQLITE_FULL: return ENOSPC;
    case SQLITE_READONLY: return EROFS;
    case SQLITE_PERM: return EACCES;
    default: {
      const int system = sqlite3_system_errno(database);
      return system != 0 ? system : EIO;
    }
  }
}

// Recovery has nothing to finish of these.
bool isOneStep(const OperationEntry& entry) {
  return entry.kind == OperationKind::CreateFolder || entry.kind == OperationKind::Rename ||
         (entry.kind == OperationKind::Move && !entry.isCopied()) ||
         entry.kind == OperationKind::MakeAlias;
}

}  // namespace

const char* operationName(OperationKind kind) {
  switch (kind) {
    case OperationKind::Import: return "import";
    case OperationKind::CreateFolder: return "create folder";
    case OperationKind::Rename: return "rename";
    case OperationKind::Move: return "move";
    case OperationKind::Remove: return "remove";
    case OperationKind::Trash: return "trash";
    case OperationKind::PutBack: return "put back";
    case OperationKind::MakeAlias: return "make alias";
  }
  return "unknown";
}

std::unique_ptr<OperationJournal> OperationJournal::open(const std::string& databasePath,
                                                         std::uint64_t retention, FileLayer& files,
                                                         NSErrorOut error) {
  const auto refuse = [&](const std::string& why) {
    error.store(fileErrorWithWords(
        NSFileWriteUnknownError, 0,
        "can't open the journal of operations \"" + printable(databasePath) + "\": " + why,
        databasePath));
    return nullptr;
  };
  makeDatabasePrivate(databasePath);
  sqlite3* database = nullptr;
  const int flags = SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE | SQLITE_OPEN_NOMUTEX;
  const int opened = sqlite3_open_v2(databasePath.c_str(), &database, flags, nullptr);
  std::unique_ptr<OperationJournal> journal(
      new OperationJournal(database, databasePath, retention, files));
  if (opened != SQLITE_OK) return refuse(sqlite3_errmsg(database));
  sqlite3_busy_timeout(database, 5000);

  MutexLock lock(journal->_mutex);
  int version = 0;
  // Nobody else reads it, so one lock, taken with the first access, stands for all.
  int code = journal->runWithRoom("PRAGMA locking_mode = EXCLUSIVE; PRAGMA journal_mode = WAL");
  if (code == SQLITE_OK) {
    sqlite3_stmt* statement = nullptr;
    code = sqlite3_prepare_v2(database, "PRAGMA user_version", -1, &statement, nullptr);
    if (code == SQLITE_OK && sqlite3_step(statement) == SQLITE_ROW) {
      version = sqlite3_column_int(statement, 0);
    }
    sqlite3_finalize(statement);
  }
  if (code == SQLITE_OK && version > kVersion) {
    return refuse("it was written by a newer version; update this one");
  }
  if (code == SQLITE_OK) code = journal->runWithRoom(kTables);
  if (code == SQLITE_OK && version != kVersion) {
    // Version 1 deleted what an open removal had set aside: it may be there in part.
    const std::string removal = std::to_string(static_cast<int>(OperationKind::Remove));
    code = journal->run("UPDATE operation SET state = 3 WHERE state = 0 AND kind = " + removal +
                        "; PRAGMA user_version = " + std::to_string(kVersion));
  }
  if (code == SQLITE_OK) code = journal->prepare("BEGIN IMMEDIATE", journal->_beginTransaction);
  if (code == SQLITE_OK) code = journal->prepare("COMMIT", journal->_commit);
  if (code == SQLITE_OK) code = journal->prepare(kInsert, journal->_insert);
  if (code == SQLITE_OK) {
    code = journal->prepare("UPDATE operation SET state = ?1 WHERE id = ?2", journal->_setState);
  }
  if (code != SQLITE_OK) return refuse(sqlite3_errmsg(database));
  journal->_reserve.take();
  return journal;
}

OperationJournal::OperationJournal(sqlite3* database, const std::string& path,
                                   std::uint64_t retention, FileLayer& files)
    : _files(files),
      _retention(retention),
      _database(database),
      _reserve(path + "-reserve", kReserve, kReservedPart) {}

OperationJournal::~OperationJournal() {
  MutexLock lock(_mutex);
  for (const End& end : _unwritten) write(end);
  for (sqlite3_stmt* statement : {_beginTransaction, _commit, _insert, _setState}) {
    sqlite3_finalize(statement);
  }
  sqlite3_close(_database);
}

int OperationJournal::run(const std::string& sql) {
  return sqlite3_exec(_database, sql.c_str(), nullptr, nullptr, nullptr);
}

int OperationJournal::setDurable(bool isDurable) {
  if (isDurable == _isDurable) return SQLITE_OK;
  const int code = run(isDurable ? "PRAGMA synchronous = FULL" : "PRAGMA synchronous = NORMAL");
  if (code == SQLITE_OK) _isDurable = isDurable;
  return code;
}

int OperationJournal::run(sqlite3_stmt* statement) {
  const int code = sqlite3_step(statement);
  sqlite3_reset(statement);
  return code == SQLITE_DONE ? SQLITE_OK : code;
}

int OperationJournal::prepare(const std::string& sql, sqlite3_stmt*& statement) {
  return sqlite3_prepare_v3(_database, sql.c_str(), -1, SQLITE_PREPARE_PERSISTENT, &statement,
                            nullptr);
}

NSErrorPtr OperationJournal::failure(const char* doing, int code) {
  const int posix = posixOf(_database, code);
  const std::int64_t cocoa = posix == ENOSPC   ? NSFileWriteOutOfSpaceError
                             : posix == EROFS  ? NSFileWriteVolumeReadOnlyError
                             : posix == EACCES ? NSFileWriteNoPermissionError
                                               : NSFileWriteUnknownError;
  return fileErrorWithWords(cocoa, posix,
                            std::string(doing) + " the journal of operations: " +
                                sqlite3_errmsg(_database) + "; nothing was changed",
                            {});
}

int OperationJournal::insert(OperationEntry& entry) {
  sqlite3_bind_int(_insert, 1, static_cast<int>(entry.kind));
  sqlite3_bind_int64(_insert, 2, entry.when.time_since_epoch().count());
  bindText(_insert, 3, entry.origin);
  bindText(_insert, 4, entry.document);
  bindPath(_insert, 5, entry.path);
  bindPath(_insert, 6, entry.destination);
  bindPath(_insert, 7, entry.aside);
  if (const int code = run(_insert)) return code;
  entry.id = sqlite3_last_insert_rowid(_database);
  return SQLITE_OK;
}

int OperationJournal::write(const End& end) {
  if (!end.state) return run("DELETE FROM operation WHERE id = " + std::to_string(end.id));
  sqlite3_bind_int(_setState, 1, static_cast<int>(*end.state));
  sqlite3_bind_int64(_setState, 2, end.id);
  return run(_setState);
}

NSErrorPtr OperationJournal::begin(OperationEntry& entry) {
  if (const int fault = _files.step(FileStep::JournalBegin, operationName(entry.kind))) {
    return fileError(fault, "can't write the journal of operations for", entry.path);
  }
  entry.when = std::chrono::time_point_cast<NSDate::duration>(std::chrono::system_clock::now());
  MutexLock lock(_mutex);
  const bool makesRoom = entry.kind == OperationKind::Remove || entry.kind == OperationKind::Trash;
  // What was given up for these is theirs.
  if (!makesRoom) _reserve.take();
  int code = writeBegin(entry);
  while ((code & 0xff) == SQLITE_FULL && makesRoom && _reserve.giveUp()) code = writeBegin(entry);
  if (code != SQLITE_OK) return failure("can't write", code);
  _unwritten.clear();
  return nullptr;
}

int OperationJournal::writeBegin(OperationEntry& entry) {
  int code = setDurable(!isOneStep(entry));
  if (code == SQLITE_OK) code = run(_beginTransaction);
  if (code != SQLITE_OK) return code;
  for (const End& end : _unwritten) {
    if (code == SQLITE_OK) code = write(end);
  }
  if (code == SQLITE_OK) code = insert(entry);
  if (code == SQLITE_OK && entry.id % kPruneEvery == 0) {
    code = run("DELETE FROM operation WHERE state IN (1, 2) AND id <= " +
               std::to_string(entry.id - static_cast<std::int64_t>(_retention)));
  }
  if (code == SQLITE_OK) code = run(_commit);
  if (code != SQLITE_OK && sqlite3_get_autocommit(_database) == 0) run("ROLLBACK");
  return code;
}

bool OperationJournal::makeRoom(dev_t disk) {
  MutexLock lock(_mutex);
  return _reserve.isOn(disk) && _reserve.giveUp();
}

int OperationJournal::runWithRoom(const std::string& sql) {
  int code = run(sql);
  while ((code & 0xff) == SQLITE_FULL && _reserve.giveUp()) code = run(sql);
  return code;
}

NSErrorPtr OperationJournal::decide(std::int64_t id) {
  if (const int fault = _files.step(FileStep::JournalMark, {})) {
    return fileError(fault, "can't write", "the journal of operations");
  }
  MutexLock lock(_mutex);
  const End decided{id, OperationState::Decided};
  int code = setDurable(true);
  if (code == SQLITE_OK) code = write(decided);
  while ((code & 0xff) == SQLITE_FULL && _reserve.giveUp()) code = write(decided);
  return code == SQLITE_OK ? nullptr : failure("can't write", code);
}

void OperationJournal::finish(End end) {
  const int fault = _files.step(FileStep::JournalEnd, {});
  MutexLock lock(_mutex);
  if (fault == 0 && setDurable(false) == SQLITE_OK && write(end) == SQLITE_OK) {
    return;
  }
  _unwritten.insert(end);
}

void OperationJournal::end(std::int64_t id, OperationState state) { finish({id, state}); }
void OperationJournal::discard(std::int64_t id) { finish({id, std::nullopt}); }

void OperationJournal::writeEnds() {
  for (auto end = _unwritten.begin(); end != _unwritten.end();) {
    end = write(*end) == SQLITE_OK ? _unwritten.erase(end) : std::next(end);
  }
}

std::vector<OperationEntry> OperationJournal::select(const std::string& condition,
                                                     const std::vector<std::string_view>& values,
                                                     NSErrorOut error) {
  MutexLock lock(_mutex);
  writeEnds();
  const std::string sql = "SELECT id, " SKEIN_COLUMNS " FROM operation WHERE " + condition;
  sqlite3_stmt* statement = nullptr;
  int code = sqlite3_prepare_v2(_database, sql.c_str(), -1, &statement, nullptr);
  std::vector<OperationEntry> entries;
  for (auto value = values.begin(); code == SQLITE_OK && value != values.end(); ++value) {
    // Not copied: a path of many folders is asked for with each of them.
    sqlite3_bind_blob(statement, 1, value->empty() ? "" : value->data(),
                      static_cast<int>(value->size()), SQLITE_STATIC);
    while ((code = sqlite3_step(statement)) == SQLITE_ROW) {
      OperationEntry entry;
      entry.id = sqlite3_column_int64(statement, 0);
      entry.kind = static_cast<OperationKind>(sqlite3_column_int(statement, 1));
      entry.state = static_cast<OperationState>(sqlite3_column_int(statement, 2));
      entry.when = NSDate(NSDate::duration(sqlite3_column_int64(statement, 3)));
      entry.origin = column(statement, 4);
      entry.document = column(statement, 5);
      entry.path = column(statement, 6);
      entry.destination = column(statement, 7);
      entry.aside = column(statement, 8);
      entries.push_back(std::move(entry));
    }
    if (code == SQLITE_DONE) code = sqlite3_reset(statement);
  }
  if (code != SQLITE_OK) error.store(failure("can't read", code));
  sqlite3_finalize(statement);
  return entries;
}

std::vector<OperationEntry> OperationJournal::openEntries(NSErrorOut error) {
  return select("state IN (0, 3) ORDER BY id", {std::string_view()}, error);
}

std::vector<OperationEntry> OperationJournal::historyOfPath(const std::string& path,
                                                            std::size_t limit, NSErrorOut error) {
  const std::string newest = " ORDER BY id DESC LIMIT " + std::to_string(limit);
  std::vector<OperationEntry> entries =
      select("(path = ?1 OR destination = ?1) AND (kind <> 2 OR destination = ?1)" + newest, {path},
             error);
  std::vector<std::string_view> folders;
  const std::string_view whole = path;
  for (std::size_t end = path.rfind('/'); end != 0 && end != std::string::npos;
       end = path.rfind('/', end - 1)) {
    folders.push_back(whole.substr(0, end));
  }
  // That a folder was made says nothing about what is in it.
  std::vector<OperationEntry> ofFolders =
      select("(path = ?1 OR destination = ?1) AND kind <> 2" + newest, folders, error);
  std::move(ofFolders.begin(), ofFolders.end(), std::back_inserter(entries));
  std::sort(entries.begin(), entries.end(),
            [](const auto& a, const auto& b) { return a.id > b.id; });
  // One that moved something from one of the folders to another was found twice.
  entries.erase(std::unique(entries.begin(), entries.end(),
                            [](const auto& a, const auto& b) { return a.id == b.id; }),
                entries.end());
  if (entries.size() > limit) entries.resize(limit);
  return entries;
}

std::vector<OperationEntry> OperationJournal::historyOfDocument(const std::string& document,
                                                                std::size_t limit,
                                                                NSErrorOut error) {
  if (document.empty()) return {};
  return select("document <> '' AND document = CAST(?1 AS TEXT) ORDER BY id DESC LIMIT " +
                    std::to_string(limit),
                {document}, error);
}

}  // namespace skein::vald
