#pragma once

#include <chrono>
#include <functional>
#include <optional>
#include <thread>
#include <vector>

#include "base/Mutex.h"
#include "base/UniqueFunction.h"
#include "linux/vald/cloud/Cancellation.h"
#include "linux/vald/cloud/CloudCollector.h"
#include "platform/log/Log.h"

namespace skein::vald {

// Collects now and then, on a thread of its own with the lowest priority: some time after the
// start, once a day, when what is kept takes more room than it may, and when somebody asks.
// Only who asks does not wait until the store has been scanned.
class CollectionRounds final {
 public:
  struct Rule {
    std::chrono::nanoseconds time;  // how long contents are kept
    std::uint64_t bytes = 0;        // how much room they may take
    std::uint64_t taken = 0;        // how much they take, but for those that stay in any case
  };
  struct Parts {
    CloudPlaces places;
    CloudClock& clock;
    Log& log;
    std::function<Outcome<Rule>()> rule;   // on the thread
    std::function<bool()> isStoreScanned;  // on the thread
    std::function<void()> didCollect;      // on the thread
  };
  explicit CollectionRounds(Parts parts);
  ~CollectionRounds();

  // Ends what runs, and waits for it; who asked is answered NSUserCancelledError. Not on the
  // thread.
  void stop() SKEIN_EXCLUDES(_mutex);

  // Takes the reply, begins soon, and answers on the thread or in stop(). False, and the reply is
  // left, when it was stopped. Any thread.
  [[nodiscard]] bool collect(Reply<CloudCollector::Result, NSErrorPtr>& reply)
      SKEIN_EXCLUDES(_mutex);
  // More may be kept than before. Cheap; any thread.
  void contentsDidChange() SKEIN_EXCLUDES(_mutex);

 private:
  using Instant = std::chrono::steady_clock::time_point;
  using Replies = std::vector<Reply<CloudCollector::Result, NSErrorPtr>>;

  void run() SKEIN_EXCLUDES(_mutex);
  // Waits for the next round; who asked for it. Nil: it is time to end.
  std::optional<Replies> nextRound() SKEIN_EXCLUDES(_mutex);
  bool isTooMuchKept();
  Outcome<CloudCollector::Result> collectOnce();

  const Parts _parts;
  CloudCollector _collector;  // the thread's own, as are the next two
  Instant _due;               // the next round comes by itself
  Instant _dueForRoom;        // it may come when too much is kept
  Cancellation _cancellation;

  Mutex _mutex;
  CondVar _changed;
  bool _stop SKEIN_GUARDED_BY(_mutex) = false;
  bool _contentsChanged SKEIN_GUARDED_BY(_mutex) = false;
  Replies _asked SKEIN_GUARDED_BY(_mutex);
  std::thread _thread;
};

}  // namespace skein::vald
