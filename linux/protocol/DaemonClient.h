#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "base/Executor.h"
#include "linux/protocol/Deadlines.h"
#include "linux/protocol/LocalDaemon.h"
#include "linux/protocol/ProcessLauncher.h"
#include "linux/protocol/RpcLoop.h"

namespace skein {

class SocketClient;

// A process's connection to vald. Connects with the first message and again after the
// connection was lost; starts vald when it does not run. Any thread.
//
// For each message either its reply or the proxy's error handler runs, once, on the
// executor: at once when the connection is lost, at the deadline when vald does not answer
// (checks and watches may take longer, as long as vald lives). The errors are
// VLVellumErrorDaemonUnreachable and name vald.
class DaemonClient {
 public:
  struct Options {
    std::string socketPath;
    // How to start vald when it does not run; none: that is an error.
    std::optional<ProgramToStart> program;
    std::chrono::milliseconds deadline{deadlines::kMessage};
  };

  DaemonClient(std::shared_ptr<RpcLoop> loop, std::shared_ptr<Executor> executor, Options options);
  // Closes the connection; what is under way fails. Proxies may outlive it, and fail.
  ~DaemonClient();
  DaemonClient(const DaemonClient&) = delete;
  DaemonClient& operator=(const DaemonClient&) = delete;

  // Never null. `errorHandler` may be empty.
  std::shared_ptr<LocalDaemon> remoteObjectProxyWithErrorHandler(
      std::function<void(NSErrorPtr)> errorHandler);

  // Runs on the executor each time a connection stands, the first one included. Set it
  // before the first message.
  void setConnectedHandler(std::function<void()> handler);

 private:
  std::shared_ptr<SocketClient> _socket;
};

// Everything a client needs to start a drive's vald.
ProgramToStart daemonProgram(const std::string& store, const std::string& socketPath,
                             const std::string& logPath);

}  // namespace skein
