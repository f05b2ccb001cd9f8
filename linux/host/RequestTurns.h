#pragma once

#include <cstddef>
#include <deque>
#include <memory>

#include "base/Executor.h"
#include "base/Mutex.h"

namespace skein {

// How many requests are at work at once. Each may wait for vald, and so hold a thread: those
// above the number wait for their turn without one, so that the executor's threads never run
// out. Any thread.
class RequestTurns final : public std::enable_shared_from_this<RequestTurns> {
 public:
  // A turn lasts until its last copy goes.
  using Turn = std::shared_ptr<void>;
  using Work = UniqueFunction<void(Turn)>;

  explicit RequestTurns(std::shared_ptr<Executor> executor, std::size_t most = kMost)
      : _executor(std::move(executor)), _most(most) {}

  // Calls `work` with a turn: inside this call when there is one left, else on the executor
  // once there is, in the order in which they came.
  void take(Work work) SKEIN_EXCLUDES(_mutex);

 private:
  // A fourth of a ThreadPool's threads.
  static constexpr std::size_t kMost = 64;

  Turn makeTurn();
  void giveBack() SKEIN_EXCLUDES(_mutex);

  const std::shared_ptr<Executor> _executor;
  const std::size_t _most;
  Mutex _mutex;
  std::size_t _taken SKEIN_GUARDED_BY(_mutex) = 0;
  std::deque<Work> _waiting SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein
