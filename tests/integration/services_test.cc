// The services of items with the real programs: commands, the example, and what dies on
// the way.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>
#include <nlohmann/json.hpp>

#include "base/ThreadPool.h"
#include "linux/protocol/DaemonClient.h"
#include "linux/protocol/ServicesClient.h"
#include "tests/integration/Drive.h"
#include "tests/protocol/Waiting.h"

namespace skein {
namespace {

using namespace std::chrono_literals;
using nlohmann::json;

class ServicesOfDrive : public testing::Test {
 protected:
  ServicesOfDrive() {
    drive.write("/letter.txt", "hello");
    std::filesystem::create_directories(drive.store() + "/Team");
    drive.write("/Team/plan.txt", "plan");
    EXPECT_EQ(drive.run({"ls", "-R", "/"}).code, 0);
  }
  json ask(Arguments arguments) {
    arguments.push_back("--json");
    const Result result = drive.run(arguments);
    EXPECT_EQ(result.code, 0) << arguments.at(1) << ": " << result.errors;
    return json::parse(result.output, nullptr, false);
  }
  static std::size_t descriptorsOf(pid_t process) {
    const std::filesystem::directory_iterator folder("/proc/" + std::to_string(process) + "/fd");
    return static_cast<std::size_t>(std::distance(begin(folder), end(folder)));
  }

  Drive drive;
};

TEST_F(ServicesOfDrive, ADocumentIsSharedChangedAndNoLongerShared) {
  EXPECT_EQ(ask({"share", "info", "/letter.txt"})["services"],
            json({"com.tessel.QuireCollaboration", "com.tessel.Vellum.SharingV1"}));
  EXPECT_EQ(drive.run({"share", "show", "/letter.txt"}).output, "not shared\n");
  const json made = ask({"share", "create", "/letter.txt", "--with", "kim:write", "--with", "ada",
                         "--public", "read", "--title", "Hello"});
  EXPECT_EQ(made["participants"].size(), 3U);
  EXPECT_EQ(made["participants"][0]["role"], "owner");
  EXPECT_EQ(made["participants"][1]["permission"], "write");
  EXPECT_EQ(made["participants"][2]["permission"], "read");
  EXPECT_EQ(made["public"], "read");
  EXPECT_EQ(made["title"], "Hello");
  EXPECT_EQ(drive.run({"share", "create", "/letter.txt"}).code, 6);
  EXPECT_EQ(ask({"share", "url", "/letter.txt"})["url"], made["url"]);
  EXPECT_EQ(ask({"share", "info", "/letter.txt"})["shared"], true);
  const json saved = ask({"share", "save", "/letter.txt", "--without", "ada"});
  EXPECT_EQ(saved["participants"].size(), 2U);
  EXPECT_EQ(drive.run({"share", "save", "/letter.txt", "--without", "nobody"}).code, 2);

  EXPECT_EQ(ask({"collab", "version", "/letter.txt"}),
            json({{"version", 1}, {"capabilities", 82}, {"provider", "com.tessel.Vellum"}}));
  const json token = ask({"collab", "token", "/letter.txt"});
  EXPECT_TRUE(token["base"].is_string() && token["share"].is_string());
  EXPECT_TRUE(token["expires"].is_null());
  EXPECT_EQ(drive.run({"collab", "refresh", "/letter.txt"}).code, 0);

  EXPECT_EQ(drive.run({"share", "remove", "/letter.txt"}).code, 0);
  EXPECT_EQ(ask({"share", "show", "/letter.txt"})["shared"], false);
  EXPECT_EQ(drive.run({"share", "save", "/letter.txt"}).code, 1);
  // It has nothing to remove then, which is no error.
  EXPECT_EQ(drive.run({"share", "remove", "/letter.txt"}).code, 0);
}

TEST_F(ServicesOfDrive, AFoldersShareIsMadeByItsURLAndEndsAtTheFolder) {
  const Result refused = drive.run({"share", "create", "/Team"});
  EXPECT_EQ(refused.code, 1);
  EXPECT_NE(refused.errors.find("folder's share"), std::string::npos) << refused.errors;
  EXPECT_EQ(ask({"collab", "folder-state", "/Team/plan.txt"})["inSharedFolder"], false);
  ask({"share", "url", "/Team"});
  EXPECT_EQ(ask({"collab", "folder-state", "/Team/plan.txt"}),
            json({{"inSharedFolder", true}, {"folder", "Team"}}));
  EXPECT_EQ(ask({"share", "show", "/Team/plan.txt"})["type"], "folder");
  EXPECT_EQ(drive.run({"share", "remove", "/Team/plan.txt"}).code, 1);
  EXPECT_EQ(drive.run({"share", "remove", "/Team"}).code, 0);
  EXPECT_EQ(ask({"collab", "folder-state", "/Team/plan.txt"})["inSharedFolder"], false);
}

TEST_F(ServicesOfDrive, WhatIsNotOfferedIsToldSo) {
  EXPECT_EQ(drive.run({"alias", "/letter.txt", "/link"}).code, 0);
  EXPECT_TRUE(ask({"share", "info", "/link"})["services"].empty());
  EXPECT_TRUE(ask({"share", "info", "/"})["services"].empty());
  EXPECT_EQ(drive.run({"share", "show", "/"}).code, 1);
  EXPECT_EQ(drive.run({"share", "info", "/nothing"}).code, 3);
  EXPECT_EQ(drive.run({"collab", "token", "/Team"}).code, 1);
  EXPECT_EQ(drive.run({"share", "create", "/letter.txt", "--with", ":write"}).code, 2);
  EXPECT_EQ(drive.run({"share", "create", "/letter.txt", "--public", "all"}).code, 2);
  EXPECT_EQ(drive.run({"account", "logout"}).code, 0);
  EXPECT_EQ(drive.run({"share", "info", "/letter.txt"}).code, 4);
}

TEST_F(ServicesOfDrive, TheExampleSharesADocument) {
  const Result result = drive.shell("share_document \"$SKEIN_STORE\" /letter.txt kim");
  EXPECT_EQ(result.code, 0) << result.errors;
  const auto lines = result.lines();
  ASSERT_EQ(lines.size(), 5U) << result.output;
  EXPECT_EQ(lines[0], "offers com.tessel.QuireCollaboration");
  EXPECT_EQ(lines[3], "kim may change it");
  EXPECT_EQ(lines[4] + "\n", drive.run({"share", "url", "/letter.txt"}).output);
  EXPECT_EQ(drive.shell("share_document \"$SKEIN_STORE\" /nothing kim").code, 1);
}

TEST_F(ServicesOfDrive, ClientsThatDieAtAnyTimeLeaveNothingBehind) {
  const pid_t host = drive.host();
  drive.run({"share", "show", "/letter.txt"});
  const std::size_t before = descriptorsOf(host);
  for (int stage = 0; stage < 16; ++stage) {
    const auto client = drive.start(
        {stage % 2 == 0 ? "share" : "collab", stage % 2 == 0 ? "url" : "token", "/letter.txt"});
    // Somewhere between its start and its end.
    client->readLine(std::chrono::milliseconds(8 * stage));
    sendSignal(client->pid(), SIGKILL);
  }
  const Result after = drive.run({"share", "info", "/letter.txt"});
  EXPECT_EQ(after.code, 0) << after.errors;
  EXPECT_EQ(drive.host(), host);
  EXPECT_TRUE(becomesTrue([&] { return descriptorsOf(host) <= before; }))
      << descriptorsOf(host) << " descriptors, " << before << " before";
}

// Long requests, and a vald that is killed in the middle of each.
class LostDaemon : public ServicesOfDrive {
 protected:
  template <class Replies>
  static bool answersWithin(const Replies& replies, std::chrono::milliseconds time) {
    const auto end = std::chrono::steady_clock::now() + time;
    while (replies.count() == 0) {
      if (std::chrono::steady_clock::now() > end) return false;
      std::this_thread::yield();
    }
    return true;
  }
  template <class... Values, class Start>
  NSErrorPtr answerAfterKill(const std::string& method, Start start) {
    const pid_t vald = drive.daemon();
    const auto daemon = std::make_shared<DaemonClient>(loop, executor, [&] {
      DaemonClient::Options options;
      options.socketPath = drive.socketOf("vald");
      return options;
    }());
    FaultInjection fault;
    fault.method = method;
    fault.action = FaultInjection::Action::Delay;
    fault.delayMilliseconds = 30'000;
    const auto [planned] = skein::ask<NSErrorPtr>(*daemon, [&](LocalDaemon& proxy, auto reply) {
      proxy.injectFault(fault, std::move(reply));
    });
    EXPECT_FALSE(planned) << method;
    Outcome<Values..., NSErrorPtr> outcome;
    const auto progress = start(outcome.reply());
    // vald is killed when the request has surely come to it, and before it answers.
    EXPECT_FALSE(answersWithin(*outcome.replies, 300ms)) << method << " was not delayed";
    const auto killed = std::chrono::steady_clock::now();
    sendSignal(vald, SIGKILL);
    const auto values = outcome.value();
    const auto time = std::chrono::steady_clock::now() - killed;
    std::printf("%-22s answered %lld ms after vald was killed\n", method.c_str(),
                static_cast<long long>(
                    std::chrono::duration_cast<std::chrono::milliseconds>(time).count()));
    // By the lost connection: the client's patience with a silent peer is 4 seconds.
    EXPECT_LT(time, 3s) << method;
    EXPECT_EQ(outcome.replies->count(), 0U);
    // Everything goes on with a new vald.
    const Result after = drive.run({"share", "info", "/letter.txt"});
    EXPECT_EQ(after.code, 0) << after.errors;
    return std::get<NSErrorPtr>(values);
  }
  std::shared_ptr<ServiceConnection> connect(const char* serviceName) {
    Outcome<std::shared_ptr<ServiceEndpoint>, NSErrorPtr> endpoint;
    services->endpoint(HostTarget::path("/letter.txt"), serviceName, endpoint.reply());
    Outcome<std::shared_ptr<ServiceConnection>, NSErrorPtr> connection;
    std::get<0>(endpoint.value())->connect(connection.reply());
    return std::get<0>(connection.value());
  }

  const std::shared_ptr<RpcLoop> loop = RpcLoop::start("test-io");
  const std::shared_ptr<Executor> executor = std::make_shared<ThreadPool>(2, "test");
  const std::shared_ptr<HostServices> services = makeHostServicesClient(
      loop, executor, {"skein-host", drive.socketOf("skein-host"), std::nullopt, 20s});
};

TEST_F(LostDaemon, EveryLongRequestIsAnsweredOnce) {
  const auto connection = connect(VLSharingServiceName);
  ASSERT_TRUE(connection);
  const auto sharing = connection->sharing();
  EXPECT_TRUE(answerAfterKill<CKSharePtr>("copyShare", [&](auto reply) {
    return sharing->fetchShareWithCompletion(std::move(reply));
  }));
  EXPECT_TRUE(answerAfterKill<NSURLPtr>("copyShareURL", [&](auto reply) {
    return sharing->fetchShareURLWithCompletion(std::move(reply));
  }));
  CKShare share;
  share.values[CKShareTypeKey] = "public.text";
  EXPECT_TRUE(answerAfterKill<CKSharePtr>("saveShare", [&](auto reply) {
    return sharing->saveShare(std::make_shared<const CKShare>(share), std::move(reply));
  }));
  ASSERT_EQ(drive.run({"share", "url", "/letter.txt"}).code, 0);
  EXPECT_TRUE(answerAfterKill<>("destroyShare", [&](auto reply) {
    return sharing->unshareWithCompletion(std::move(reply));
  }));

  const auto collaboration = connect(VLQuireCollaborationServiceName)->collaboration();
  using Words = std::optional<std::string>;
  EXPECT_TRUE((answerAfterKill<Words, Words, Words, std::optional<NSDate>>(
      "copyShareTokens", [&](auto reply) {
        return collaboration->fetchCollaborationTokenWithCompletionHandler(std::move(reply));
      })));
  EXPECT_TRUE(answerAfterKill<>("refreshSharingState", [&](auto reply) {
    return collaboration->refreshSharingStateWithCompletionHandler(std::move(reply));
  }));
  EXPECT_TRUE(answerAfterKill<bool>("shareOptions", [&](auto reply) {
    return collaboration->fetchFolderSharingStateWithCompletionHandler(std::move(reply));
  }));
  EXPECT_TRUE(answerAfterKill<>("download", [&](auto reply) {
    return collaboration->fetchLatestRevisionWithCompletionHandler(std::move(reply));
  }));
}

}  // namespace
}  // namespace skein
