#pragma once

#include <memory>
#include <string>
#include <utility>

#include "base/Executor.h"
#include "base/ThreadAnnotations.h"

namespace skein {

// Runs one closure at a time, in the order of submission, on an executor's threads.
//
// The queue may lose its last reference on its own worker: what was submitted before
// still runs. It keeps its executor alive until then.
//
// A field that only the queue's work touches says SKEIN_GUARDED_BY(the queue).
class SKEIN_CAPABILITY("serial queue") SerialQueue {
 public:
  // `label` names the queue in faults and debuggers.
  SerialQueue(std::string label, std::shared_ptr<Executor> executor);
  ~SerialQueue();
  SerialQueue(const SerialQueue&) = delete;
  SerialQueue& operator=(const SerialQueue&) = delete;

  const std::string& label() const;

  // Runs `task` later, never inside this call. Any thread.
  void async(Task task);

  // Runs `closure` on the calling thread when its turn has come, and returns its
  // result. An idle queue is taken over without changing threads. Calling it on the
  // queue itself is a fault, and runs the closure inline. Never call it with a lock
  // held that the queue's work may want.
  template <class F>
  decltype(auto) sync(F&& closure) {
    Turn turn(*this);
    return std::forward<F>(closure)();
  }

  // Whether the calling thread runs this queue's work at the moment.
  bool isCurrent() const;

  // Tells the compiler's lock analysis, at the head of a closure given to this queue,
  // that it runs there. Checks nothing at run time: isCurrent() does.
  void assumeCurrent() const SKEIN_ASSERT_CAPABILITY(this) {}

 private:
  struct State;

  // The calling thread's turn on the queue, from construction to destruction.
  class Turn {
   public:
    explicit Turn(SerialQueue& queue);
    ~Turn();
    Turn(const Turn&) = delete;
    Turn& operator=(const Turn&) = delete;

   private:
    std::shared_ptr<State> _state;  // null when the thread was on the queue already
    const State* _previous = nullptr;
  };

  std::shared_ptr<State> _state;
};

}  // namespace skein
