// What the objects of vald's server have in common. Include this in few files: it costs
// seconds to compile.
#pragma once

#include <kj/async.h>

#include <cstddef>
#include <cstdint>
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

// What all connections of one server share. Its fields are used on the loop's thread.
struct ServedDaemon final : private kj::TaskSet::ErrorHandler {
  ServedDaemon(std::shared_ptr<LocalDaemon> served, std::shared_ptr<CallFaults> planned)
      : daemon(std::move(served)), faults(std::move(planned)), tasks(newTasks()) {}

  // Lets go of the daemon and of everything on its way to clients. Once there are no more
  // connections.
  void close() {
    tasks = newTasks();
    daemon = nullptr;
    faults = nullptr;
  }

  std::shared_ptr<LocalDaemon> daemon;
  std::shared_ptr<CallFaults> faults;  // null: no faults
  // Closes every client's connection, soon.
  std::function<void()> dropConnections = [] {};
  kj::Own<kj::TaskSet> tasks;

 private:
  kj::Own<kj::TaskSet> newTasks() {
    return kj::heap<kj::TaskSet>(static_cast<kj::TaskSet::ErrorHandler&>(*this));
  }
  // A push that failed. Whoever made it knows, by its reply that goes uncalled.
  void taskFailed(kj::Exception&&) override {}
};

// What the objects of one connection share. Its fields are used on the loop's thread.
struct DaemonService {
  static constexpr std::size_t kMostUnanswered = 4096;
  // Items, changes or entries that one call may ask for.
  static constexpr std::uint64_t kLongestPage = 1000;

  const std::shared_ptr<RpcLoop> loop;
  const std::shared_ptr<Executor> executor;
  const std::shared_ptr<ServedDaemon> server;
  std::size_t unanswered = 0;  // calls that vald has not answered, also of a client that is gone
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
