#pragma once

#include <functional>
#include <memory>
#include <string>

#include "linux/vald/index/Sqlite.h"
#include "platform/foundation/NSError.h"
#include "platform/log/Log.h"

namespace skein::vald {

// The index on disk.
//
//   item       one row per document, folder and alias; its key is its rank, so that a
//              bulk load appends and the journal is the table itself
//   folder     one row per folder, the roots included: where it is, whether it was read
//   root       the drive (container NULL) and the app containers' folders
//   tombstone  what is gone, for the journal and for items that come back
//   detail     what few items have: tags, dates and ranks that the disk does not keep
//   tag        which items have a tag
//   setting    small values by name
//
// Four secondary indexes of `item` are built after the first scan, when that is cheapest.

// Opens the index at `path` for writing, or makes it. One that is damaged, of another
// program, or of a later version is set aside under a name of its own (the log says
// which), never changed. Null when the folder cannot be written to.
std::unique_ptr<SqliteDatabase> openIndexFile(const std::string& path, Log& log, NSErrorOut error);

// Whether a statement failed since the index's disk is full. openIndexFile() answers ENOSPC then.
bool indexLacksRoom(SqliteDatabase& database);

// Notes that the index at `path` turned out to be damaged, so that the next start sets it
// aside.
void markIndexFileDamaged(const std::string& path);

// Moves the closed index at `path` out of the way, to `path` and `suffix`, and back.
bool setIndexFileAside(const std::string& path, const std::string& suffix);
bool takeIndexFileBack(const std::string& path, const std::string& suffix);

// Most commits do not wait for the disk, which has what they write as well. A power cut may
// take the newest of them along, and with them ranks that were told already. So an index is
// marked while it is open, with the start of the machine, and the newest commits may be
// missing when the mark of an earlier start is found. Marking waits for the disk.
bool mayIndexLackCommits(SqliteDatabase& database);
void markIndexOpen(SqliteDatabase& database);
void markIndexClosed(SqliteDatabase& database);

// Whether the secondary indexes stand; and builds them, inside no transaction.
bool hasSecondaryIndexes(SqliteDatabase& database);
bool buildSecondaryIndexes(SqliteDatabase& database);

}  // namespace skein::vald
