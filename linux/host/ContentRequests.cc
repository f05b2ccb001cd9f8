#include "linux/host/ContentRequests.h"

#include <utility>

#include "platform/foundation/NSFileCoordinatorReadingOptions.h"

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
    const bool joins = !entry.stopping && (!currentVersion || entry.running.currentVersion);
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
  {
    const RequestProgressScope scope(round.progress);
    _extension.startProvidingItemAtURL(
        url, round.currentVersion ? NSFileCoordinatorReadingAlwaysFetches : 0,
        [self = shared_from_this(), path](const NSErrorPtr& error) {
          self->didProvide(path, error);
        });
  }
  bool stop = false;
  {
    MutexLock lock(_mutex);
    const auto at = _entries.find(path);
    // A round that is over, or another one by now, is not this call's to stop.
    if (at == _entries.end() || at->second.running.progress != round.progress) return;
    at->second.started = true;
    stop = at->second.stopping;
  }
  if (stop) _extension.stopProvidingItemAtURL(url);
}

void ContentRequests::didProvide(const std::string& path, const NSErrorPtr& error) {
  std::map<std::uint64_t, Done> answered;
  NSURLPtr url;
  Round toStart;
  {
    MutexLock lock(_mutex);
    const auto at = _entries.find(path);
    if (at == _entries.end()) return;
    Entry& entry = at->second;
    answered = std::move(entry.running.wants);
    if (entry.next.wants.empty()) {
      _entries.erase(at);
    } else {
      url = entry.url;
      entry.running = std::exchange(entry.next, {});
      entry.started = entry.stopping = false;
      toStart.currentVersion = entry.running.currentVersion;
      toStart.progress = entry.running.progress;
    }
  }
  for (auto& [number, done] : answered) done(error);
  if (url) start(path, url, toStart);
}

void ContentRequests::giveUp(const std::string& path, std::uint64_t number) {
  Done dropped;
  NSURLPtr toStop;
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
    if (!dropped || entry.stopping || !entry.running.wants.empty()) return;
    entry.stopping = true;
    if (entry.started) toStop = entry.url;
  }
  if (toStop) _extension.stopProvidingItemAtURL(toStop);
}

}  // namespace skein
