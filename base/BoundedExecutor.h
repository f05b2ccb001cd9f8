#pragma once

#include <cstddef>
#include <memory>

#include "base/Executor.h"

namespace skein {

// Runs at most so many of its tasks at once on another executor; the others wait for their
// turn in the order in which they came. What others decide the number of (the requests of
// clients) goes through one, so that tasks which all wait leave threads of a pool for the
// replies and deadlines that end their waits. Any thread.
class BoundedExecutor final : public Executor {
 public:
  // `most`: at least 1.
  BoundedExecutor(std::shared_ptr<Executor> executor, std::size_t most);
  ~BoundedExecutor() override;

  void post(Task task) override;
  void beginWait() override;
  void endWait() override;

 private:
  struct State;
  const std::shared_ptr<State> _state;
};

}  // namespace skein
