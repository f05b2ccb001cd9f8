#include "linux/vald/CollectionRounds.h"

#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <utility>

#include "linux/vald/cloud/CloudErrors.h"

namespace skein::vald {
namespace {

using namespace std::chrono_literals;

constexpr auto kAfterStart = 1min;
constexpr auto kBetweenRounds = 24h;
// Each round looks at the whole drive, so it is not done for every document that is saved.
constexpr auto kLeastBetweenRounds = 10min;
constexpr auto kBetweenMeasures = 1min;
constexpr auto kScanPause = 10s;

// Everything else comes first, the disk's time included.
void takeLowestPriority() {
  const auto self = static_cast<id_t>(syscall(SYS_gettid));
  setpriority(PRIO_PROCESS, self, 19);
  constexpr int kProcess = 1;
  constexpr int kIdleClass = 3 << 13;
  syscall(SYS_ioprio_set, kProcess, static_cast<int>(self), kIdleClass);
}

}  // namespace

CollectionRounds::CollectionRounds(Parts parts)
    : _parts(std::move(parts)),
      _collector(_parts.places, _parts.clock),
      _due(std::chrono::steady_clock::now() + kAfterStart),
      _dueForRoom(_due),
      _thread([this] { run(); }) {}

CollectionRounds::~CollectionRounds() { stop(); }

void CollectionRounds::stop() {
  Replies asked;
  {
    MutexLock lock(_mutex);
    _stop = true;
    asked.swap(_asked);
  }
  _cancellation.cancel();
  _changed.notifyAll();
  for (auto& reply : asked) reply({}, cancelledError());
  if (_thread.joinable()) _thread.join();
}

bool CollectionRounds::collect(Reply<CloudCollector::Result, NSErrorPtr>& reply) {
  {
    MutexLock lock(_mutex);
    if (_stop) return false;
    _asked.push_back(std::move(reply));
  }
  _changed.notifyAll();
  return true;
}

void CollectionRounds::contentsDidChange() {
  {
    MutexLock lock(_mutex);
    _contentsChanged = true;
  }
  _changed.notifyAll();
}

void CollectionRounds::run() {
  takeLowestPriority();
  while (auto asked = nextRound()) {
    const auto collected = collectOnce();
    if (!collected && !_cancellation.isCancelled()) {
      VL_ERROR(_parts.log, "[ERROR] nothing more is collected for now: %@",
               collected.error()->localizedDescription());
    }
    for (auto& reply : *asked) {
      reply(collected ? *collected : CloudCollector::Result(), collected.error());
    }
  }
}

std::optional<CollectionRounds::Replies> CollectionRounds::nextRound() {
  for (;;) {
    bool changed = false;
    {
      MutexLock lock(_mutex);
      const auto next = [this]() SKEIN_REQUIRES(_mutex) {
        return _contentsChanged ? std::min(_due, _dueForRoom) : _due;
      };
      while (!_stop && _asked.empty() && std::chrono::steady_clock::now() < next()) {
        _changed.waitUntil(_mutex, next());
      }
      if (_stop) return std::nullopt;
      if (!_asked.empty()) return std::exchange(_asked, {});
      changed = std::exchange(_contentsChanged, false);
    }
    const Instant now = std::chrono::steady_clock::now();
    if (!_parts.isStoreScanned()) {
      _due = std::max(_due, now + kScanPause);
      _dueForRoom = now + kScanPause;
      if (changed) contentsDidChange();
    } else if (now >= _due || isTooMuchKept()) {
      return Replies();
    } else {
      _dueForRoom = now + kBetweenMeasures;
    }
  }
}

bool CollectionRounds::isTooMuchKept() {
  const auto rule = _parts.rule();
  return rule && rule->taken > rule->bytes;
}

Outcome<CloudCollector::Result> CollectionRounds::collectOnce() {
  const auto rule = _parts.rule();
  if (!rule) return rule.error();
  const auto collected = _collector.collect(rule->time, rule->bytes, _cancellation);
  const Instant now = std::chrono::steady_clock::now();
  _due = now + kBetweenRounds;
  _dueForRoom = now + kLeastBetweenRounds;
  if (collected) _parts.didCollect();
  return collected;
}

}  // namespace skein::vald
