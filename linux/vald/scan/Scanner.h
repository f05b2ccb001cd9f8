#pragma once

#include <atomic>
#include <cstdint>
#include <deque>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include "base/Mutex.h"
#include "linux/vald/scan/FolderReader.h"
#include "linux/vald/watch/Watcher.h"

namespace skein::vald {

struct ScanJob {
  FolderKey folder = kNoFolder;
  RootFolder root;
  std::string relativePath;
  FileKey key;
};

struct ScanResult {
  FolderKey folder = kNoFolder;
  bool isWatched = false;
  FolderSnapshot snapshot;
};

// Reads folders on a thread of its own, each watched before it is read, so that nothing
// that changes meanwhile goes unseen. Works depth first, which keeps the list of what is
// to do short, and stops while too many results wait to be taken. Any thread.
class Scanner {
 public:
  // `wake` is called, under no lock, when there is a result and there was none.
  Scanner(Watcher& watcher, std::function<void()> wake);
  ~Scanner();

  void add(std::vector<ScanJob> jobs) SKEIN_EXCLUDES(_mutex);
  // The next result; false when there is none yet.
  bool take(ScanResult& result) SKEIN_EXCLUDES(_mutex);
  bool hasResult() const SKEIN_EXCLUDES(_mutex);
  // Folders that were added and whose results were not taken yet.
  std::size_t pending() const SKEIN_EXCLUDES(_mutex);
  // Forgets what is to do; results under way still come.
  void clear() SKEIN_EXCLUDES(_mutex);

 private:
  void run();

  Watcher& _watcher;
  const std::function<void()> _wake;
  mutable Mutex _mutex;
  CondVar _changed;
  std::vector<ScanJob> _jobs SKEIN_GUARDED_BY(_mutex);
  std::deque<ScanResult> _results SKEIN_GUARDED_BY(_mutex);
  std::size_t _waitingEntries SKEIN_GUARDED_BY(_mutex) = 0;
  bool _isReading SKEIN_GUARDED_BY(_mutex) = false;
  bool _stop SKEIN_GUARDED_BY(_mutex) = false;
  std::thread _thread;
};

}  // namespace skein::vald
