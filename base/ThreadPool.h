#pragma once

#include <cstddef>
#include <memory>
#include <string>

#include "base/Executor.h"

namespace skein {

// A fixed number of running workers. While some of them wait (beginWait), as many
// spare threads as there are waiters keep the rest going, so that a wait never
// starves the work that would end it.
class ThreadPool final : public Executor {
 public:
  // `width`: running workers, at least 1. `name`: shown by debuggers, cut at 15 bytes.
  ThreadPool(std::size_t width, std::string name);

  // Runs what was posted before, then joins. When a worker drops the last reference,
  // that worker is left to end by itself.
  ~ThreadPool() override;

  void post(Task task) override;
  void beginWait() override;
  void endWait() override;

 private:
  struct State;
  std::shared_ptr<State> _state;
};

}  // namespace skein
