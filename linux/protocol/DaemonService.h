// What the objects of vald's server have in common. Include this in few files: it costs
// seconds to compile.
#pragma once

#include <kj/async.h>

#include <cstddef>
#include <functional>
#include <memory>

#include "base/Executor.h"
#include "linux/protocol/CallFaults.h"
#include "linux/protocol/Codec.h"
#include "linux/protocol/DocumentURL.h"
#include "linux/protocol/LocalDaemon.h"
#include "linux/protocol/RpcConnection.h"
#include "linux/protocol/RpcLoop.h"

namespace skein {

// What the objects of one server share. Its fields are used on the loop's thread.
struct DaemonService final : private kj::TaskSet::ErrorHandler {
  // Of all connections together.
  static constexpr std::size_t kMostUnanswered = 8192;

  DaemonService(std::shared_ptr<RpcLoop> rpcLoop, std::shared_ptr<Executor> runner,
                std::shared_ptr<LocalDaemon> served, std::shared_ptr<CallFaults> planned)
      : loop(std::move(rpcLoop)),
        executor(std::move(runner)),
        daemon(std::move(served)),
        faults(std::move(planned)),
        tasks(newTasks()) {}

  // Lets go of the daemon and of everything on its way to clients. Once there are no more
  // connections.
  void close() {
    tasks = newTasks();
    daemon = nullptr;
    faults = nullptr;
  }

  const std::shared_ptr<RpcLoop> loop;
  const std::shared_ptr<Executor> executor;
  std::shared_ptr<LocalDaemon> daemon;
  std::shared_ptr<CallFaults> faults;  // null: no faults
  // Closes every client's connection, soon.
  std::function<void()> dropConnections = [] {};
  // Calls that vald has not answered, of clients that are gone too.
  std::size_t unanswered = 0;
  kj::Own<kj::TaskSet> tasks;

 private:
  kj::Own<kj::TaskSet> newTasks() {
    return kj::heap<kj::TaskSet>(static_cast<kj::TaskSet::ErrorHandler&>(*this));
  }
  // A push that failed. Whoever made it knows, by its reply that goes uncalled.
  void taskFailed(kj::Exception&&) override {}
};
using DaemonServicePtr = std::shared_ptr<DaemonService>;

// A client's path: absolute, without NUL, "." and ".."; null otherwise.
NSURLPtr urlFromClient(capnp::Data::Reader path);

// The same of a call's parameters, as the place of the item that they name, where they name one.
NSURLPtr itemURLFromClient(const auto& params) {
  NSURLPtr url = urlFromClient(params.getUrl());
  return url && params.hasItem() ? documentURL(url->path(), codec::decode(params.getItem())) : url;
}

}  // namespace skein
