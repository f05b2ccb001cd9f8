// A scripted daemon behind a real server on a real socket, and real clients.
#pragma once

#include <gtest/gtest.h>
#include <stdlib.h>

#include <filesystem>
#include <memory>
#include <string>

#include "base/ThreadPool.h"
#include "linux/protocol/DaemonClient.h"
#include "linux/protocol/DaemonServer.h"
#include "tests/protocol/FakeDaemon.h"
#include "tests/protocol/Waiting.h"
#include "vellum/VLErrors.h"

namespace skein {

class SilentLog final : public Log {
 public:
  void write(LogType, std::string_view line) override { lines.add(std::string(line)); }
  Inbox<std::string> lines;
};

class ProtocolTest : public testing::Test {
 protected:
  ProtocolTest() {
    char name[] = "/tmp/skein-protocol-XXXXXX";
    folder = mkdtemp(name);
    socketPath = folder + "/socket";
    startServer();
    client = newClient();
  }
  ~ProtocolTest() override {
    client.reset();
    server.reset();
    std::filesystem::remove_all(folder);
  }

  void startServer() {
    NSErrorPtr error;
    server = DaemonServer::listen(loop, executor, daemon, socketPath, log, &error);
    ASSERT_TRUE(server) << error->localizedDescription();
  }
  std::shared_ptr<DaemonClient> newClient(
      std::chrono::milliseconds deadline = std::chrono::seconds(20)) {
    DaemonClient::Options options;
    options.socketPath = socketPath;
    options.deadline = deadline;
    return std::make_shared<DaemonClient>(clientLoop, executor, std::move(options));
  }

  static NSErrorPtr unreachable(const NSErrorPtr& error) {
    if (!error || error->domain() != VLVellumErrorDomain ||
        error->code() != VLVellumErrorDaemonUnreachable ||
        error->localizedDescription().find("vald") == std::string::npos) {
      ADD_FAILURE() << "not the unreachable error: "
                    << (error ? error->localizedDescription() : "nil");
    }
    return error;
  }

  std::string folder;
  std::string socketPath;
  SilentLog log;
  // Outlives the executor, whose last tasks may still be calling it.
  std::shared_ptr<FakeDaemon> daemon = std::make_shared<FakeDaemon>();
  std::shared_ptr<Executor> executor = std::make_shared<ThreadPool>(2, "test");
  std::shared_ptr<RpcLoop> loop = RpcLoop::start("vald-io");
  std::shared_ptr<RpcLoop> clientLoop = RpcLoop::start("client-io");
  std::unique_ptr<DaemonServer> server;
  std::shared_ptr<DaemonClient> client;
};

}  // namespace skein
