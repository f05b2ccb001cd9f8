#include "linux/vald/UploadFeed.h"

#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <utility>

namespace skein::vald {
namespace {

using namespace std::chrono_literals;
using Uploads = LocalCloudStatus::Uploads;

constexpr std::size_t kAtOnce = 64;
constexpr std::size_t kMostPending = 128;
constexpr std::size_t kMostRemembered = 10'000;
constexpr auto kPause = 500ms;
constexpr auto kUploadWindow = 20ms;
// How soon uploads begin that somebody agreed to: a file is looked at until then.
constexpr auto kUntilAskedAgain = 1s;
// What died may come back under its number: in a save, or in the trash.
constexpr auto kMourning = 10s;

std::int64_t nanoseconds(NSDate date) { return date.time_since_epoch().count(); }

}  // namespace

UploadFeed::UploadFeed(Parts parts) : _parts(std::move(parts)) {}

UploadFeed::~UploadFeed() { stop(); }

void UploadFeed::start(Uploader& uploader) {
  _uploader = &uploader;
  _thread = std::thread([this] { run(); });
}

void UploadFeed::stop() {
  {
    MutexLock lock(_mutex);
    _stop = true;
  }
  _changed.notifyAll();
  if (_thread.joinable()) _thread.join();
}

void UploadFeed::poke() {
  {
    MutexLock lock(_mutex);
    _poked = true;
  }
  _changed.notifyAll();
}

void UploadFeed::storeDidChange(const std::vector<StoreChange>& changes) {
  bool isOfFile = false;
  {
    MutexLock lock(_mutex);
    for (const StoreChange& change : changes) {
      isOfFile = isOfFile || change.isOfFile;
      if (change.item->isDead() && !change.item->fileObjectID().isFolderOrAliasID()) {
        _dead.emplace_back(std::chrono::steady_clock::now() + kMourning,
                           change.item->fileObjectID());
      }
    }
  }
  if (isOfFile) poke();
}

void UploadFeed::storeDidOverflow() { poke(); }

void UploadFeed::uploadStateDidChange(VLFileObjectID document, const UploadState& state) {
  if (state.phase == UploadState::Phase::Uploaded) _parts.didUpload(document);
  {
    MutexLock lock(_mutex);
    if (state.phase == UploadState::Phase::Uploaded && state.stamp) {
      FileState file;
      file.key.inode = state.stamp->inode;
      file.size = state.stamp->size;
      file.modified = nanoseconds(state.stamp->modified);
      file.changed = nanoseconds(state.stamp->changed);
      _uploaded.push_back({document, file});
    }
    if (state.error) _lastFailure = state.error->localizedDescription();
    _poked = true;
  }
  _changed.notifyAll();
}

std::string UploadFeed::whyNot(VLFileObjectID document) {
  if (_parts.policy.uploads == Uploads::Off) {
    return "uploads are switched off (set SKEIN_UPLOADS for vald)";
  }
  if (!isAllowed()) {
    return "nobody has agreed to uploads of this drive yet (skein cloud uploads on)";
  }
  MutexLock lock(_mutex);
  if (!_leftOut.contains(document)) return {};
  return "the cloud on this machine has reached its bound of " +
         std::to_string(_parts.policy.limit >> 20) + " MiB (set SKEIN_UPLOADS for vald)";
}

std::uint64_t UploadFeed::leftOut() const {
  MutexLock lock(_mutex);
  return _leftOut.size();
}

std::string UploadFeed::lastFailure() const {
  MutexLock lock(_mutex);
  return _lastFailure;
}

// ---- the thread

void UploadFeed::run() {
  // Everything else comes first, the disk's time included.
  const auto self = static_cast<id_t>(syscall(SYS_gettid));
  setpriority(PRIO_PROCESS, self, 19);
  for (;;) {
    const bool allowed = _parts.policy.uploads == Uploads::Off || isAllowed();
    {
      MutexLock lock(_mutex);
      while (!_stop && !_poked) {
        if (!allowed) {
          if (!_changed.waitUntil(_mutex, std::chrono::steady_clock::now() + kUntilAskedAgain)) {
            break;
          }
        } else if (_dead.empty()) {
          _changed.wait(_mutex);
        } else if (!_changed.waitUntil(_mutex, _dead.front().first)) {
          break;
        }
      }
      if (_stop) return;
      _poked = false;
    }
    tellStore();
    forgetDead();
    tellUploader();
    // What comes in quick succession is told together.
    pause(kUploadWindow);
  }
}

void UploadFeed::pause(std::chrono::milliseconds time) {
  MutexLock lock(_mutex);
  const auto until = std::chrono::steady_clock::now() + time;
  while (!_stop && _changed.waitUntil(_mutex, until)) {
  }
}

void UploadFeed::tellStore() {
  std::vector<UploadedFile> uploaded;
  {
    MutexLock lock(_mutex);
    uploaded.swap(_uploaded);
  }
  if (!uploaded.empty()) _parts.store.noteUploads(std::move(uploaded));
}

void UploadFeed::forgetDead() {
  std::vector<VLFileObjectID> due;
  {
    MutexLock lock(_mutex);
    const auto now = std::chrono::steady_clock::now();
    while (!_dead.empty() && _dead.front().first <= now) {
      due.push_back(_dead.front().second);
      _dead.pop_front();
    }
  }
  for (const VLFileObjectID document : due) {
    NSErrorPtr error;
    if (_parts.store.itemWithID(document, &error)) continue;
    const bool isGone =
        error && error->domain() == NSCocoaErrorDomain && error->code() == NSFileNoSuchFileError;
    if (!isGone) continue;
    error = _uploader->documentWasRemoved(document);
    if (error) {
      VL_ERROR(_parts.log, "[ERROR] the cloud still has %@, which is gone: %@", document.asString(),
               error->localizedDescription());
    }
  }
}

bool UploadFeed::mayUpload(const FolderStore::Unsettled& document) {
  if (_parts.policy.uploads != Uploads::Bounded) return true;
  // What may be the only copy of something makes room for nothing.
  const auto kept = _parts.records.kept();
  const std::uint64_t used = _parts.records.usedBytes() + (kept ? kept->givenUpBytes : 0);
  const auto record = _parts.records.record(document.id);
  MutexLock lock(_mutex);
  // What is there already is looked at again in any case.
  const bool isKnown = record && *record;
  if (!isKnown && used + _promisedBytes + document.size > _parts.policy.limit) {
    if (_leftOut.size() < kMostRemembered) _leftOut.insert(document.id);
    return false;
  }
  _leftOut.erase(document.id);
  if (!isKnown) _promisedBytes += document.size;
  return true;
}

void UploadFeed::tellUploader() {
  if (_parts.policy.uploads == Uploads::Off || !isAllowed()) return;
  LocalDaemonStatus status;
  _parts.store.status(status);
  if (status.scan != LocalDaemonStatus::Scan::Idle) {
    pause(kPause);
    poke();
    return;
  }
  for (;;) {
    {
      MutexLock lock(_mutex);
      if (_stop) return;
    }
    const std::size_t pending = _uploader->pending();
    if (pending == 0) {
      MutexLock lock(_mutex);
      _promisedBytes = 0;  // by now it is in what the records say, or failed
    }
    if (pending >= kMostPending) return;  // the end of one of them wakes this
    const std::uint64_t before = _rank;
    for (FolderStore::Unsettled& document : _parts.store.unsettledAfter(_rank, kAtOnce)) {
      if (mayUpload(document)) _uploader->documentDidChange(document.id, std::move(document.path));
    }
    if (_rank == before) return;
  }
}

}  // namespace skein::vald
