#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "base/Executor.h"
#include "linux/protocol/LocalDaemon.h"
#include "platform/log/Log.h"

namespace skein::vald {

enum class SortOrder : std::uint8_t { Name = 0, Date = 1 };

// A root that the store indexes: the drive itself, or an app container's documents.
struct StoreRoot {
  std::string path;                        // absolute, no trailing separator
  std::optional<std::string> containerID;  // nil for the drive's own folder
  std::string displayName;                 // shown at the drive's root; unused for the drive
};

struct StoreOptions {
  std::string databasePath;
  StoreRoot drive;
  std::vector<StoreRoot> containers;
  std::uint64_t watchBudget = 0;  // 0: half of what the system allows
  // How long a document that vanished keeps its identity for a safe-save that follows.
  std::chrono::milliseconds graceWindow{2000};
  // How many changes the journal keeps before older tokens expire.
  std::uint64_t journalRetention = 200'000;
  // Items that were moved by copying them while no store was open: absolute paths, from and to.
  std::vector<std::pair<std::string, std::string>> copies;
  // Called when the index's disk is full: whether it has a little more room now. On the writer's
  // thread. Null: it never has.
  std::function<bool()> makeRoom = {};
};

struct Page {
  std::vector<VLQueryItemPtr> items;
  // Where this listing goes on, and no other; 0 at the end. The index of the next item, and
  // more when the folder changed during a listing.
  std::uint64_t nextOffset = 0;
};

// One change as it was journalled. A dead item's properties hold its identifiers alone.
struct StoreChange {
  std::uint64_t rank = 0;
  VLQueryItemPtr item;
  // Where it is now, and where it was before a move: raw identifiers of the folders
  // that hold it (a sender watches by these). Equal unless it moved.
  VLFileObjectID folder = VLFileObjectID::folderOrAliasWithRawID(0);
  VLFileObjectID previousFolder = VLFileObjectID::folderOrAliasWithRawID(0);
  // Whether something changed on disk, and not only what the index alone knows.
  bool isOfFile = true;
};

struct ChangePage {
  std::vector<StoreChange> changes;  // by rising rank, one per item: its latest
  std::uint64_t newestRank = 0;      // where to go on from
  bool expired = false;              // the rank asked from is older than the journal
};

// Hears of every change after it is durable, in order of rank, on the store's writer
// thread: queue and return. `overflow` says that changes below `folder` (nil: anywhere)
// were found by a rescan and are too many to tell one by one.
class StoreListener {
 public:
  virtual ~StoreListener() = default;
  virtual void storeDidChange(const std::vector<StoreChange>& changes) = 0;
  virtual void storeDidOverflow(std::optional<VLFileObjectID> folder) = 0;
};

// The documents store: the real folder, its index, the watcher that keeps them equal,
// and the journal of changes. Reads go to the index and are answered on the calling
// thread from any thread; one writer thread scans, watches and journals.
class Store {
 public:
  // Opens (or makes) the index and starts the first scan or the verification. Null with
  // an error that names the cause. `listener` and `log` outlive the store.
  static std::unique_ptr<Store> open(StoreOptions options, StoreListener& listener, Log& log,
                                     NSErrorOut error);
  virtual ~Store() = default;

  // A folder's children. A nil folder is the drive's root, which also lists the app
  // containers' folders. An alias lists the folder that it leads to, when that is in the
  // store. A folder that the scan has not reached yet is read first. A listing that begins (at
  // offset 0) has what was done in the folder before, by whomever on this machine.
  virtual Page listFolder(std::optional<VLFileObjectID> folder, SortOrder order,
                          std::uint64_t offset, std::uint64_t limit, NSErrorOut error) = 0;
  virtual Page listAllFolders(SortOrder order, std::uint64_t offset, std::uint64_t limit,
                              NSErrorOut error) = 0;

  // Null, with NSCocoaErrorDomain 4, when there is none.
  virtual VLQueryItemPtr itemWithID(VLFileObjectID id, NSErrorOut error) = 0;
  // What came a moment ago is there. `scanFirst`: what is there is looked at first.
  virtual VLQueryItemPtr itemAtPath(const std::string& path, bool scanFirst, NSErrorOut error) = 0;
  virtual std::optional<std::string> pathForID(VLFileObjectID id, NSErrorOut error) = 0;
  // The same of many, of one moment: as many, in their order, nullopt for what is not there.
  // None, with an error, when the index cannot be read.
  virtual std::vector<std::optional<std::string>> pathsForIDs(
      const std::vector<VLFileObjectID>& ids, NSErrorOut error) = 0;

  virtual std::uint64_t currentRank() = 0;
  // At most `limit` changes after `rank`; 0 is the start of the history and never expires.
  virtual ChangePage changesSince(std::uint64_t rank, std::uint64_t limit, NSErrorOut error) = 0;
  // Drawn when the index was made, and when it may lack changes that were told, after a power
  // cut: tokens of another journal are expired.
  virtual std::string journalID() = 0;

  // Prefers a watch on this folder when the budget does not cover all of them.
  virtual void retainFolderWatch(VLFileObjectID folder) = 0;
  // Waits for nothing, and may be called from within a listener.
  virtual void releaseFolderWatch(VLFileObjectID folder) = 0;

  // Replaces the app containers' roots; items that come or go are journalled.
  virtual void setContainers(std::vector<StoreRoot> containers) = 0;

  // Journals an item as changed, though its file did not: what is told of it beside the file
  // did. `withContents`: and everything below it. Nothing for an item that is not there.
  virtual void tellAnew(VLFileObjectID id, bool withContents) = 0;

  // Fills the fields that the store knows.
  virtual void status(LocalDaemonStatus& status) = 0;
  virtual std::vector<IndexDifference> check(std::uint64_t limit) = 0;

  // Small values that must survive a restart (the account), written durably.
  virtual std::optional<std::string> setting(const std::string& key) = 0;
  virtual void setSetting(const std::string& key, std::optional<std::string> value) = 0;

  // Waits until what the disk did before this call is journalled, or the deadline: for
  // tests and for answers that must be current. False at the deadline.
  virtual bool settle(std::chrono::milliseconds deadline) = 0;
};

}  // namespace skein::vald
