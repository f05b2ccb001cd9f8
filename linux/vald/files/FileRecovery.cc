// What a crash left: finished where the change was made, undone where it was not, or where a
// removal was not decided.
#include <set>
#include <system_error>

#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"
#include "linux/vald/files/FileOperations.h"
#include "linux/vald/files/TreeRemoval.h"

namespace skein::vald {
namespace {

// The folder that held it was taken away meanwhile.
bool gone(const NSErrorPtr& error) { return error->code() == NSFileNoSuchFileError; }

}  // namespace

NSErrorPtr FileOperations::recover() {
  NSErrorPtr error;
  std::vector<OperationEntry> open = _journal->openEntries(&error);
  if (error) return error;
  std::set<std::string> stillNeeded;
  for (OperationEntry& entry : open) {
    const std::optional<OperationState> state = recoverEntry(entry);
    if (!state) {
      stillNeeded.insert(nameOfPath(entry.aside));
      VL_ERROR(_log, "[ERROR] can't finish to %@ %@ now; the next start tries again",
               operationName(entry.kind), printable(entry.path));
      continue;
    }
    entry.state = *state;
    _journal->end(entry.id, *state);
    VL_NOTICE(_log, "[NOTICE] %@ of %@ was cut off and is %@", operationName(entry.kind),
              printable(entry.path.empty() ? entry.destination : entry.path),
              *state == OperationState::Done ? "finished" : "undone");
    _recovered.push_back(std::move(entry));
  }
  if (const int failure = _staging.clear(_files, stillNeeded)) {
    VL_ERROR(_log, "[ERROR] can't clear the staging folder: %@",
             std::generic_category().message(failure));
  }
  return nullptr;
}

std::optional<OperationState> FileOperations::recoverEntry(OperationEntry& entry) {
  if (const int failure = finishLinking(entry)) {
    VL_ERROR(_log, "[ERROR] can't take the second name of %@ away: %@", printable(entry.path),
             std::generic_category().message(failure));
    return std::nullopt;
  }
  switch (entry.kind) {
    case OperationKind::Import: return recoverImport(entry);
    case OperationKind::Remove: return recoverRemoval(entry);
    case OperationKind::Trash: return recoverTrash(entry);
    case OperationKind::PutBack:
      return entry.isCopied() ? recoverMoveAcross(entry) : recoverPutBack(entry);
    case OperationKind::CreateFolder:
    case OperationKind::MakeAlias:
      return exists(entry.destination) ? OperationState::Done : OperationState::Undone;
    case OperationKind::Rename:
    case OperationKind::Move:
      if (entry.isCopied()) return recoverMoveAcross(entry);
      // One step: it was taken or not.
      return exists(entry.destination) && !exists(entry.path) ? OperationState::Done
                                                              : OperationState::Undone;
  }
  return std::nullopt;
}

// Where a rename had to be made of two steps, the file may have both names.
int FileOperations::finishLinking(const OperationEntry& entry) {
  DirectoryHandle folders[2];
  std::string names[2];
  struct stat found[2];
  const std::string* paths[2] = {entry.isCopied() ? &entry.aside : &entry.path,
                                 entry.destination.empty() ? &entry.aside : &entry.destination};
  for (int at = 0; at < 2; ++at) {
    StagingPlace staged;
    StorePlace place;
    if (paths[at] == &entry.aside) {
      if (_staging.find(*paths[at], _roots, staged)) return 0;
    } else if (_roots.locate(*paths[at], place)) {
      return 0;
    }
    const bool isStaged = paths[at] == &entry.aside;
    folders[at] = std::move(isStaged ? staged.folder : place.folder);
    names[at] = isStaged ? staged.name : place.name;
    if (names[at].empty() || folders[at].status(names[at], found[at]) != 0) return 0;
  }
  const bool isSame = found[0].st_dev == found[1].st_dev && found[0].st_ino == found[1].st_ino;
  if (!isSame || S_ISDIR(found[0].st_mode) || found[0].st_nlink < 2) return 0;
  // Not one name in two spellings.
  if (!folders[0].lists(names[0]) || !folders[1].lists(names[1])) return 0;
  return _files.unlink(folders[0].get(), names[0]);
}

std::optional<OperationState> FileOperations::recoverImport(const OperationEntry& entry) {
  StagingPlace staged;
  if (NSErrorPtr error = _staging.find(entry.aside, _roots, staged)) {
    return gone(error) ? std::optional(OperationState::Undone) : std::nullopt;
  }
  if (staged.folder.exists(staged.name)) {
    if (removeTree(_files, staged.folder, staged.name) != 0) return std::nullopt;
    return OperationState::Undone;
  }
  return exists(entry.destination) ? OperationState::Done : OperationState::Undone;
}

std::optional<OperationState> FileOperations::recoverRemoval(OperationEntry& entry) {
  StagingPlace aside;
  NSErrorPtr error = _staging.find(entry.aside, _roots, aside);
  if (error && !gone(error)) return std::nullopt;
  const bool isAside = !error && aside.folder.exists(aside.name);
  StorePlace place;
  if (entry.state == OperationState::Open) {
    // Nobody was told that it is removed.
    if (!isAside) return OperationState::Undone;
    std::string name;
    if (!placeToComeBack(entry.path, place) || putBackRemoved(aside, place, name) != 0) {
      return std::nullopt;
    }
    entry.destination = joinPath(place.folderPath(), name);
    return OperationState::Undone;
  }
  if (isAside && removeTree(_files, aside.folder, aside.name) != 0) return std::nullopt;
  // Its folder may be gone by now, and with it what could be left.
  if (_roots.locate(entry.path, place)) return OperationState::Done;
  return removeTrashInfo(place) == 0 ? std::optional(OperationState::Done) : std::nullopt;
}

bool FileOperations::placeToComeBack(const std::string& path, StorePlace& place) const {
  const std::string name = nameOfPath(path);
  for (std::string folder = parentOfPath(path); !folder.empty(); folder = parentOfPath(folder)) {
    NSErrorPtr error = _roots.locate(joinPath(folder, name), place);
    if (!error) return true;
    if (!gone(error)) return false;
  }
  return false;
}

bool FileOperations::exists(const std::string& path) const {
  StorePlace place;
  return !_roots.locate(path, place) && place.folder.exists(place.name);
}

}  // namespace skein::vald
