#pragma once

#include <memory>
#include <string>

#include "base/Executor.h"
#include "base/Mutex.h"
#include "base/ThreadPool.h"

namespace skein::vald {

// A pool that the process can end before the objects that post to it: shutting down has
// one moment after which no work runs, whoever still holds the executor.
class ClosableExecutor final : public Executor {
 public:
  ClosableExecutor(std::size_t width, const std::string& name);

  // Runs what was posted before, and returns when the last of it has ended. What is
  // posted from now on is destroyed without being run. Not on a thread of the executor's.
  void close() SKEIN_EXCLUDES(_mutex);

  void post(Task task) override SKEIN_EXCLUDES(_mutex);
  void beginWait() override SKEIN_EXCLUDES(_mutex);
  void endWait() override SKEIN_EXCLUDES(_mutex);

 private:
  Mutex _mutex;
  std::unique_ptr<ThreadPool> _pool SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein::vald
