#include "linux/vald/cloud/CloudCollector.h"

#include <algorithm>
#include <map>
#include <utility>
#include <vector>

#include "linux/vald/cloud/CloudErrors.h"
#include "linux/vald/cloud/MarkerWalk.h"
#include "linux/vald/files/FileErrors.h"

namespace skein::vald {
namespace {

using Unreferenced = CloudRecords::Unreferenced;

// Those that may go, by the rule. `candidates` are sorted by age, the oldest first.
std::vector<ContentHash> dueOf(const std::vector<Unreferenced>& candidates, NSDate now,
                               std::chrono::nanoseconds time, std::uint64_t bytes) {
  std::uint64_t spare = 0;  // what may go for its room
  for (const Unreferenced& one : candidates) {
    if (!one.givenUp) spare += one.contents.size;
  }
  std::vector<ContentHash> due;
  for (const Unreferenced& one : candidates) {
    const bool isOld = now - one.since >= time;
    const bool wasMissed = one.missed && now - *one.missed >= CloudCollector::kMargin;
    if (one.givenUp ? !isOld || !wasMissed : !isOld && spare <= bytes) continue;
    if (!one.givenUp) spare -= one.contents.size;
    due.push_back(one.contents.hash);
  }
  return due;
}

}  // namespace

Outcome<CloudCollector::Result> CloudCollector::collect(std::chrono::nanoseconds time,
                                                        std::uint64_t bytes,
                                                        const Cancellation& cancellation) {
  const NSDate now = _clock.date();
  std::vector<ContentHash> named;
  NSErrorPtr error = walkMarkers(_places.roots, _places.trashes, cancellation,
                                 [&](const std::string& path, const EvictionMarker& marker) {
                                   // What another drive's cloud alone has is kept here as well.
                                   if (_places.refusalOf(marker, path) == nullptr) {
                                     _places.contents.hold(marker.contents);
                                   }
                                   named.push_back(marker.contents.hash);
                                   return NSErrorPtr();
                                 });
  if (error != nullptr) return error;
  if ((error = noteUnknown(now, cancellation)) != nullptr) return error;
  std::sort(named.begin(), named.end());
  const auto candidates = _places.records.noteLook(named, now);
  if (!candidates) return candidates.error();

  Result result;
  for (const Unreferenced& one : *candidates) result.kept += {1, one.contents.size};
  // Together what lies in one folder: letting go waits for the disk.
  std::map<std::uint8_t, std::vector<ContentHash>> groups;
  for (const ContentHash& hash : dueOf(*candidates, now, time, bytes)) {
    groups[hash.bytes()[0]].push_back(hash);
  }
  for (const auto& [byte, group] : groups) {
    if (cancellation.isCancelled()) return cancelledError();
    const auto freed = _places.contents.remove(
        group, [&](const auto& unheld) -> Outcome<std::vector<ContentHash>> {
          if (const int code = _places.files.step(FileStep::JournalBegin, "collect")) {
            return fileError(code, "can't let go of contents in", "the cloud");
          }
          return _places.records.release(unheld, now);
        });
    if (!freed) return freed.error();
    result.freed += *freed;
  }
  result.kept -= result.freed;
  return result;
}

NSErrorPtr CloudCollector::noteUnknown(NSDate now, const Cancellation& cancellation) {
  return _places.contents.list([&](const HashedContents& contents) -> NSErrorPtr {
    if (cancellation.isCancelled()) return cancelledError();
    const auto known = _places.records.isKnown(contents.hash);
    if (!known) return known.error();
    return *known ? nullptr : _places.records.addUnknown(contents, now);
  });
}

NSErrorPtr CloudCollector::begin() {
  const auto begun = _places.records.hasAdopted();
  if (!begun || *begun) return begun.error();
  std::vector<HashedContents> all;
  NSErrorPtr error = _places.contents.list([&](const HashedContents& contents) {
    all.push_back(contents);
    return NSErrorPtr();
  });
  return error != nullptr ? error : _places.records.adopt(all, _clock.date());
}

}  // namespace skein::vald
