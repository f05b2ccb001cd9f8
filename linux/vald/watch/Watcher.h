#pragma once

#include <atomic>
#include <chrono>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <thread>
#include <unordered_map>
#include <unordered_set>
#include <vector>

#include "base/Mutex.h"
#include "linux/protocol/FileDescriptor.h"
#include "linux/vald/index/Rows.h"

namespace skein::vald {

// What changed in one folder: some names, or so much that it is to be read as a whole.
struct DirtyFolder {
  bool whole = false;
  std::unordered_set<std::string> names;

  void add(DirtyFolder other) {
    whole = whole || other.whole;
    names.merge(other.names);
  }
};

struct DirtySet {
  std::unordered_map<FolderKey, DirtyFolder> folders;
  bool overflow = false;   // events were lost: look at everything
  bool rootMoved = false;  // a root was deleted, renamed or unmounted

  bool empty() const { return folders.empty() && !overflow && !rootMoved; }
};

// The store's folders under inotify, as many as the budget allows. A thread of its own
// empties the kernel's queue into a set of names to look at, so that the queue overflows
// only when events come faster than they can be read. Any thread.
class Watcher {
 public:
  // `budget` 0: what the system allows this user, less a tenth for others. `wake` is
  // called, under no lock, when there is something to take.
  Watcher(std::uint64_t budget, std::function<void()> wake);
  ~Watcher();

  // Whether the folder (an open descriptor of it) is watched now. False: the budget is
  // spent, or the system refused; see shortage().
  bool watch(FolderKey folder, int descriptor) SKEIN_EXCLUDES(_mutex);
  void unwatch(FolderKey folder) SKEIN_EXCLUDES(_mutex);
  // Ends every watch.
  void clear() SKEIN_EXCLUDES(_mutex);
  bool isWatched(FolderKey folder) const SKEIN_EXCLUDES(_mutex);
  // Some watched folder that `mayLose` allows, to give its watch to another.
  std::optional<FolderKey> victim(const std::function<bool(FolderKey)>& mayLose) const
      SKEIN_EXCLUDES(_mutex);

  // Reads the kernel's queue until it is empty, on this thread.
  void drain() SKEIN_EXCLUDES(_mutex);
  // What is dirty, and forgets it.
  DirtySet take() SKEIN_EXCLUDES(_mutex);
  // Whether something that is not taken yet may have changed the folder.
  bool isDirty(FolderKey folder) const SKEIN_EXCLUDES(_mutex);
  // When the oldest untaken event was read; nil when there is none.
  std::optional<std::chrono::steady_clock::time_point> dirtySince() const SKEIN_EXCLUDES(_mutex);

  std::uint64_t budget() const { return _budget; }
  std::uint64_t count() const SKEIN_EXCLUDES(_mutex);
  std::uint64_t overflows() const { return _overflows.load(); }
  // In words, why folders are unwatched; empty while nothing was refused.
  std::string shortage() const SKEIN_EXCLUDES(_mutex);

  // For tests: while on, events are thrown away as the kernel does when its queue is full;
  // then the overflow is told.
  void loseEvents(bool on) SKEIN_EXCLUDES(_mutex);

 private:
  void run();
  void note(int watch, std::uint32_t mask, const char* name) SKEIN_REQUIRES(_mutex);
  bool drainLocked() SKEIN_REQUIRES(_mutex);

  const std::function<void()> _wake;
  std::uint64_t _budget;
  FileDescriptor _inotify;
  FileDescriptor _stop;
  std::atomic<std::uint64_t> _overflows{0};

  mutable Mutex _mutex;
  std::unordered_map<int, FolderKey> _folderByWatch SKEIN_GUARDED_BY(_mutex);
  std::unordered_map<FolderKey, int> _watchByFolder SKEIN_GUARDED_BY(_mutex);
  DirtySet _dirty SKEIN_GUARDED_BY(_mutex);
  std::optional<std::chrono::steady_clock::time_point> _dirtySince SKEIN_GUARDED_BY(_mutex);
  std::string _shortage SKEIN_GUARDED_BY(_mutex);
  bool _losing SKEIN_GUARDED_BY(_mutex) = false;
  std::thread _thread;
};

}  // namespace skein::vald
