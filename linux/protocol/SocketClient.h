#pragma once

#include <capnp/capability.h>

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "base/Executor.h"
#include "linux/protocol/Deadlines.h"
#include "linux/protocol/ProcessLauncher.h"
#include "linux/protocol/RpcLoop.h"
#include "platform/foundation/NSError.h"

namespace skein {

// Speaks to the object that a SocketServer serves. Connects when the first message is
// sent, and again when one is sent after the connection was lost; starts the program that
// listens when it does not run. Makes sure that each message is answered or fails, once,
// and soon:
//
// - A lost connection fails what was under way over it, at once.
// - A message without an answer fails at its deadline. A peer that then does not even
//   answer a probe is given up: the connection is closed.
//
// Errors are VLVellumErrorDaemonUnreachable and name the peer.
class SocketClient {
 public:
  struct Options {
    std::string peer;  // "vald", for the texts
    std::string socketPath;
    // Started when nobody listens; none: that is an error.
    std::optional<ProgramToStart> program;
    std::chrono::milliseconds deadline{deadlines::kMessage};
  };

  enum class Patience : std::uint8_t {
    Deadline,        // the answer must come within the deadline
    WhilePeerLives,  // it may take longer as long as the peer answers probes
  };

  // Runs on the loop's thread, with the server's object. The promise, which may be dropped
  // at any time, ends with what hands the answer on; that runs on the executor unless the
  // message has failed by then. An exception makes the message fail.
  using Send = UniqueFunction<kj::Promise<Task>(capnp::Capability::Client)>;
  // Runs on the executor, once, when the message was not sent or not answered.
  using Fail = UniqueFunction<void(NSErrorPtr)>;
  // Runs on the loop's thread when the connection is lost.
  using Lost = UniqueFunction<void(const NSErrorPtr&)>;

  SocketClient(std::shared_ptr<RpcLoop> loop, std::shared_ptr<Executor> executor, Options options);
  ~SocketClient();
  SocketClient(const SocketClient&) = delete;
  SocketClient& operator=(const SocketClient&) = delete;

  const std::shared_ptr<RpcLoop>& loop() const { return _loop; }
  const std::shared_ptr<Executor>& executor() const { return _executor; }

  // Sends one message. Any thread; nothing runs inside the call.
  void send(Send send, Fail fail, Patience patience = Patience::Deadline);

  // Waits until everything that was sent before has its answer, or for `patience`. Any thread
  // but the loop's and the executor's.
  void settle(std::chrono::milliseconds patience);

  // Closes the connection for good: what is under way fails, and what is sent later. Any
  // thread; soon.
  void close();

  // Runs on the executor each time a connection stands, the first one included. Set it
  // before the first message.
  void setConnectedHandler(std::function<void()> handler);

  // --- For objects that live on one connection; on the loop's thread, inside a Send.

  // The number of the connection that the Send runs on.
  std::uint64_t currentConnection() const;
  // Sends over connection `number` only; when it is gone, `fail` gets its error. This
  // `fail` runs on the loop's thread, before whenLost() tells of the same end.
  void sendOver(std::uint64_t number, UniqueFunction<kj::Promise<Task>()> send, Fail fail,
                Patience patience);
  // Calls `lost` when connection `number` ends, after its messages have failed; at once if
  // it is gone. Answers a key for forget().
  std::uint64_t whenLost(std::uint64_t number, Lost lost);
  void forget(std::uint64_t key);

 private:
  struct Core;
  std::shared_ptr<RpcLoop> _loop;
  std::shared_ptr<Executor> _executor;
  std::shared_ptr<Core> _core;
};

}  // namespace skein
