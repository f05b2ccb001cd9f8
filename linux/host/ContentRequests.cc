#include "linux/host/ContentRequests.h"

#include <cerrno>
#include <utility>

#include "linux/framework/EvictionOutcome.h"
#include "platform/foundation/NSFileCoordinatorReadingOptions.h"
#include "vellum/VLErrors.h"

namespace skein {

std::shared_ptr<ContentRequests::Want> ContentRequests::provide(const NSURLPtr& url,
                                                                bool currentVersion, Done done) {
  const std::string path = url->path();
  Round toStart;
  std::shared_ptr<RequestProgress> progress;
  std::uint64_t number = 0;
  bool isFirst = false;
  {
    MutexLock lock(_mutex);
    number = ++_lastNumber;
    const auto [at, added] = _entries.try_emplace(path);
    Entry& entry = at->second;
    isFirst = added;
    const bool joins = !entry.takesNobody && (!currentVersion || entry.running.currentVersion);
    Round& round = isFirst || joins ? entry.running : entry.next;
    if (isFirst) entry.url = url;
    round.currentVersion = round.currentVersion || currentVersion;
    round.wants.emplace(number, std::move(done));
    progress = round.progress;
    toStart.currentVersion = round.currentVersion;
    toStart.progress = progress;
  }
  auto want = std::make_shared<Want>(shared_from_this(), path, number, progress);
  if (isFirst) start(path, url, toStart);
  return want;
}

void ContentRequests::start(const std::string& path, const NSURLPtr& url, const Round& round) {
  const RequestProgressScope scope(round.progress);
  _extension.startProvidingItemAtURL(
      url, round.currentVersion ? NSFileCoordinatorReadingAlwaysFetches : 0,
      [self = shared_from_this(), path](const NSErrorPtr& error) {
        self->didProvide(path, error);
      });
}

void ContentRequests::didProvide(const std::string& path, const NSErrorPtr& error) {
  std::map<std::uint64_t, Done> answered;
  NSURLPtr url;
  Round toStart;
  {
    MutexLock lock(_mutex);
    const auto at = _entries.find(path);
    if (at == _entries.end()) return;
    answered = std::move(at->second.running.wants);
    url = beginNext(at, toStart);
  }
  for (auto& [number, done] : answered) done(error);
  if (url) start(path, url, toStart);
}

NSURLPtr ContentRequests::beginNext(std::map<std::string, Entry>::iterator at, Round& toStart) {
  Entry& entry = at->second;
  if (entry.next.wants.empty()) {
    _entries.erase(at);
    return nullptr;
  }
  entry.running = std::exchange(entry.next, {});
  entry.takesNobody = false;
  toStart.currentVersion = entry.running.currentVersion;
  toStart.progress = entry.running.progress;
  return entry.url;
}

NSErrorPtr ContentRequests::evict(const NSURLPtr& url) {
  const std::string path = url->path();
  const auto busy = [&path] {
    return vl_errorWithPOSIXCode(EBUSY, path +
                                            " is being fetched or given up just now; wait for "
                                            "that or interrupt it, then try again.");
  };
  {
    MutexLock lock(_mutex);
    const auto [at, isFree] = _entries.try_emplace(path);
    if (!isFree) return busy();
    at->second.url = url;
    at->second.takesNobody = true;
  }
  NSErrorPtr error;
  {
    const EvictionOutcomeScope outcome;
    _extension.stopProvidingItemAtURL(url);
    error = outcome.wasAsked() ? outcome.error() : busy();
  }
  NSURLPtr next;
  Round toStart;
  {
    MutexLock lock(_mutex);
    next = beginNext(_entries.find(path), toStart);
  }
  if (next) start(path, next, toStart);
  return error;
}

void ContentRequests::giveUp(const std::string& path, std::uint64_t number) {
  Done dropped;
  std::shared_ptr<RequestProgress> toCancel;
  {
    MutexLock lock(_mutex);
    const auto at = _entries.find(path);
    if (at == _entries.end()) return;
    Entry& entry = at->second;
    for (Round* round : {&entry.running, &entry.next}) {
      if (const auto want = round->wants.find(number); want != round->wants.end()) {
        dropped = std::move(want->second);
        round->wants.erase(want);
      }
    }
    if (!dropped || entry.takesNobody || !entry.running.wants.empty()) return;
    entry.takesNobody = true;
    toCancel = entry.running.progress;
  }
  toCancel->cancel();
}

}  // namespace skein
