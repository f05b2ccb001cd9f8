// Waiting for other threads in tests: always for an event, always with a deadline.
#pragma once

#include <gtest/gtest.h>

#include <chrono>
#include <functional>
#include <memory>
#include <optional>
#include <thread>
#include <tuple>
#include <utility>
#include <vector>

#include "base/Mutex.h"
#include "base/UniqueFunction.h"
#include "platform/foundation/NSError.h"

namespace skein {

inline std::chrono::steady_clock::time_point testDeadline() {
  return std::chrono::steady_clock::now() + std::chrono::seconds(20);
}

// For what nothing tells of, such as the end of a weak reference. False at the deadline.
template <class Condition>
bool becomesTrue(Condition condition) {
  const auto deadline = testDeadline();
  while (!condition()) {
    if (std::chrono::steady_clock::now() > deadline) return false;
    std::this_thread::yield();
  }
  return true;
}

// Things that come in from other threads, in order of arrival.
template <class T>
class Inbox {
 public:
  void add(T value) SKEIN_EXCLUDES(_mutex) {
    MutexLock lock(_mutex);
    _values.push_back(std::move(value));
    _came.notifyAll();
  }
  std::size_t count() const SKEIN_EXCLUDES(_mutex) {
    MutexLock lock(_mutex);
    return _values.size();
  }
  // False when there were not as many by the deadline.
  bool waitForCount(std::size_t count) SKEIN_EXCLUDES(_mutex) {
    const auto deadline = testDeadline();
    MutexLock lock(_mutex);
    while (_values.size() < count) {
      if (!_came.waitUntil(_mutex, deadline)) return false;
    }
    return true;
  }
  // Takes the oldest one, waiting for it; nothing at the deadline.
  std::optional<T> take() SKEIN_EXCLUDES(_mutex) {
    if (!waitForCount(1)) return std::nullopt;
    MutexLock lock(_mutex);
    std::optional<T> value(std::move(_values.front()));
    _values.erase(_values.begin());
    return value;
  }

 private:
  mutable Mutex _mutex;
  CondVar _came;
  std::vector<T> _values SKEIN_GUARDED_BY(_mutex);
};

// What came of one message, or of several: replies with values, and calls of the error
// handler. Shared with the callbacks, which may come late.
template <class... Values>
struct Outcome {
  std::shared_ptr<Inbox<std::tuple<Values...>>> replies =
      std::make_shared<Inbox<std::tuple<Values...>>>();
  std::shared_ptr<Inbox<NSErrorPtr>> errors = std::make_shared<Inbox<NSErrorPtr>>();

  Reply<Values...> reply() {
    return [inbox = replies](Values... values) {
      inbox->add(std::tuple<Values...>(std::move(values)...));
    };
  }
  std::function<void(NSErrorPtr)> errorHandler() {
    return [inbox = errors](NSErrorPtr error) { inbox->add(std::move(error)); };
  }
  // The one reply; a failed test and default values when there was none.
  std::tuple<Values...> value() {
    auto got = replies->take();
    EXPECT_TRUE(got.has_value()) << "no reply but "
                                 << (errors->count() > 0 ? (*errors->take())->localizedDescription()
                                                         : "no error either");
    EXPECT_EQ(errors->count(), 0U);
    return got ? std::move(*got) : std::tuple<Values...>();
  }
};

// Asks with `ask(proxy, reply)` and waits for the reply's values.
template <class... Values, class Client, class Ask>
std::tuple<Values...> ask(Client& client, Ask send) {
  Outcome<Values...> outcome;
  send(*client.remoteObjectProxyWithErrorHandler(outcome.errorHandler()), outcome.reply());
  return outcome.value();
}

}  // namespace skein
