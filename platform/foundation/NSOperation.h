#pragma once

#include <atomic>
#include <memory>

#include "base/Executor.h"

namespace skein {

// A piece of work that can be cancelled. A subclass reports through a completion of
// its own, exactly once, also when it was cancelled before it started.
class NSOperation {
 public:
  virtual ~NSOperation() = default;

  // Runs the operation on the calling thread; it may finish later, on another. Called
  // by its queue, once, also for an operation that was cancelled meanwhile.
  virtual void start() = 0;

  // Idempotent, in any state, from any thread. A subclass that can stop early
  // overrides it and calls this one first.
  virtual void cancel() { _cancelled.store(true); }
  bool isCancelled() const { return _cancelled.load(); }

 private:
  std::atomic<bool> _cancelled{false};
};

// Starts operations on an executor as they come, any number of them at once.
class NSOperationQueue {
 public:
  explicit NSOperationQueue(std::shared_ptr<Executor> executor) : _executor(std::move(executor)) {}

  // Returns at once. The queue holds the operation until its start() has returned; an
  // operation that goes on after that holds itself.
  void addOperation(std::shared_ptr<NSOperation> operation) {
    _executor->post([operation = std::move(operation)] { operation->start(); });
  }

 private:
  const std::shared_ptr<Executor> _executor;
};

}  // namespace skein
