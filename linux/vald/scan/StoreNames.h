// Which names on disk are documents, and which document a name on disk stands for.
#pragma once

#include <set>
#include <string>
#include <string_view>

#include "linux/vald/index/FileState.h"

namespace skein::vald {

// Whether a name is never listed: those that useOfReservedName() tells of.
bool isHiddenFromStore(std::string_view name);

// What the folder table calls a root's trash: a way of two names, which no folder has.
std::string ownTrashFolderName();
bool isTrashFolderName(std::string_view name);

// Adds the documents' names that a change at a name on disk may concern: a marker is its
// document. False when only reading the folder as a whole tells.
bool addConcernedNames(const std::string& name, std::set<std::string>& documents);

// Reads the marker `name` in an open folder, whose own state is in `state` already, and
// puts in what it says. The document's name; empty when the file is no marker of one: then
// it is a document itself.
std::string readMarker(int folder, const std::string& name, FileState& state);

}  // namespace skein::vald
