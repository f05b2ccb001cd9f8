#pragma once

#include <atomic>
#include <chrono>
#include <functional>
#include <memory>
#include <string>
#include <thread>
#include <unordered_set>
#include <vector>

#include "base/Mutex.h"
#include "base/UniqueFunction.h"
#include "linux/vald/Store.h"
#include "linux/vald/index/IndexWriter.h"
#include "linux/vald/scan/Disk.h"
#include "linux/vald/scan/FolderTable.h"
#include "linux/vald/scan/Journal.h"
#include "linux/vald/scan/Reconciler.h"
#include "linux/vald/scan/Scanner.h"
#include "linux/vald/watch/Watcher.h"

namespace skein::vald {

// A file that the cloud has the contents of, as it looked then.
struct UploadedFile {
  VLFileObjectID document = VLFileObjectID::documentWithRawID(0);
  FileState state;  // kind, inode, size and times
};

// The store's one writer thread: takes what the scanner read and the watcher saw, and
// brings the index to it, one transaction per batch. Everything that writes goes through
// perform().
//
// The first scan of an empty index is a bulk load without secondary indexes; changes on
// disk wait for its end, ten seconds at most, since telling which document is which needs
// them. Every later round over the store (at a restart, after lost events) compares.
class StoreWriter {
 public:
  using Place = Reconciler::Place;
  struct Copy {
    Place from;
    Place to;
  };

  // `drive`: the drive's folder as it was found. `copies`: of options.copies, where the index has
  // their places. `listener` and `log` outlive this.
  StoreWriter(StoreOptions options, RootFolder drive, std::unique_ptr<SqliteDatabase> database,
              std::vector<Copy> copies, StoreListener& listener, Log& log);
  ~StoreWriter();

  struct Waiter;
  // Has `work` run on the writer thread, outside a transaction. Null when the writer is ending.
  std::shared_ptr<Waiter> post(Task work) SKEIN_EXCLUDES(_mutex);
  // Waits for what was posted. False when the writer is ending, or `deadline` passed; then it
  // may still run.
  bool wait(const std::shared_ptr<Waiter>& posted,
            std::chrono::milliseconds deadline = std::chrono::seconds(60)) SKEIN_EXCLUDES(_mutex);
  // Both.
  bool perform(Task work, std::chrono::milliseconds deadline = std::chrono::seconds(60)) {
    return wait(post(std::move(work)), deadline);
  }
  bool settle(std::chrono::milliseconds deadline) SKEIN_EXCLUDES(_mutex);

  // Inside perform().
  Look lookAtFolder(FolderKey folder, int& error);
  Look lookAtName(FolderKey folder, const std::string& name);
  // Several names as one change: what went from one of them to another moved.
  Look lookAtNames(const std::vector<Place>& places);
  // Brings the index to what the disk did in the folder up to now: decides what the kernel has
  // told, and looks at the folder itself when it is not watched, or the round under way has yet
  // to come to it. As lookAtFolder.
  Look catchUp(FolderKey folder, int& error);
  // An item is about to be moved by copying it: as of Reconciler::expectCopy(), with its end.
  void expectCopy(const Copy& copy) { _reconciler.expectCopy(copy.from, copy.to); }
  void forgetCopy(const Copy& copy) { _reconciler.forgetCopy(copy.from); }
  // The item, with all that is in it, is where its copy is from now on. Durable. False when the
  // index knows none, or it could not be written; then what is seen is decided like any change.
  bool takeCopy(const Copy& copy);
  // False when there is no such item, or it could not be written. Durable.
  bool changeDetails(VLFileObjectID id, const std::function<void(ItemDetails&)>& change);
  // What the cloud has now; said of a file that looks otherwise by now, it is ignored.
  void noteUploads(const std::vector<UploadedFile>& files);
  void setContainers(const std::vector<StoreRoot>& containers);
  void tellAnew(VLFileObjectID id, bool withContents);
  void retain(VLFileObjectID folder, bool isRetained);
  bool setSetting(const std::string& key, const std::optional<std::string>& value);

  // Any thread.
  // Somebody is told of documents that he asked for by path, or by listing a folder.
  void noteAsked() { _reconciler.noteAsked(); }
  void status(LocalDaemonStatus& status) SKEIN_EXCLUDES(_mutex);
  std::uint64_t rank() const { return _rank.load(); }
  std::uint64_t oldestRank() const { return _oldestRank.load(); }
  bool isUnwatched(FolderKey folder) const SKEIN_EXCLUDES(_mutex);
  // Why the index cannot be used; empty while it can.
  std::string failure() const SKEIN_EXCLUDES(_mutex);
  // Whether that is since the disk is full.
  bool lacksRoom() const SKEIN_EXCLUDES(_mutex);
  Watcher& watcher() { return _watcher; }
  // Whether the attributes of what the first scan found are still being read.
  bool isReadingAttributes() const { return _isReadingAttributes.load(); }

 private:
  using Instant = std::chrono::steady_clock::time_point;

  // Waiting and the turn of work.
  void run();
  void wake() SKEIN_EXCLUDES(_mutex);
  Instant nextDeadline();
  void serveTasks() SKEIN_EXCLUDES(_mutex);
  void takeScans();
  void takeDirt();
  void answerSettled() SKEIN_EXCLUDES(_mutex);
  void tick();

  // The store's folders and rounds over them.
  void load();
  std::optional<std::string> pathNow(const RootRow& root) const;
  void adoptRoot(FolderKey folder, RootFolder found, std::optional<std::string> containerID);
  void checkRoots();
  // Finds the roots' trash folders, and those that went. Those that came, unless `now`, are
  // scanned like other folders.
  void checkTrashes(bool now);
  void addTrash(FolderKey root, const FileKey& key, bool now);
  void removeTrash(FolderKey root);
  void startRound(LocalDaemonStatus::Scan kind);
  void finishRound();
  void enqueue(const std::vector<FolderKey>& folders);
  void enqueueSubfolders(FolderKey folder);
  void noteWatch(FolderKey folder, bool isWatched) SKEIN_EXCLUDES(_mutex);
  void noteUnreadable(FolderKey folder, int error);
  void afterDecisions();

  // One folder that was read; `isOld`: a while ago, by the scanner.
  void accept(FolderKey folder, const FolderSnapshot& snapshot, bool inRound, bool isOld);
  void loadFolder(FolderKey folder, const FolderSnapshot& snapshot);
  void endBulkLoad();
  // How often names are looked at again, because the disk goes on, before they are decided.
  static constexpr int kMostLooks = 10;
  // All that the watcher told of.
  void reconcileDirt(DirtySet dirty);
  void noteLosses(const DirtySet& dirty);
  void reconcile(DirtySet& dirty);
  // Gathers what changed in those of the folders that can be read, and moves them to `gathered`;
  // those that have to wait for the scanner to `unread`. Whether there was one.
  bool gatherFolders(DirtySet& dirty, DirtySet& gathered, DirtySet& unread);
  // What changed in one folder that is open.
  void gather(FolderKey folder, int descriptor, const DirtyFolder& changes);
  // A piece of the round over attributes that follows a first scan.
  void readSomeAttributes();
  // Gives the item the number that its file says it has. False when it says none, or has to wait.
  bool takeHint(ItemRow& row, bool& waits);
  // Every file was asked: what is left is a copy of none that is here. In or before a transaction.
  void takeWaitingHints();

  // Transactions.
  enum class Durability {
    Soon,  // within two seconds: what the disk tells as well, and a round finds again
    Now,   // the commit waits for the disk: what the index alone knows
  };
  void begin(Durability durability = Durability::Soon);
  // How much is written beside the index before it is taken over into it.
  void checkpointAfter(int pages);
  void note(std::string failure) SKEIN_EXCLUDES(_mutex);
  bool commit();
  void fail();
  void publish() SKEIN_EXCLUDES(_mutex);

  StoreOptions _options;
  StoreListener& _listener;
  Log& _log;
  std::unique_ptr<SqliteDatabase> _database;
  Watcher _watcher;
  Scanner _scanner;

  // The writer thread's own.
  IndexWriter _index;
  FolderTable _folders;
  Disk _disk;
  Journal _journal;
  Details _details;
  Reconciler _reconciler;
  RootFolder _drive;
  std::vector<Copy> _copies;  // that were made before this began
  bool _isBulk = false;
  std::unordered_set<std::uint64_t> _bulkIDs;  // of aliases; folders are in the table
  Instant _bulkStart;
  bool _inTransaction = false;
  Instant _transactionStart;
  std::uint64_t _rankAtBegin = 0;
  std::uint32_t _round = 0;
  bool _inRound = false;
  bool _roundAgain = false;
  std::uint64_t _bulkItems = 0;
  std::uint64_t _scanned = 0;  // folders, in this round
  LocalDaemonStatus::Scan _scanKind = LocalDaemonStatus::Scan::Idle;
  std::unordered_set<FolderKey> _unreadable;
  DirtySet _later;  // what could not be read yet
  int _laterTries = 0;
  // The attributes of rows with ranks from here to there are yet to be read.
  static constexpr char kAttributesRead[] = "attributes read";  // the setting that keeps it
  std::uint64_t _attributesAt = 0;
  std::uint64_t _attributesUntil = 0;
  // The rank before the first row whose hint waits for the others.
  static constexpr std::uint64_t kNothingWaits = ~std::uint64_t{0};
  std::uint64_t _attributesWaiting = kNothingWaits;
  Instant _lastTick;
  Instant _lastSlowRound;
  bool _isBroken = false;  // the index is damaged: nothing is written any more
  Durability _durability = Durability::Soon;
  bool _isOnDisk = false;  // everything that was committed
  std::int64_t _written = 0;
  bool _reload = false;  // a transaction failed: begin anew at the next tick

  // Shared.
  mutable Mutex _mutex;
  CondVar _changed;
  std::vector<Task> _tasks SKEIN_GUARDED_BY(_mutex);
  std::vector<std::shared_ptr<Waiter>> _settling SKEIN_GUARDED_BY(_mutex);
  bool _woken SKEIN_GUARDED_BY(_mutex) = false;
  bool _stop SKEIN_GUARDED_BY(_mutex) = false;
  bool _ended SKEIN_GUARDED_BY(_mutex) = false;
  std::unordered_set<FolderKey> _unwatched SKEIN_GUARDED_BY(_mutex);
  std::string _failure SKEIN_GUARDED_BY(_mutex);
  bool _lacksRoom SKEIN_GUARDED_BY(_mutex) = false;
  LocalDaemonStatus _status SKEIN_GUARDED_BY(_mutex);
  std::atomic<std::uint64_t> _rank{0};
  std::atomic<std::uint64_t> _oldestRank{0};
  std::atomic<bool> _isReadingAttributes{false};
  std::thread _thread;
};

}  // namespace skein::vald
