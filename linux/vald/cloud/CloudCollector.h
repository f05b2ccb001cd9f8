#pragma once

#include <chrono>
#include <cstdint>

#include "linux/vald/cloud/Cancellation.h"
#include "linux/vald/cloud/CloudClock.h"
#include "linux/vald/cloud/CloudPlaces.h"

namespace skein::vald {

// Removes contents that nothing needs any more: old revisions, and those of removed documents.
//
// Contents that no record names are kept for a time. When they take more room than they may,
// the oldest go first, whatever their age. But contents that a document was ever evicted to
// may be the only copy, and a marker may leave the drive and come back; so they stay for the
// whole time, however much room they take, and the time begins anew whenever a marker that
// names them is seen. They go only when two looks at all of the drive, a margin apart, saw
// none: a marker that is moved while a look goes on may be missed by that look. What cannot be
// read may hold markers: then nothing is collected.
//
// Letting go is on the disk before the contents go. Contents that stayed after a crash are
// found by the next look and count as new ones of which nothing is known.
class CloudCollector {
 public:
  static constexpr std::chrono::hours kMargin{1};

  CloudCollector(CloudPlaces places, CloudClock& clock)
      : _places(std::move(places)), _clock(clock) {}

  // Before the first upload: of contents that are older than the records nothing is known, so
  // they count as the only copies of something. Does nothing once it was done.
  NSErrorPtr begin();

  struct Result {
    CloudContents::Garbage freed;
    CloudContents::Garbage kept;  // of contents that no record names
  };
  // `time` and `bytes`: how long such contents are kept, and how much room they may take. One
  // at a time; blocks. On an error, which may be the cancellation, some may be gone.
  Outcome<Result> collect(std::chrono::nanoseconds time, std::uint64_t bytes,
                          const Cancellation& cancellation);

 private:
  NSErrorPtr noteUnknown(NSDate now, const Cancellation& cancellation);

  const CloudPlaces _places;
  CloudClock& _clock;
};

}  // namespace skein::vald
