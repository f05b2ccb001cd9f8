#include "linux/host/RequestTurns.h"

#include <utility>

namespace skein {

void RequestTurns::take(Work work) {
  {
    MutexLock lock(_mutex);
    if (_taken == _most) {
      _waiting.push_back(std::move(work));
      return;
    }
    ++_taken;
  }
  work(makeTurn());
}

RequestTurns::Turn RequestTurns::makeTurn() {
  return {nullptr, [self = shared_from_this()](std::nullptr_t) { self->giveBack(); }};
}

void RequestTurns::giveBack() {
  Work next;
  {
    MutexLock lock(_mutex);
    if (_waiting.empty()) {
      --_taken;
      return;
    }
    next = std::move(_waiting.front());
    _waiting.pop_front();
  }
  _executor->post(
      [self = shared_from_this(), next = std::move(next)]() mutable { next(self->makeTurn()); });
}

}  // namespace skein
