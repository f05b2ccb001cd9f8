#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "base/Executor.h"
#include "linux/vald/files/FileCoordinator.h"
#include "linux/vald/files/FileKey.h"
#include "linux/vald/files/FileLayer.h"
#include "linux/vald/files/OperationJournal.h"
#include "linux/vald/files/OperationScope.h"
#include "linux/vald/files/Staging.h"
#include "linux/vald/files/StoreRoots.h"
#include "linux/vald/files/TagAttributes.h"
#include "linux/vald/files/TrashInfo.h"
#include "linux/vald/files/TreeComparison.h"
#include "linux/vald/files/TreeCopy.h"
#include "platform/log/Log.h"

namespace skein::vald {

struct FileOperationsOptions {
  std::vector<std::string> roots;  // the drive's folder and the app containers', absolute
  std::string stateDirectory;      // the drive's; the journal and the staging live there
  // How long an operation waits for others, here and in other programs.
  std::chrono::milliseconds lockDeadline{2000};
  std::uint64_t provenanceRetention = 100'000;  // entries
  // Under which other names, beside an item of this name, the same item may stand: an item
  // there takes the name, too. None when empty.
  std::function<std::vector<std::string>(const std::string& name)> otherNames;
};

// Whose request an operation is: what provenance tells.
struct FileRequest {
  std::string origin;    // in words, such as "skein trash (process 4711)"
  std::string document;  // the item's persistent identifier, where it is known
  // Importing, removing and moving between volumes: how far it is, and whether to go on.
  FileProgressHandler progress;
  // Renaming and moving alone: called when the item is at `path`, while the disk is yet to be
  // written; when that fails, it is taken back after this call. `isCopy`: on another volume, where
  // it is another file, and stays.
  std::function<void(const std::string& path, bool isCopy)> moved = {};
  // Moving between volumes alone: called before the item leaves its place. From then on until
  // moved(), or until the operation answers an error, nothing that is seen there, or at `path`,
  // tells what became of it.
  std::function<void(const std::string& path)> leaves = {};
  // Removing alone: called when the item is out of sight, and nothing of it is deleted yet.
  // False: it is put back.
  std::function<bool()> removed = {};
  // Removing alone: is given what deletes a removed folder, to be run after the answer; what
  // never runs is done by the next start. Null: it is deleted before remove() returns.
  std::function<void(Task)> deleteLater = {};
  // The file that the request is about; another one that has its name by now is left alone, or
  // put back, and answered as ESTALE. Nil: whatever has the name.
  std::optional<FileKey> file = {};
};

// Where the item is now, or why it is where it was.
struct FileResult {
  std::string path;
  NSErrorPtr error;
};

// Which kind of move is possible: bits of the mask that the move rule answers with. Any
// of these allows the move; the rest of the mask is 0.
enum MoveCapability : std::uint64_t {
  kMayRename = 1u << 0,  // within the same folder
  kMayMoveToAnotherFolder = 1u << 3,
  kMayMoveToAnotherRoot = 1u << 4,  // between the drive and an app's folder
  kMayMoveOutOfTrash = 1u << 5,
};

// What is done to files in the store. Every operation is journalled before it changes
// anything and ends before or after, never between; one that was cut off is finished or
// undone by the next open(). Paths are absolute. Operations on overlapping paths follow
// each other, others run side by side; all block the calling thread, any thread. A name
// that is taken is NSCocoaErrorDomain 516 with the colliding URL, a missing item is 4.
class FileOperations {
 public:
  // Opens the roots and the journal, and recovers what was cut off: recovered() tells.
  // Null with an error. `files` and `log` outlive it.
  static std::unique_ptr<FileOperations> open(FileOperationsOptions options, FileLayer& files,
                                              Log& log, NSErrorOut error);

  // App containers come and go.
  NSErrorPtr setRoots(const std::vector<std::string>& roots) { return _roots.set(roots); }
  // The entries that open() ended, and how: their paths want a fresh look by the index.
  const std::vector<OperationEntry>& recovered() const { return _recovered; }
  OperationJournal& journal() { return *_journal; }
  StoreRoots& roots() { return _roots; }
  FileLayer& layer() { return _files; }

  // Copies a file or a tree from anywhere into a folder; a nil name keeps the source's.
  FileResult importDocument(const std::string& source, const std::string& folder,
                            const std::optional<std::string>& name, const FileRequest& request);
  FileResult createFolder(const std::string& folder, const std::string& name,
                          const FileRequest& request);
  // A symbolic link with the target's absolute path, so that it can be moved about; the
  // target may be outside the store and need not be there.
  FileResult makeAlias(const std::string& folder, const std::string& name,
                       const std::string& target, const FileRequest& request);
  // The name it has already is a success that changes nothing.
  FileResult rename(const std::string& path, const std::string& newName,
                    const FileRequest& request);
  // Out of the trash this is putting back: without a name the item gets the one it had.
  // `bounce`: a taken name is tried again as "name 2.ext", "name 3.ext" ...
  // To another volume (see crossesVolumes) this copies, compares, and then removes what it has
  // copied: it takes as long as that takes, and can be cancelled. What a copy cannot keep is
  // refused. Hard links to what is moved are no links to it any more.
  FileResult move(const std::string& path, const std::string& folder,
                  const std::optional<std::string>& newName, bool bounce,
                  const FileRequest& request);
  // Whether the folder is on another volume than the item: then move() copies.
  bool crossesVolumes(const std::string& path, const std::string& folder) const;
  // Removes a file or tree for good. Answers without a path; when it was cancelled and the name
  // is taken by then, with the path that the item has now.
  FileResult remove(const std::string& path, const FileRequest& request);
  // To the trash at the item's root; the answer is its path in there.
  FileResult trash(const std::string& path, const FileRequest& request);

  // Where a trashed item, or what lies in one, was before.
  FileResult putBackPath(const std::string& trashedPath) const;
  // What the trash notes of an item that lies in it; nil when it notes nothing.
  std::optional<TrashInfo> trashInfo(const std::string& trashedPath) const;
  // 0 with an error that says why for what move() would refuse, whatever the name.
  std::uint64_t capabilityToMove(const std::string& path, const std::string& to,
                                 NSErrorOut error) const;

  // Takes a path for a change by somebody else, and waits for it: no operation runs at it,
  // above it or below it until `held` goes, which must not outlive this.
  NSErrorPtr coordinate(const std::string& path, std::shared_ptr<void>& held);
  // Waits until no operation, here or in another program that locks the document, is under
  // way at a path.
  NSErrorPtr waitFor(const std::string& path);

  // Notes on a document's file which document it is (see DocumentHint.h). Nothing depends on
  // it while the index lives, so a file that cannot have it is none of an error's. Whether the
  // file was changed. `asked`: as of a request's file.
  bool writeHint(const std::string& path, std::uint64_t document,
                 const std::optional<FileKey>& asked = std::nullopt);

  TagResult tags(const std::string& path) const;
  // `written` is called when the file has them, while the disk is yet to be written; that may
  // fail after this call. `asked`: as of a request's file.
  TagResult setTags(const std::string& path, const std::vector<std::string>& names,
                    const std::function<void()>& written = nullptr,
                    const std::optional<FileKey>& asked = std::nullopt);

 private:
  // What an operation holds while it runs.
  struct Hold {
    FileCoordinator::Claim claim;
    DocumentLock lock;
  };

  FileOperations(FileOperationsOptions options, FileLayer& files, Log& log);

  std::chrono::steady_clock::time_point deadline() const;
  NSErrorPtr claim(std::vector<std::string> paths, std::chrono::steady_clock::time_point until,
                   FileCoordinator::Claim& claim);
  // Whether the place's item, under whichever name, is there.
  bool isTaken(const StorePlace& place) const;
  // The place's name is free, but one of its other names is not, and not by `from` itself.
  bool isTakenByAnother(const StorePlace& from, const StorePlace& to) const;
  // Claims `paths`, finds the item and locks it: Cocoa 4 when it is gone, or another file has
  // its name. Refuses roots and the trash's own folders.
  NSErrorPtr take(const std::string& path, std::vector<std::string> paths,
                  const FileRequest& request, StorePlace& place, Hold& hold);
  // Whether the entry is the file that the request is about. Asked once more when it was
  // renamed, since no claim keeps other programs from renaming in the last moment.
  static bool isAsked(const FileRequest& request, const DirectoryHandle& folder,
                      const std::string& name);
  // Renames an entry back to where it was; with a number when the name was taken since. `name` is
  // then what it is called. 0 or an errno.
  int putBack(const DirectoryHandle& folder, std::string& name, const StorePlace& place);
  // Claims a place where something new shall be; refuses taken names and the trash.
  NSErrorPtr takeNew(const std::string& folder, const std::string& name, StorePlace& place,
                     Hold& hold);
  // Syncs the folder that holds the place, and `other` when there is one.
  int syncFolders(const DirectoryHandle& folder, const DirectoryHandle* other = nullptr);

  // `again`: the staging was on another volume after all; try once more.
  NSErrorPtr stageAndPlace(const DirectoryHandle& from, const std::string& source,
                           const StorePlace& place, const FileRequest& request, bool& again);
  // Deletes what an import left; what stays is the next start's.
  void discardStaged(const StagingPlace& staged, OperationScope& scope);
  FileResult removeAside(const StorePlace& place, const FileRequest& request, bool& again);

  // putBack() of what is aside, which waits for the disk. `name`: what it is called then.
  int putBackRemoved(const StagingPlace& aside, const StorePlace& place, std::string& name);

  FileResult moveTo(const StorePlace& from, const std::string& folder, const std::string& name,
                    bool bounce, OperationKind kind, const FileRequest& request);
  // One try: `taken` when the name is.
  NSErrorPtr moveOnce(const StorePlace& from, const StorePlace& to, OperationKind kind,
                      const FileRequest& request, bool& taken);
  // The same to another volume. `again`: the staging was on another volume after all.
  NSErrorPtr moveAcross(const StorePlace& from, const StorePlace& to, OperationKind kind,
                        const FileRequest& request, bool& taken, bool& again);
  // 0 or an errno; EEXIST when another item has the name.
  int renameItem(const StorePlace& from, const StorePlace& to);
  // Finds the destination too. An error when no such move may be.
  NSErrorPtr refusalOfMove(const StorePlace& from, const std::string& folder,
                           const std::string& name, StorePlace& to,
                           std::uint64_t& capability) const;

  // 0 or an errno; nil info for a text that is none.
  int readTrashInfo(const StorePlace& place, const TrashedPath& trashed,
                    std::optional<TrashInfo>& info) const;
  NSErrorPtr openTrash(const OpenRoot& root, DirectoryHandle& files, DirectoryHandle& info);
  FileResult trashAt(const StorePlace& place, const FileRequest& request);
  NSErrorPtr trashAs(const StorePlace& place, const std::string& trashedName,
                     const DirectoryHandle& trashed, const DirectoryHandle& info,
                     const FileRequest& request, bool& taken);
  // Forgets where a trashed item was, when it is one and is gone. 0 or an errno.
  int removeTrashInfo(const StorePlace& trashed);

  // Finishes or undoes; nil leaves the entry open for the next start.
  std::optional<OperationState> recoverEntry(OperationEntry& entry);
  // 0 or an errno.
  int finishLinking(const OperationEntry& entry);
  std::optional<OperationState> recoverImport(const OperationEntry& entry);
  // Sets the destination where it came back under another name.
  std::optional<OperationState> recoverRemoval(OperationEntry& entry);
  // Where what was removed from the path comes back to: there, or, when its folder is gone, in the
  // nearest one above. False when no root of it is there.
  bool placeToComeBack(const std::string& path, StorePlace& place) const;
  std::optional<OperationState> recoverTrash(const OperationEntry& entry);
  std::optional<OperationState> recoverPutBack(const OperationEntry& entry);
  std::optional<OperationState> recoverMoveAcross(const OperationEntry& entry);
  NSErrorPtr recover();
  bool exists(const std::string& path) const;

  const FileOperationsOptions _options;
  FileLayer& _files;
  Log& _log;
  StoreRoots _roots;
  Staging _staging;
  FileCoordinator _coordinator;
  std::unique_ptr<OperationJournal> _journal;
  std::vector<OperationEntry> _recovered;
};

}  // namespace skein::vald
