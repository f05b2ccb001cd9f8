// The extension over a scripted framework, served by skein-host's own server on a real
// socket, and clients of its services.
#pragma once

#include <gtest/gtest.h>
#include <stdlib.h>

#include <filesystem>
#include <memory>
#include <string>

#include "extension/VLFileProviderExtension.h"
#include "linux/host/LocalListeners.h"
#include "linux/host/ServiceRequests.h"
#include "linux/protocol/HostServer.h"
#include "linux/protocol/ServicesClient.h"
#include "tests/protocol/Waiting.h"
#include "tests/support/CountingPool.h"
#include "tests/support/Observers.h"
#include "tests/support/TestEnvironment.h"
#include "vellum/VLErrors.h"

namespace skein {

class ServicesHost : public testing::Test {
 protected:
  ServicesHost() {
    char name[] = "/tmp/skein-services-XXXXXX";
    folder = mkdtemp(name);
    framework.documents.urls = {{VLFileObjectID::documentWithRawID(1), storeURL("/a")},
                                {VLFileObjectID::documentWithRawID(2), storeURL("/b")}};
    framework.queryItems.items = {{"/store/a", makeItem(1)}, {"/store/b", makeItem(2)}};
    host->setExtension(
        VLFileProviderExtension::init(std::make_shared<NSExtensionAttributes>(), env.environment));
    const auto services = std::make_shared<ServiceRequests>(
        host, [](const HostTarget& target, auto reply) { reply(target.text, nullptr); });
    NSErrorPtr error;
    server = HostServer::listen(loop, pool, nullptr, services, folder + "/socket", env.log, &error);
    EXPECT_TRUE(server) << error->localizedDescription();
    client = newClient();
  }
  ~ServicesHost() override {
    client = nullptr;
    server = nullptr;
    framework.dropConnection(vl_errorDaemonUnreachable("the test has ended"));
    EXPECT_TRUE(pool->waitIdle());
    std::filesystem::remove_all(folder);
  }

  SocketClient::Options options() const {
    return {"skein-host", folder + "/socket", std::nullopt, std::chrono::seconds(20)};
  }
  std::shared_ptr<HostServices> newClient() {
    return makeHostServicesClient(clientLoop, clientPool, options());
  }

  // Makes a request and waits for its reply; the progress, if any, goes to `progress`.
  template <class... Values, class Start>
  std::tuple<Values..., NSErrorPtr> ask(Start start) {
    Outcome<Values..., NSErrorPtr> outcome;
    start(outcome.reply());
    return outcome.value();
  }
  std::shared_ptr<ServiceEndpoint> endpoint(const std::string& serviceName,
                                            const std::string& identifier = documentID(1)) {
    const auto [made, error] = ask<std::shared_ptr<ServiceEndpoint>>([&](auto reply) {
      client->endpoint(HostTarget::identifier(identifier), serviceName, std::move(reply));
    });
    EXPECT_FALSE(error) << error->localizedDescription();
    return made;
  }
  std::shared_ptr<ServiceConnection> connect(const std::shared_ptr<ServiceEndpoint>& endpoint) {
    const auto [made, error] = ask<std::shared_ptr<ServiceConnection>>(
        [&](auto reply) { endpoint->connect(std::move(reply)); });
    lastError = error;
    return made;
  }
  std::shared_ptr<ServiceConnection> sharingOf(const std::string& identifier = documentID(1)) {
    return connect(endpoint(VLSharingServiceName, identifier));
  }
  std::tuple<CKSharePtr, NSErrorPtr> fetchShare(ServiceConnection& connection) {
    return ask<CKSharePtr>(
        [&](auto reply) { connection.sharing()->fetchShareWithCompletion(std::move(reply)); });
  }
  // From now on fetches find `share`.
  void answerFetches(const CKSharePtr& share) {
    framework.sharing.copies.made = [share](const std::shared_ptr<ScriptedShareCopy>& copy) {
      copy->onStart = [weak = std::weak_ptr(copy), share] {
        weak.lock()->finish(share, std::nullopt, nullptr);
      };
    };
  }
  static bool nothingIsLeft() {
    return LocalListeners::livingListeners() == 0 && LocalListeners::livingConnections() == 0;
  }

  std::string folder;
  const std::shared_ptr<CountingPool> pool = std::make_shared<CountingPool>();
  const std::shared_ptr<Executor> clientPool = std::make_shared<ThreadPool>(2, "clients");
  LocalListeners listeners{pool};
  TestEnvironment env{pool, nullptr, &listeners};
  ScriptedFramework& framework = env.framework;
  const std::shared_ptr<FileProviderHost> host = std::make_shared<FileProviderHost>(
      HostTools{pool, std::make_shared<SteadyTimers>(pool)}, nullptr, env.log);
  const std::shared_ptr<RpcLoop> loop = RpcLoop::start("host-io");
  const std::shared_ptr<RpcLoop> clientLoop = RpcLoop::start("client-io");
  std::unique_ptr<HostServer> server;
  std::shared_ptr<HostServices> client;
  NSErrorPtr lastError;
};

}  // namespace skein
