// An executor whose crank the test turns, so that every interleaving is chosen and
// none is slept for.
#pragma once

#include <cstddef>
#include <deque>

#include "base/Executor.h"
#include "base/Mutex.h"

namespace skein {

// Keeps what was posted until the test runs it, on the test's thread, first come first
// run. A wait for work that only this executor could run would never end: it aborts the
// test program at once and says so, where real threads would hang.
class ManualExecutor final : public Executor {
 public:
  ManualExecutor() = default;
  // Tasks that never ran are destroyed with it; a test that must not leave any asserts
  // pending() == 0.
  ~ManualExecutor() override;

  // Any thread.
  void post(Task task) override SKEIN_EXCLUDES(_mutex);

  // Runs the oldest task. False when there was none.
  bool runOne() SKEIN_EXCLUDES(_mutex);

  // Runs tasks, those posted meanwhile included, until none is left, and answers how
  // many ran. Work that posts itself for ever aborts the test program.
  std::size_t runAll() SKEIN_EXCLUDES(_mutex);

  std::size_t pending() const SKEIN_EXCLUDES(_mutex);

  [[noreturn]] void beginWait() override;
  void endWait() override {}

 private:
  mutable Mutex _mutex;
  std::deque<Task> _tasks SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein
