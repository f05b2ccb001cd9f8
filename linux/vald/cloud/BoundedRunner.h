#pragma once

#include <cstddef>
#include <memory>

#include "base/Executor.h"

namespace skein::vald {

// Runs tasks on an executor, at most so many at a time; the others wait in order. Any
// thread. The destructor drops the tasks that have not begun and waits for the others; it
// must not run on one of them.
class BoundedRunner {
 public:
  BoundedRunner(std::shared_ptr<Executor> executor, std::size_t limit);
  ~BoundedRunner();
  BoundedRunner(const BoundedRunner&) = delete;
  BoundedRunner& operator=(const BoundedRunner&) = delete;

  void post(Task task);

 private:
  struct State;
  std::shared_ptr<State> _state;
};

}  // namespace skein::vald
