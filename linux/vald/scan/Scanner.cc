#include "linux/vald/scan/Scanner.h"

#include <iterator>

namespace skein::vald {
namespace {
// About 10 MB.
constexpr std::size_t kMostWaitingEntries = 60'000;
}  // namespace

Scanner::Scanner(Watcher& watcher, std::function<void()> wake)
    : _watcher(watcher), _wake(std::move(wake)), _thread([this] { run(); }) {}

Scanner::~Scanner() {
  {
    MutexLock lock(_mutex);
    _stop = true;
  }
  _changed.notifyAll();
  _thread.join();
}

void Scanner::add(std::vector<ScanJob> jobs) {
  {
    MutexLock lock(_mutex);
    // The last is taken first: reversed, they are read in their order.
    _jobs.insert(_jobs.end(), std::make_move_iterator(jobs.rbegin()),
                 std::make_move_iterator(jobs.rend()));
  }
  _changed.notifyAll();
}

bool Scanner::take(ScanResult& result) {
  {
    MutexLock lock(_mutex);
    if (_results.empty()) return false;
    result = std::move(_results.front());
    _results.pop_front();
    _waitingEntries -= result.snapshot.entries.size();
  }
  _changed.notifyAll();
  return true;
}

bool Scanner::hasResult() const {
  MutexLock lock(_mutex);
  return !_results.empty();
}

std::size_t Scanner::pending() const {
  MutexLock lock(_mutex);
  return _jobs.size() + _results.size() + (_isReading ? 1 : 0);
}

void Scanner::clear() {
  MutexLock lock(_mutex);
  _jobs.clear();
}

void Scanner::run() {
  for (;;) {
    ScanJob job;
    {
      MutexLock lock(_mutex);
      while (!_stop && (_jobs.empty() || _waitingEntries > kMostWaitingEntries)) {
        _changed.wait(_mutex);
      }
      if (_stop) return;
      job = std::move(_jobs.back());
      _jobs.pop_back();
      _isReading = true;
    }
    ScanResult result;
    result.folder = job.folder;
    FileDescriptor folder;
    int error = 0;
    const Look look = openFolder(job.root, job.relativePath, job.key, folder, error);
    if (look == Look::Seen) {
      result.isWatched = _watcher.watch(job.folder, folder.get());
      result.snapshot = readFolder(folder.get(), Detail::Quick);
    } else {
      result.snapshot.look = look;
      result.snapshot.error = error;
    }
    bool wake = false;
    {
      MutexLock lock(_mutex);
      _isReading = false;
      wake = _results.empty();
      _waitingEntries += result.snapshot.entries.size();
      _results.push_back(std::move(result));
    }
    if (wake) _wake();
  }
}

}  // namespace skein::vald
