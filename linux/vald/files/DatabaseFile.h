// The files of the drive's databases: for their owner alone, and set aside when they are damaged.
#pragma once

#include <string>
#include <vector>

#include "platform/log/Log.h"

namespace skein::vald {

// Before a database is opened: makes its file for this user alone, whatever the process's mask
// says, and closes one that others may read. What fails here fails when it is opened.
void makeDatabasePrivate(const std::string& path);

// After a database could not be opened or read. When its file is damaged, or no database, it
// is renamed, with its log, to PATH.damaged-SECONDS, so that a new one can be made, and true is
// the answer; of those from before, the newest two are kept. Any other trouble (a full disk, no
// permission, a newer version's) is none that a new file would mend: false.
bool setAsideWhenDamaged(const std::string& path, Log& log);

// A sentence for each database in the folder that was set aside, as long as its file is there.
std::vector<std::string> notesOfDatabasesSetAside(const std::string& folder);

// Removes all but the newest `kept` of the files PATH + `infix` + NUMBER, with their logs.
void pruneSetAside(const std::string& path, const std::string& infix, std::size_t kept);

}  // namespace skein::vald
