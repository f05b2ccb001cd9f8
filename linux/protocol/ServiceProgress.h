// A request's progress across the socket, both ends. Include this in few files: it costs
// seconds to compile.
#pragma once

#include <kj/async.h>

#include <memory>
#include <set>

#include "base/Executor.h"
#include "linux/protocol/RpcLoop.h"
#include "linux/protocol/services.capnp.h"
#include "platform/foundation/NSProgress.h"

namespace skein {

// --- skein-host's end.

// The requests under way of one connection. On the loop's thread.
class ProgressTable final : public std::enable_shared_from_this<ProgressTable>,
                            private kj::TaskSet::ErrorHandler {
 public:
  using ProgressPtr = std::shared_ptr<NSProgress>;

  // One request, from its message to its reply.
  class Request;

  ProgressTable(std::shared_ptr<RpcLoop> loop, std::shared_ptr<Executor> executor)
      : _loop(std::move(loop)), _executor(std::move(executor)), _tasks(*this) {}

  // A request has come, with the client's ear for it, or none.
  std::shared_ptr<Request> begin(kj::Maybe<wire::ProgressObserver::Client> observer);
  // The connection is of no more use: what is under way is cancelled, on the executor.
  void end();

 private:
  void cancelSoon(ProgressPtr progress);
  void taskFailed(kj::Exception&&) override {}  // told to a client that is gone

  const std::shared_ptr<RpcLoop> _loop;
  const std::shared_ptr<Executor> _executor;
  bool _ended = false;
  std::set<ProgressPtr> _underWay;
  kj::TaskSet _tasks;
};

class ProgressTable::Request final : public std::enable_shared_from_this<Request> {
 public:
  using Observer = wire::ProgressObserver::Client;

  Request(std::shared_ptr<ProgressTable> table, std::shared_ptr<Observer> observer)
      : _table(std::move(table)), _observer(std::move(observer)) {}

  // The service's method has returned `progress`, perhaps null. Any thread.
  void didReturn(ProgressPtr progress);
  // The service has replied. Any thread.
  void didReply();

 private:
  void tell(const ProgressPtr& progress);
  void advance(std::int64_t count);
  void sendCount();

  const std::shared_ptr<ProgressTable> _table;
  const std::shared_ptr<Observer> _observer;  // null: nobody watches
  // On the loop's thread.
  ProgressPtr _progress;  // while it is under way
  bool _replied = false;
  bool _telling = false;  // one count is on its way at a time
  std::int64_t _count = 0;
  std::int64_t _told = 0;
};

// --- The client's end.

// What one request is sent with.
struct RemoteProgress {
  // The caller's: it mirrors the service's, and its cancellation goes to the service's, also
  // when that is told of only later. Its handlers run on the executor. Letting go of it lets
  // go of the service's, which goes on.
  std::shared_ptr<NSProgress> progress;
  // Makes the service's observer; on the loop's thread.
  UniqueFunction<wire::ProgressObserver::Client()> makeObserver;
};

// Any thread.
RemoteProgress makeRemoteProgress(std::shared_ptr<RpcLoop> loop,
                                  std::shared_ptr<Executor> executor);

}  // namespace skein
