// Asynchronous calls that a scripted role holds until the test answers them: in any
// order, with any value or error, or by dropping the connection.
#pragma once

#include <deque>
#include <functional>
#include <memory>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include "base/Mutex.h"
#include "base/UniqueFunction.h"
#include "platform/foundation/NSError.h"

namespace skein {

using ErrorHandler = std::function<void(NSErrorPtr)>;

// One call. Exactly one of its two handlers runs; asking for a second throws, which
// fails the test. The handler runs on the thread that answers.
class HeldCallBase {
 public:
  virtual ~HeldCallBase() = default;
  // The connection failed before the reply came. False when the call has ended.
  virtual bool fail(const NSErrorPtr& error) = 0;
};

template <class... Args>
class HeldCall final : public HeldCallBase {
 public:
  HeldCall(Reply<Args...> reply, ErrorHandler errorHandler)
      : _reply(std::move(reply)), _errorHandler(std::move(errorHandler)) {}

  void reply(Args... args) SKEIN_EXCLUDES(_mutex) {
    Reply<Args...> reply;
    if (!end(&reply, nullptr)) throw std::logic_error("the call was answered before");
    if (reply) reply(std::move(args)...);
  }
  bool fail(const NSErrorPtr& error) override SKEIN_EXCLUDES(_mutex) {
    ErrorHandler handler;
    if (!end(nullptr, &handler)) return false;
    if (handler) handler(error);
    return true;
  }

 private:
  // Both handlers go, so that what they hold is let go of; one is handed out.
  bool end(Reply<Args...>* reply, ErrorHandler* errorHandler) SKEIN_EXCLUDES(_mutex) {
    Reply<Args...> endedReply;
    ErrorHandler endedHandler;
    {
      MutexLock lock(_mutex);
      if (std::exchange(_ended, true)) return false;
      endedReply = std::move(_reply);
      endedHandler = std::exchange(_errorHandler, nullptr);
    }
    if (reply != nullptr) *reply = std::move(endedReply);
    if (errorHandler != nullptr) *errorHandler = std::move(endedHandler);
    return true;
  }

  Mutex _mutex;
  bool _ended SKEIN_GUARDED_BY(_mutex) = false;
  Reply<Args...> _reply SKEIN_GUARDED_BY(_mutex);
  ErrorHandler _errorHandler SKEIN_GUARDED_BY(_mutex);
};

// The calls under way over one connection, in the order they were sent. Any thread.
class CallLedger {
 public:
  void add(std::weak_ptr<HeldCallBase> call) SKEIN_EXCLUDES(_mutex) {
    MutexLock lock(_mutex);
    _calls.push_back(std::move(call));
  }
  // The connection fails: every unanswered call's error handler runs, in order, calls
  // that are sent meanwhile included.
  void drop(const NSErrorPtr& error) SKEIN_EXCLUDES(_mutex) {
    for (;;) {
      std::vector<std::weak_ptr<HeldCallBase>> calls;
      {
        MutexLock lock(_mutex);
        calls.swap(_calls);
      }
      if (calls.empty()) return;
      for (const auto& weak : calls) {
        if (const auto call = weak.lock()) call->fail(error);
      }
    }
  }

 private:
  Mutex _mutex;
  std::vector<std::weak_ptr<HeldCallBase>> _calls SKEIN_GUARDED_BY(_mutex);
};

// The held calls of one kind, oldest first. Any thread.
template <class... Args>
class HeldCalls {
 public:
  using Call = std::shared_ptr<HeldCall<Args...>>;
  using Answerer = std::function<void(const Call&)>;

  explicit HeldCalls(CallLedger& ledger) : _ledger(ledger) {}

  void hold(Reply<Args...> reply, ErrorHandler errorHandler = nullptr) SKEIN_EXCLUDES(_mutex) {
    auto call = std::make_shared<HeldCall<Args...>>(std::move(reply), std::move(errorHandler));
    _ledger.add(call);
    Answerer answerer;
    {
      MutexLock lock(_mutex);
      answerer = _answerer;
      if (!answerer) _calls.push_back(call);
    }
    if (answerer) answerer(call);
  }

  // Takes the oldest call. Throws when there is none.
  Call next() SKEIN_EXCLUDES(_mutex) {
    MutexLock lock(_mutex);
    if (_calls.empty()) throw std::logic_error("no such call was made");
    Call call = std::move(_calls.front());
    _calls.pop_front();
    return call;
  }
  std::size_t count() const SKEIN_EXCLUDES(_mutex) {
    MutexLock lock(_mutex);
    return _calls.size();
  }

  // From now on `answerer` gets each call as it is made, on the caller's thread: it must
  // answer on another one. Set before threads start.
  void handTo(Answerer answerer) SKEIN_EXCLUDES(_mutex) {
    MutexLock lock(_mutex);
    _answerer = std::move(answerer);
  }

 private:
  CallLedger& _ledger;
  mutable Mutex _mutex;
  std::deque<Call> _calls SKEIN_GUARDED_BY(_mutex);
  Answerer _answerer SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein
