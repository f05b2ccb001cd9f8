#pragma once

#include <chrono>
#include <memory>
#include <utility>

#include "base/Executor.h"
#include "base/Mutex.h"
#include "linux/protocol/DaemonClient.h"
#include "linux/protocol/Deadlines.h"

namespace skein {

// What calls that block go through. All outlive the calls.
struct DaemonAccess {
  std::shared_ptr<RpcLoop> loop;
  std::shared_ptr<Executor> executor;
  std::shared_ptr<DaemonClient> client;
};

// An error when the calling thread may not wait for the daemon, as it is the one that
// would bring the answer; that is a fault too.
NSErrorPtr errorIfMayNotWait(const DaemonAccess& access);

// The answer of a thread that has waited for `limit`.
NSErrorPtr waitedTooLong(std::chrono::milliseconds limit);

// Calls start(daemon, reply) and waits until `reply` was called with a value and an error,
// or the message failed: with the message's deadline, for most, and at the latest after
// `limit`; what was asked for may happen all the same then. Any thread but the loop's.
template <class T, class Start>
std::pair<T, NSErrorPtr> askDaemon(const DaemonAccess& access, Start start,
                                   std::chrono::milliseconds limit = deadlines::kAnswer) {
  struct Answer {
    Mutex mutex;
    CondVar came;
    bool there SKEIN_GUARDED_BY(mutex) = false;
    std::pair<T, NSErrorPtr> value SKEIN_GUARDED_BY(mutex);

    void set(T result, NSErrorPtr error) {
      MutexLock lock(mutex);
      value = {std::move(result), std::move(error)};
      there = true;
      came.notifyAll();
    }
  };

  if (NSErrorPtr error = errorIfMayNotWait(access)) return {T{}, std::move(error)};
  auto answer = std::make_shared<Answer>();
  const auto daemon = access.client->remoteObjectProxyWithErrorHandler(
      [answer](NSErrorPtr error) { answer->set(T{}, std::move(error)); });
  start(*daemon,
        [answer](T result, NSErrorPtr error) { answer->set(std::move(result), std::move(error)); });
  ScopedWait wait(*access.executor);
  const auto deadline = std::chrono::steady_clock::now() + limit;
  MutexLock lock(answer->mutex);
  while (!answer->there) {
    if (!answer->came.waitUntil(answer->mutex, deadline)) return {T{}, waitedTooLong(limit)};
  }
  return std::move(answer->value);
}

}  // namespace skein
