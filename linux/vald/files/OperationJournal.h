#pragma once

#include <sys/types.h>

#include <cstdint>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "base/Mutex.h"
#include "linux/vald/files/DiskReserve.h"
#include "linux/vald/files/FileLayer.h"
#include "platform/foundation/NSDate.h"
#include "platform/foundation/NSError.h"

struct sqlite3;
struct sqlite3_stmt;

namespace skein::vald {

enum class OperationKind : std::uint8_t {
  Import = 1,
  CreateFolder = 2,
  Rename = 3,
  Move = 4,
  Remove = 5,
  Trash = 6,
  PutBack = 7,
  MakeAlias = 8,
};
// "import", "create folder", ...
const char* operationName(OperationKind kind);

// Decided: a removal that is yet to be finished, and not taken back any more.
enum class OperationState : std::uint8_t { Open = 0, Done = 1, Undone = 2, Decided = 3 };

// One operation on the store: what was asked, by whom, and what became of it.
struct OperationEntry {
  std::int64_t id = 0;
  OperationKind kind = OperationKind::Import;
  OperationState state = OperationState::Open;
  NSDate when{};
  std::string origin;       // whose request it was, in words
  std::string document;     // the item's persistent identifier; empty when not known
  std::string path;         // what it was done to; for an import, where it came from
  std::string destination;  // where it is afterwards; empty for a removal
  std::string aside;        // where contents are kept meanwhile; empty when nowhere

  // Whether contents that are no other name of what stood somewhere appear at `destination`: of
  // an import, and of a move between volumes.
  bool isCopied() const { return !aside.empty() && !destination.empty(); }
};

// The durable journal of file operations: an SQLite database of its own in the drive's
// state folder, beside the index, which may be thrown away and made again while this may
// not. An entry is written before anything is changed, and on the disk by then if the change
// takes several steps: what a power cut leaves of one step is whole without an entry. Its end
// is written after the change, without waiting for the disk, since an end that a power cut
// loses is found again by looking at the files. Ended entries stay as the provenance of
// what went and moved, the newest `retention` of them.
//
// So that something can be removed or trashed on a full disk, room is kept for that beside the
// database (`DATABASE-reserve`). A part of it is given up each time that the journal cannot be
// opened, or such an entry not be written, and taken again when there is room. Any thread.
class OperationJournal {
 public:
  // Null with an error that names the cause. `files` outlives the journal.
  static std::unique_ptr<OperationJournal> open(const std::string& databasePath,
                                                std::uint64_t retention, FileLayer& files,
                                                NSErrorOut error);
  ~OperationJournal();

  // Sets the entry's id. An error: nothing was written and nothing may be changed.
  NSErrorPtr begin(OperationEntry& entry);
  // From here on the removal is finished, whatever happens. On the disk when it answers null;
  // after an error it is as before.
  NSErrorPtr decide(std::int64_t id);
  // An end that cannot be written now is written with the next entry.
  void end(std::int64_t id, OperationState state);
  // Gives a part of the reserve to what else has to be written on this disk; false when it is
  // not the journal's, or nothing is left.
  bool makeRoom(dev_t disk);
  // Forgets an entry that came to nothing before a second try.
  void discard(std::int64_t id);

  // What a crash left, oldest first.
  std::vector<OperationEntry> openEntries(NSErrorOut error);

  // What happened to a path, or to a folder that held it, and what brought it there;
  // newest first.
  std::vector<OperationEntry> historyOfPath(const std::string& path, std::size_t limit,
                                            NSErrorOut error);
  std::vector<OperationEntry> historyOfDocument(const std::string& document, std::size_t limit,
                                                NSErrorOut error);

 private:
  OperationJournal(sqlite3* database, const std::string& path, std::uint64_t retention,
                   FileLayer& files);

  struct End {
    std::int64_t id;
    std::optional<OperationState> state;  // nil: forget the entry
    friend auto operator<=>(const End&, const End&) = default;
  };
  void finish(End end);
  // Whether commits wait for the disk from here on. 0 or SQLite's code.
  int setDurable(bool isDurable) SKEIN_REQUIRES(_mutex);
  // 0 or SQLite's code.
  int run(const std::string& sql) SKEIN_REQUIRES(_mutex);
  int run(sqlite3_stmt* statement) SKEIN_REQUIRES(_mutex);
  int prepare(const std::string& sql, sqlite3_stmt*& statement) SKEIN_REQUIRES(_mutex);
  int write(const End& end) SKEIN_REQUIRES(_mutex);
  int insert(OperationEntry& entry) SKEIN_REQUIRES(_mutex);
  // The entry as one transaction, with the ends that are not written yet. 0 or SQLite's code.
  int writeBegin(OperationEntry& entry) SKEIN_REQUIRES(_mutex);
  // run(), with more room where that is what it lacks.
  int runWithRoom(const std::string& sql) SKEIN_REQUIRES(_mutex);
  NSErrorPtr failure(const char* doing, int code) SKEIN_REQUIRES(_mutex);
  // What was not written yet, so that it is read as well.
  void writeEnds() SKEIN_REQUIRES(_mutex);
  // What `condition` selects for each of `values`, one after the other, as its parameter.
  std::vector<OperationEntry> select(const std::string& condition,
                                     const std::vector<std::string_view>& values, NSErrorOut error);

  FileLayer& _files;
  const std::uint64_t _retention;
  Mutex _mutex;
  sqlite3* const _database;
  // What every operation runs; each is parsed once.
  sqlite3_stmt* _beginTransaction SKEIN_GUARDED_BY(_mutex) = nullptr;
  sqlite3_stmt* _commit SKEIN_GUARDED_BY(_mutex) = nullptr;
  sqlite3_stmt* _insert SKEIN_GUARDED_BY(_mutex) = nullptr;
  sqlite3_stmt* _setState SKEIN_GUARDED_BY(_mutex) = nullptr;
  bool _isDurable SKEIN_GUARDED_BY(_mutex) = true;  // SQLite's own beginning
  std::set<End> _unwritten SKEIN_GUARDED_BY(_mutex);
  DiskReserve _reserve SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein::vald
