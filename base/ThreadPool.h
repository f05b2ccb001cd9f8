#pragma once

#include <cstddef>
#include <memory>
#include <string>

#include "base/Executor.h"

namespace skein {

// A fixed number of running workers. While some of them wait (beginWait), as many
// spare threads as there are waiters keep the rest going, so that a wait never
// starves the work that would end it. There are at most kMostThreads; whoever lets others
// decide how many tasks wait bounds them below that (BoundedExecutor). A spare thread that had
// nothing to do for some seconds ends.
class ThreadPool final : public Executor {
 public:
  static constexpr std::size_t kMostThreads = 256;

  // `width`: running workers, at least 1. `name`: shown by debuggers, cut at 15 bytes.
  ThreadPool(std::size_t width, std::string name);

  // Runs what was posted before, then joins. When a worker drops the last reference,
  // that worker is left to end by itself.
  ~ThreadPool() override;

  void post(Task task) override;
  void beginWait() override;
  void endWait() override;

  // How many threads there are at this moment, the ending ones aside.
  std::size_t threadCount() const;

 private:
  struct State;
  std::shared_ptr<State> _state;
};

}  // namespace skein
