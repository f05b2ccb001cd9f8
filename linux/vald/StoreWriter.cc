#include "linux/vald/StoreWriter.h"

#include <algorithm>
#include <cstring>

#include "linux/vald/index/IndexFile.h"

namespace skein::vald {
namespace {

using namespace std::chrono_literals;

// How long changes gather before they are decided together.
constexpr auto kGatherWindow = 40ms;
constexpr auto kTransactionLength = 150ms;
constexpr auto kTick = 2s;
constexpr auto kAttributePause = 2ms;
constexpr auto kSlowRound = 30s;
constexpr auto kLongestBulkWait = 10s;
// Beyond this, receivers list afresh rather than hear of every item.
constexpr std::size_t kMostTold = 20'000;
constexpr char kOnDisk[] = "on disk";

std::int64_t millisecondsNow() {
  return std::chrono::duration_cast<std::chrono::milliseconds>(
             std::chrono::system_clock::now().time_since_epoch())
      .count();
}

}  // namespace

// Guarded by the writer's mutex.
struct StoreWriter::Waiter {
  bool isSeen = false;  // the writer has read the kernel's queue for it
  bool isDone = false;
};

StoreWriter::StoreWriter(StoreOptions options, RootFolder drive,
                         std::unique_ptr<SqliteDatabase> database, std::vector<Copy> copies,
                         StoreListener& listener, Log& log)
    : _options(std::move(options)),
      _listener(listener),
      _log(log),
      _database(std::move(database)),
      _watcher(_options.watchBudget, [this] { wake(); }),
      _scanner(_watcher, [this] { wake(); }),
      _index(*_database),
      _disk(_folders),
      _journal(_index, _folders),
      _details(_index, _disk),
      _reconciler(_index, _journal, _folders, _disk, _details, _options.graceWindow,
                  millisecondsNow),
      _drive(std::move(drive)),
      _copies(std::move(copies)) {
  _thread = std::thread([this] { run(); });
}

StoreWriter::~StoreWriter() {
  {
    MutexLock lock(_mutex);
    _stop = true;
  }
  _changed.notifyAll();
  _thread.join();
}

// ---- waiting and the turn of work

void StoreWriter::wake() {
  {
    MutexLock lock(_mutex);
    _woken = true;
  }
  _changed.notifyAll();
}

std::shared_ptr<StoreWriter::Waiter> StoreWriter::post(Task work) {
  auto waiter = std::make_shared<Waiter>();
  MutexLock lock(_mutex);
  if (_stop) return nullptr;
  _tasks.emplace_back([this, waiter, work = std::move(work)]() mutable {
    work();
    MutexLock done(_mutex);
    waiter->isDone = true;
  });
  _changed.notifyAll();
  return waiter;
}

bool StoreWriter::wait(const std::shared_ptr<Waiter>& posted, std::chrono::milliseconds deadline) {
  if (!posted) return false;
  const auto until = std::chrono::steady_clock::now() + deadline;
  MutexLock lock(_mutex);
  while (!posted->isDone && !_ended) {
    if (!_changed.waitUntil(_mutex, until)) break;
  }
  return posted->isDone;
}

bool StoreWriter::settle(std::chrono::milliseconds deadline) {
  const auto until = std::chrono::steady_clock::now() + deadline;
  auto waiter = std::make_shared<Waiter>();
  MutexLock lock(_mutex);
  if (_stop) return false;
  _settling.push_back(waiter);
  _woken = true;
  _changed.notifyAll();
  while (!waiter->isDone && !_ended) {
    if (!_changed.waitUntil(_mutex, until)) break;
  }
  return waiter->isDone;
}

StoreWriter::Instant StoreWriter::nextDeadline() {
  const auto now = std::chrono::steady_clock::now();
  if (_scanner.hasResult() || (_inRound && _scanner.pending() == 0)) return now;
  Instant deadline = _lastTick + kTick;
  if (_inTransaction) deadline = std::min(deadline, _transactionStart + kTransactionLength);
  if (_isReadingAttributes && !_inRound) deadline = std::min(deadline, now + kAttributePause);
  if (!_later.empty()) deadline = std::min(deadline, now + kGatherWindow);
  if (const auto since = _watcher.dirtySince()) {
    deadline = std::min(deadline, _isBulk ? _bulkStart + kLongestBulkWait : *since + kGatherWindow);
  }
  return deadline;
}

void StoreWriter::run() {
  load();
  for (;;) {
    const Instant deadline = nextDeadline();
    {
      MutexLock lock(_mutex);
      while (!_stop && !_woken && _tasks.empty() && std::chrono::steady_clock::now() < deadline) {
        _changed.waitUntil(_mutex, deadline);
      }
      if (_stop) break;
      _woken = false;
    }
    serveTasks();
    if (!_isBroken && !_reload) {
      takeScans();
      takeDirt();
      readSomeAttributes();
    }
    answerSettled();
    tick();
  }
  if (_inTransaction) commit();
  if (!_database->failed()) markIndexClosed(*_database);
  std::vector<Task> unserved;
  {
    MutexLock lock(_mutex);
    _ended = true;
    unserved.swap(_tasks);
  }
  _changed.notifyAll();
}

void StoreWriter::serveTasks() {
  for (;;) {
    Task task;
    {
      MutexLock lock(_mutex);
      if (_tasks.empty()) return;
      task = std::move(_tasks.front());
      _tasks.erase(_tasks.begin());
    }
    if (_inTransaction) commit();
    task();
    _changed.notifyAll();
  }
}

void StoreWriter::takeScans() {
  ScanResult result;
  const auto start = std::chrono::steady_clock::now();
  while (std::chrono::steady_clock::now() - start < 50ms && _scanner.take(result)) {
    begin();
    ++_scanned;
    if (result.snapshot.look == Look::Seen) noteWatch(result.folder, result.isWatched);
    accept(result.folder, result.snapshot, _inRound, true);
    if (_database->failed()) break;
  }
  const bool isDone = _scanner.pending() == 0;
  if (_inTransaction &&
      (isDone || std::chrono::steady_clock::now() - _transactionStart > kTransactionLength)) {
    commit();
  }
  if (_inRound && isDone && !_reload && !_isBroken) finishRound();
}

void StoreWriter::takeDirt() {
  bool isSettling = false;
  {
    MutexLock lock(_mutex);
    for (const auto& waiter : _settling) {
      isSettling = isSettling || !waiter->isSeen;
      waiter->isSeen = true;
    }
  }
  if (isSettling) {
    _watcher.drain();
    std::vector<FolderKey> unwatched;
    {
      MutexLock lock(_mutex);
      unwatched.assign(_unwatched.begin(), _unwatched.end());
    }
    enqueue(unwatched);
  }
  const auto since = _watcher.dirtySince();
  const auto now = std::chrono::steady_clock::now();
  if (_isBulk) {
    if (!since || now - _bulkStart < kLongestBulkWait) return;
    endBulkLoad();
  }
  const bool isDue = since && (isSettling || now - *since >= kGatherWindow);
  if (!isDue && _later.empty()) return;
  DirtySet dirty = _watcher.take();
  for (auto& [folder, names] : std::exchange(_later, {}).folders) {
    dirty.folders[folder].add(std::move(names));
  }
  reconcileDirt(std::move(dirty));
}

void StoreWriter::reconcileDirt(DirtySet dirty) {
  noteLosses(dirty);
  reconcile(dirty);
}

void StoreWriter::noteLosses(const DirtySet& dirty) {
  if (dirty.rootMoved) checkRoots();
  if (dirty.overflow) {
    VL_NOTICE(_log,
              "[NOTICE] changes came faster than they could be read; the store is looked at "
              "as a whole");
    startRound(LocalDaemonStatus::Scan::Rescanning);
  }
}

void StoreWriter::answerSettled() {
  if (_inRound || _isBulk || _inTransaction || !_later.empty() || _scanner.pending() != 0) return;
  {
    MutexLock lock(_mutex);
    if (_settling.empty()) return;
    for (auto waiter = _settling.begin(); waiter != _settling.end();) {
      if ((*waiter)->isSeen) {
        (*waiter)->isDone = true;
        waiter = _settling.erase(waiter);
      } else {
        ++waiter;
        _woken = true;
      }
    }
  }
  _changed.notifyAll();
}

void StoreWriter::tick() {
  const auto now = std::chrono::steady_clock::now();
  if (now - _lastTick < kTick) return;
  _lastTick = now;
  if (_reload && !_isBroken) {
    _database->clearFailure();
    _index.load();
    load();
    return;
  }
  if (!_isOnDisk && !_isBulk && !_inTransaction && !_isBroken) {
    begin(Durability::Now);
    _index.setSetting(kOnDisk, std::to_string(_index.rank()));
    commit();
  }
  checkRoots();
  if (now - _lastSlowRound >= kSlowRound) {
    _lastSlowRound = now;
    std::vector<FolderKey> unwatched;
    {
      MutexLock lock(_mutex);
      unwatched.assign(_unwatched.begin(), _unwatched.end());
    }
    if (!_isBulk) enqueue(unwatched);
  }
  publish();
}

// ---- transactions

void StoreWriter::begin(Durability durability) {
  if (_inTransaction) return;
  if (durability != _durability) {
    _durability = durability;
    _database->execute(durability == Durability::Now ? "PRAGMA synchronous = FULL"
                                                     : "PRAGMA synchronous = NORMAL");
  }
  _database->begin();
  _inTransaction = true;
  _transactionStart = std::chrono::steady_clock::now();
  _rankAtBegin = _index.rank();
}

void StoreWriter::checkpointAfter(int pages) {
  _database->execute(("PRAGMA wal_autocheckpoint = " + std::to_string(pages)).c_str());
}

bool StoreWriter::commit() {
  if (!_inTransaction) return true;
  _inTransaction = false;
  _journal.finish(_options.journalRetention);
  if (!_database->commit()) {
    fail();
    return false;
  }
  _isOnDisk = _durability == Durability::Now || (_isOnDisk && _database->written() == _written);
  _written = _database->written();
  publish();
  const auto changes = _journal.takeChanges();
  if (changes.size() > kMostTold) {
    _listener.storeDidOverflow(std::nullopt);
  } else if (!changes.empty()) {
    _listener.storeDidChange(changes);
  }
  return true;
}

void StoreWriter::fail() {
  const int code = _database->code();
  VL_ERROR(_log, "[ERROR] the index could not be written: %@", _database->message());
  _database->rollback();
  _journal.discard();
  _reconciler.forget();
  _scanner.clear();
  _later = {};
  _inRound = false;
  _isBulk = false;
  _reload = true;
  std::string failure = "the index cannot be written (" + _database->message() + ")";
  if (code == SQLITE_CORRUPT || code == SQLITE_NOTADB) {
    _isBroken = true;
    markIndexFileDamaged(_options.databasePath);
    failure = "the index is damaged; stop and start vald to have it made anew";
    VL_CRIT(_log, "[CRIT] %@", failure);
  }
  note(std::move(failure));
  {
    MutexLock lock(_mutex);
    _lacksRoom = code == SQLITE_FULL;
  }
  // Then it is tried again at once.
  if (code == SQLITE_FULL && _options.makeRoom && _options.makeRoom()) _lastTick -= kTick;
}

void StoreWriter::note(std::string failure) {
  MutexLock lock(_mutex);
  _failure = std::move(failure);
}

void StoreWriter::publish() {
  _rank = _index.rank();
  _oldestRank = _index.oldestRank();
  std::string reason;
  for (const auto& [folder, root] : _folders.roots()) {
    if (!root.isLost) continue;
    reason += (reason.empty() ? "" : "; ") + root.folder.path +
              " is missing (deleted, renamed or unmounted)";
  }
  LocalDaemonStatus status;
  const ItemCounts& counts = _index.counts();
  status.store = _options.drive.path;
  status.documents = counts.documents;
  status.folders = counts.folders;
  status.aliases = counts.aliases;
  status.scan = _scanKind;
  status.scannedFolders = _scanKind != LocalDaemonStatus::Scan::Idle ? _scanned : 0;
  status.pendingFolders = _scanner.pending();
  status.unreadableFolders = _unreadable.size();
  status.watches = _watcher.count();
  status.watchBudget = _watcher.budget();
  status.overflows = _watcher.overflows();
  status.rank = _index.rank();
  status.oldestTokenRank = _index.oldestRank();
  const std::string shortage = _watcher.shortage();
  MutexLock lock(_mutex);
  if (!_unwatched.empty()) reason += (reason.empty() ? "" : "; ") + shortage;
  if (!_failure.empty()) reason += (reason.empty() ? "" : "; ") + _failure;
  status.watch =
      reason.empty() ? LocalDaemonStatus::Watch::Complete : LocalDaemonStatus::Watch::Degraded;
  status.watchReason = reason;
  _status = std::move(status);
}

void StoreWriter::status(LocalDaemonStatus& status) {
  LocalDaemonStatus known;
  {
    MutexLock lock(_mutex);
    known = _status;
  }
  known.processID = status.processID;
  known.senders = status.senders;
  known.account = status.account;
  status = std::move(known);
}

bool StoreWriter::isUnwatched(FolderKey folder) const {
  MutexLock lock(_mutex);
  return _unwatched.contains(folder);
}

bool StoreWriter::lacksRoom() const {
  MutexLock lock(_mutex);
  return _lacksRoom;
}

std::string StoreWriter::failure() const {
  MutexLock lock(_mutex);
  return _failure;
}

bool StoreWriter::setSetting(const std::string& key, const std::optional<std::string>& value) {
  // Durability cannot change inside a transaction, so a bulk load's ends first.
  if (!commit()) return false;
  begin(Durability::Now);
  _index.setSetting("value " + key, value);
  return commit();
}

}  // namespace skein::vald
