#include "base/SerialQueue.h"

#include <deque>
#include <variant>

#include "base/Fault.h"
#include "base/Mutex.h"

namespace skein {
namespace {

// How many closures one visit to the executor runs before others get their turn.
constexpr int kMostPerVisit = 64;

}  // namespace

struct SerialQueue::State : std::enable_shared_from_this<State> {
  // A thread inside sync() that waits for its turn; it lives on that thread's stack.
  struct Waiter {
    bool turn = false;
    CondVar turnCame;
  };
  using Entry = std::variant<Task, Waiter*>;

  State(std::string name, std::shared_ptr<Executor> runner)
      : label(std::move(name)), executor(std::move(runner)) {}

  void drain() SKEIN_EXCLUDES(mutex);
  // Gives the queue to the next entry; the caller owned it until now.
  void handOn() SKEIN_REQUIRES(mutex);
  void postDrain() {
    executor->post([self = shared_from_this()] { self->drain(); });
  }

  // The queues whose work the thread runs, innermost first, as a list on its stack.
  static thread_local const State* current;

  const std::string label;
  const std::shared_ptr<Executor> executor;
  Mutex mutex;
  std::deque<Entry> entries SKEIN_GUARDED_BY(mutex);
  bool owned SKEIN_GUARDED_BY(mutex) = false;
  // Written by the owner alone, read by threads that ask whether they are the owner.
  const State* outer = nullptr;
};

thread_local const SerialQueue::State* SerialQueue::State::current = nullptr;

void SerialQueue::State::handOn() {
  if (entries.empty()) {
    owned = false;
  } else if (auto* waiter = std::get_if<Waiter*>(&entries.front())) {
    Waiter* next = *waiter;
    entries.pop_front();
    next->turn = true;
    next->turnCame.notifyOne();
  } else {
    postDrain();
  }
}

void SerialQueue::State::drain() {
  const State* previous = std::exchange(current, this);
  outer = previous;
  for (int ran = 0;; ++ran) {
    Task task;
    {
      MutexLock lock(mutex);
      if (ran == kMostPerVisit || entries.empty() ||
          std::holds_alternative<Waiter*>(entries.front())) {
        current = previous;
        handOn();
        return;
      }
      task = std::move(std::get<Task>(entries.front()));
      entries.pop_front();
    }
    task();
  }
}

SerialQueue::SerialQueue(std::string label, std::shared_ptr<Executor> executor)
    : _state(std::make_shared<State>(std::move(label), std::move(executor))) {}

SerialQueue::~SerialQueue() = default;

const std::string& SerialQueue::label() const { return _state->label; }

void SerialQueue::async(Task task) {
  MutexLock lock(_state->mutex);
  _state->entries.emplace_back(std::move(task));
  if (_state->owned) return;
  _state->owned = true;
  _state->postDrain();
}

bool SerialQueue::isCurrent() const {
  for (const State* state = State::current; state != nullptr; state = state->outer) {
    if (state == _state.get()) return true;
  }
  return false;
}

SerialQueue::Turn::Turn(SerialQueue& queue) {
  if (queue.isCurrent()) {
    reportFault("a synchronous dispatch onto its own queue: " + queue.label());
    return;
  }
  _state = queue._state;
  {
    MutexLock lock(_state->mutex);
    if (!_state->owned) {
      _state->owned = true;
    } else {
      State::Waiter waiter;
      _state->entries.emplace_back(&waiter);
      ScopedWait wait(*_state->executor);
      while (!waiter.turn) waiter.turnCame.wait(_state->mutex);
    }
  }
  _previous = std::exchange(State::current, _state.get());
  _state->outer = _previous;
}

SerialQueue::Turn::~Turn() {
  if (!_state) return;
  State::current = _previous;
  MutexLock lock(_state->mutex);
  _state->handOn();
}

}  // namespace skein
