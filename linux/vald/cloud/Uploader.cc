#include "linux/vald/cloud/Uploader.h"

#include <algorithm>
#include <map>
#include <set>
#include <utility>

#include "base/Mutex.h"
#include "linux/vald/cloud/CloudErrors.h"

namespace skein::vald {

using Phase = UploadState::Phase;

// Shared, since the clock's timers may come when the uploader is gone.
struct Uploader::Core : std::enable_shared_from_this<Core> {
  using Time = CloudClock::Duration;

  // A document that is not uploaded, or may not be. One that is has no entry: the records
  // know it, and there may be a million of them.
  struct Entry {
    std::string path;
    UploadState state;
    Time due{};                                  // while waiting
    std::uint64_t change = 0;                    // counts what was told
    std::shared_ptr<Cancellation> cancellation;  // while uploading
    bool removed = false;                        // while uploading: the record is to go
  };
  using Entries = std::map<VLFileObjectID, Entry>;

  Core(UploadServices given, UploadListener& hears, Options chosen)
      : services(given), listener(hears), options(chosen) {}

  void setDue(VLFileObjectID document, Entry& entry, Time due) SKEIN_REQUIRES(mutex) {
    waiting.erase({entry.due, document});
    entry.due = due;
    entry.state.phase = Phase::Waiting;
    waiting.emplace(due, document);
  }

  // Starts what is due, or sees to it that the timer comes when something is. Posting and
  // setting a timer under the lock: neither runs anything.
  void sweep() SKEIN_EXCLUDES(mutex) {
    MutexLock lock(mutex);
    const Time now = services.clock.now();
    while (!stopped && !waiting.empty() && waiting.begin()->first <= now) {
      if (offline && (probing || now < offlineUntil)) break;
      probing = offline;
      const VLFileObjectID document = waiting.begin()->second;
      waiting.erase(waiting.begin());
      Entry& entry = entries.at(document);
      entry.state = {Phase::Uploading, std::nullopt, nullptr};
      entry.cancellation = std::make_shared<Cancellation>();
      runner->post([this, document, probe = probing] { upload(document, probe); });
    }
    if (stopped || waiting.empty() || (offline && probing)) return;
    const Time next =
        offline ? std::max(offlineUntil, waiting.begin()->first) : waiting.begin()->first;
    if (armed && *armed <= next) return;
    armed = next;
    services.clock.callAfter(next - now, [core = weak_from_this(), next] {
      if (const auto self = core.lock()) self->timerDidCome(next);
    });
  }

  void timerDidCome(Time due) SKEIN_EXCLUDES(mutex) {
    {
      MutexLock lock(mutex);
      if (armed == due) armed = std::nullopt;
    }
    sweep();
  }

  // On a thread of the executor's.
  void upload(VLFileObjectID document, bool probe) SKEIN_EXCLUDES(mutex) {
    std::string path;
    std::uint64_t change = 0;
    std::shared_ptr<Cancellation> cancellation;
    {
      MutexLock lock(mutex);
      const Entry& entry = entries.at(document);
      path = entry.path;
      change = entry.change;
      cancellation = entry.cancellation;
    }
    listener.uploadStateDidChange(document, {Phase::Uploading, std::nullopt, nullptr});
    const UploadResult result =
        attemptUpload(services, document, path, options.settle, *cancellation);
    if (const auto state = finish(document, change, probe, result)) {
      listener.uploadStateDidChange(document, *state);
    }
    sweep();
  }

  // Nil when there is nobody to tell any more.
  std::optional<UploadState> finish(VLFileObjectID document, std::uint64_t change, bool probe,
                                    const UploadResult& result) SKEIN_EXCLUDES(mutex) {
    const auto* error = std::get_if<NSErrorPtr>(&result);
    bool removed = false;
    std::optional<UploadState> state;
    {
      MutexLock lock(mutex);
      noteReachability(error != nullptr && isOffline(*error),
                       std::holds_alternative<UploadDone>(result), probe);
      Entry& entry = entries.at(document);
      entry.cancellation = nullptr;
      removed = entry.removed;
      if (removed && entry.change == change) {
        entries.erase(document);
      } else {
        // Told of again after it was removed, it is a new document of the same number.
        entry.removed = false;
        state = settleState(document, entry, change, result);
        if (state && state->phase == Phase::Uploaded) entries.erase(document);
        if (stopped) state = std::nullopt;
      }
    }
    // Once more: the upload may have written it after documentWasRemoved() did this.
    if (removed) services.records.remove(document);
    return state;
  }

  UploadState settleState(VLFileObjectID document, Entry& entry, std::uint64_t change,
                          const UploadResult& result) SKEIN_REQUIRES(mutex) {
    const Time now = services.clock.now();
    const auto* error = std::get_if<NSErrorPtr>(&result);
    if (entry.change != change) {
      setDue(document, entry, std::max(entry.due, now));
    } else if (const auto* done = std::get_if<UploadDone>(&result)) {
      entry.state = {Phase::Uploaded, done->stamp, nullptr};
    } else if (const auto* early = std::get_if<UploadTooEarly>(&result)) {
      setDue(document, entry, now + early->wait);
    } else if (isOffline(*error)) {
      setDue(document, entry, now);
      entry.state.error = *error;
    } else {
      entry.state = {Phase::Failed, std::nullopt, *error};
    }
    return entry.state;
  }

  void noteReachability(bool unreachable, bool reached, bool probe) SKEIN_REQUIRES(mutex) {
    if (probe) probing = false;
    // What was begun before the cloud went away says nothing about now; nor does a probe
    // that came to its end without asking the cloud: the next one follows at once.
    if (probe && reached) offline = false;
    if (!unreachable || (offline && !probe)) return;
    pause = offline ? std::min(2 * pause, options.longestPause) : options.shortestPause;
    offline = true;
    offlineUntil = services.clock.now() + pause;
  }

  const UploadServices services;
  UploadListener& listener;
  const Options options;
  std::unique_ptr<BoundedRunner> runner;  // set once, before anything is told

  Mutex mutex;
  bool stopped SKEIN_GUARDED_BY(mutex) = false;
  Entries entries SKEIN_GUARDED_BY(mutex);
  std::set<std::pair<Time, VLFileObjectID>> waiting SKEIN_GUARDED_BY(mutex);
  std::optional<Time> armed SKEIN_GUARDED_BY(mutex);  // when the timer comes
  // The cloud could not be reached: until it was, one document is tried at a time.
  bool offline SKEIN_GUARDED_BY(mutex) = false;
  bool probing SKEIN_GUARDED_BY(mutex) = false;
  Time pause SKEIN_GUARDED_BY(mutex){};
  Time offlineUntil SKEIN_GUARDED_BY(mutex){};
};

Uploader::Uploader(UploadServices services, UploadListener& listener,
                   std::shared_ptr<Executor> executor, Options options)
    : _core(std::make_shared<Core>(services, listener, options)) {
  _core->runner = std::make_unique<BoundedRunner>(std::move(executor), options.limit);
}

Uploader::~Uploader() {
  std::vector<std::shared_ptr<Cancellation>> running;
  {
    MutexLock lock(_core->mutex);
    _core->stopped = true;
    for (const auto& [document, entry] : _core->entries) {
      if (entry.cancellation != nullptr) running.push_back(entry.cancellation);
    }
  }
  for (const auto& cancellation : running) cancellation->cancel();
  _core->runner.reset();
}

void Uploader::documentDidChange(VLFileObjectID document, std::string path) {
  std::shared_ptr<Cancellation> running;
  {
    MutexLock lock(_core->mutex);
    Core::Entry& entry = _core->entries[document];
    entry.path = std::move(path);
    ++entry.change;
    const auto due = _core->services.clock.now() + _core->options.settle;
    running = entry.cancellation;
    if (running != nullptr) {
      entry.due = due;  // taken up when the upload has ended
    } else {
      entry.state = {};
      _core->setDue(document, entry, due);
    }
  }
  if (running != nullptr) running->cancel();
  _core->sweep();
}

NSErrorPtr Uploader::documentWasRemoved(VLFileObjectID document) {
  std::shared_ptr<Cancellation> running;
  {
    MutexLock lock(_core->mutex);
    const auto found = _core->entries.find(document);
    if (found != _core->entries.end()) {
      running = found->second.cancellation;
      if (running != nullptr) {
        found->second.removed = true;
      } else {
        _core->waiting.erase({found->second.due, document});
        _core->entries.erase(found);
      }
    }
  }
  if (running != nullptr) running->cancel();
  return _core->services.records.remove(document);
}

Outcome<std::optional<UploadState>> Uploader::state(VLFileObjectID document) {
  {
    MutexLock lock(_core->mutex);
    const auto found = _core->entries.find(document);
    if (found != _core->entries.end()) return std::optional(found->second.state);
  }
  const auto stamp = _core->services.records.stamp(document);
  if (!stamp) return stamp.error();
  if (!*stamp) return std::optional<UploadState>();
  return std::optional(UploadState{Phase::Uploaded, *stamp, nullptr});
}

std::size_t Uploader::pending() {
  MutexLock lock(_core->mutex);
  return static_cast<std::size_t>(
      std::count_if(_core->entries.begin(), _core->entries.end(),
                    [](const auto& entry) { return entry.second.state.phase != Phase::Failed; }));
}

std::vector<std::pair<VLFileObjectID, UploadState>> Uploader::failures() {
  std::vector<std::pair<VLFileObjectID, UploadState>> failed;
  MutexLock lock(_core->mutex);
  for (const auto& [document, entry] : _core->entries) {
    if (entry.state.error != nullptr) failed.emplace_back(document, entry.state);
  }
  return failed;
}

void Uploader::retry() {
  {
    MutexLock lock(_core->mutex);
    const auto now = _core->services.clock.now();
    _core->offline = false;
    for (auto& [document, entry] : _core->entries) {
      if (entry.state.error != nullptr) _core->setDue(document, entry, now);
    }
  }
  _core->sweep();
}

}  // namespace skein::vald
