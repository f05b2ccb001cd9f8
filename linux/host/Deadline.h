#pragma once

#include <atomic>
#include <memory>
#include <utility>

#include "base/Mutex.h"
#include "linux/host/Listing.h"

namespace skein {

// A reply that comes by the deadline: from the work, or else the error of the lost answer.
// Whichever is first runs it; the other does nothing.
template <class... Values>
class TimedReply final {
 public:
  static std::shared_ptr<TimedReply> begin(const HostTools& tools,
                                           Reply<Values..., NSErrorPtr> reply) {
    auto timed = std::shared_ptr<TimedReply>(new TimedReply(tools, std::move(reply)));
    timed->_timer = tools.timers->after(tools.deadline, [timed, deadline = tools.deadline] {
      timed->answer(Values()..., lostAnswerError(deadline));
    });
    return timed;
  }

  // Keeps `turn` until the answer. False when it was answered: then nobody wants the work.
  bool keep(std::shared_ptr<void> turn) SKEIN_EXCLUDES(_mutex) {
    MutexLock lock(_mutex);
    if (_answered) return false;
    _turn = std::move(turn);
    return true;
  }

  void operator()(Values... values, NSErrorPtr error) {
    _timers->cancel(_timer);
    answer(std::move(values)..., std::move(error));
  }

 private:
  TimedReply(const HostTools& tools, Reply<Values..., NSErrorPtr> reply)
      : _timers(tools.timers), _reply(std::move(reply)) {}

  void answer(Values... values, NSErrorPtr error) {
    if (_answered.exchange(true)) return;
    std::shared_ptr<void> turn;
    {
      MutexLock lock(_mutex);
      turn.swap(_turn);
    }
    const auto reply = std::make_shared<Reply<Values..., NSErrorPtr>>(std::move(_reply));
    (*reply)(std::move(values)..., std::move(error));
  }

  const std::shared_ptr<Timers> _timers;
  std::atomic<Timers::Key> _timer{0};
  std::atomic<bool> _answered{false};
  Reply<Values..., NSErrorPtr> _reply;  // of whoever sets _answered
  Mutex _mutex;
  std::shared_ptr<void> _turn SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein
