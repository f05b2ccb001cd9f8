#include "linux/vald/ClosableExecutor.h"

#include <utility>

namespace skein::vald {

ClosableExecutor::ClosableExecutor(std::size_t width, const std::string& name)
    : _pool(std::make_unique<ThreadPool>(width, name)) {}

void ClosableExecutor::close() {
  std::unique_ptr<ThreadPool> pool;
  {
    MutexLock lock(_mutex);
    pool.swap(_pool);
  }
}

// The pool is a leaf: it takes its own lock and calls nobody.
void ClosableExecutor::post(Task task) {
  MutexLock lock(_mutex);
  if (_pool) _pool->post(std::move(task));
}

void ClosableExecutor::beginWait() {
  MutexLock lock(_mutex);
  if (_pool) _pool->beginWait();
}

void ClosableExecutor::endWait() {
  MutexLock lock(_mutex);
  if (_pool) _pool->endWait();
}

}  // namespace skein::vald
