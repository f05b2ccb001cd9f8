#pragma once

#include <cstddef>
#include <deque>
#include <string>
#include <thread>
#include <vector>

#include "base/Executor.h"
#include "base/Mutex.h"

namespace skein {

// A fixed number of running workers. While some of them wait (beginWait), as many
// spare threads as there are waiters keep the rest going, so that a wait never
// starves the work that would end it.
class ThreadPool final : public Executor {
 public:
  // `width`: running workers, at least 1. `name`: shown by debuggers, cut at 15 bytes.
  ThreadPool(std::size_t width, std::string name);

  // Runs what was posted before, then joins. Must not run on one of its own workers.
  ~ThreadPool() override;

  void post(Task task) override SKEIN_EXCLUDES(_mutex);
  void beginWait() override SKEIN_EXCLUDES(_mutex);
  void endWait() override SKEIN_EXCLUDES(_mutex);

 private:
  void run() SKEIN_EXCLUDES(_mutex);
  void addThreadIfNeeded() SKEIN_REQUIRES(_mutex);

  const std::size_t _width;
  const std::string _name;
  Mutex _mutex;
  CondVar _workArrived;
  std::deque<Task> _tasks SKEIN_GUARDED_BY(_mutex);
  std::vector<std::thread> _threads SKEIN_GUARDED_BY(_mutex);
  std::size_t _idle SKEIN_GUARDED_BY(_mutex) = 0;
  std::size_t _waiting SKEIN_GUARDED_BY(_mutex) = 0;
  bool _stopping SKEIN_GUARDED_BY(_mutex) = false;
};

}  // namespace skein
