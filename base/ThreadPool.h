#pragma once

#include <chrono>
#include <cstddef>
#include <memory>
#include <string>

#include "base/Executor.h"

namespace skein {

// A fixed number of running workers. While some of them wait (beginWait), as many
// spare threads as there are waiters keep the rest going, so that a wait never
// starves the work that would end it. There are at most 256 threads; when all wait, nothing
// more runs. A spare thread that had nothing to do for `sparePatience` ends.
class ThreadPool final : public Executor {
 public:
  // `width`: running workers, at least 1. `name`: shown by debuggers, cut at 15 bytes.
  ThreadPool(std::size_t width, std::string name,
             std::chrono::milliseconds sparePatience = std::chrono::seconds(5));

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
