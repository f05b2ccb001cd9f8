// Messages that get no answer: each fails once, soon, with an error that names vald.
#include <thread>

#include "linux/protocol/UnixSocket.h"
#include "tests/protocol/ProtocolTest.h"

namespace skein {
namespace {

using Page = Outcome<NSFileProviderItems, std::uint64_t, NSErrorPtr>;

class Failures : public ProtocolTest {
 protected:
  static void list(const std::shared_ptr<LocalDaemon>& proxy, Page& page,
                   std::uint64_t offset = 0) {
    proxy->enumerateItemsInFolder(std::nullopt, 0, offset, 1, page.reply());
  }
  // A message goes through, so whatever was sent before it has been dealt with.
  void expectServed() {
    const auto [rank, error] = ask<std::uint64_t, NSErrorPtr>(
        *client,
        [](LocalDaemon& proxy, auto reply) { proxy.currentNotifRankWithReply(std::move(reply)); });
    EXPECT_EQ(error, nullptr);
  }
};

TEST_F(Failures, LostConnectionFailsEverythingOutstandingOnce) {
  constexpr std::size_t kMessages = 100;
  daemon->holds = true;
  Page page;
  const auto proxy = client->remoteObjectProxyWithErrorHandler(page.errorHandler());
  for (std::size_t i = 0; i < kMessages; ++i) list(proxy, page);
  ASSERT_TRUE(daemon->held.waitForCount(kMessages));

  server->dropConnections();
  ASSERT_TRUE(page.errors->waitForCount(kMessages));
  unreachable(*page.errors->take());

  // Late answers are nobody's, and the same proxy works again.
  while (daemon->held.count() > 0) (*daemon->held.take())({}, 7, nullptr);
  daemon->holds = false;
  daemon->number = 3;
  list(proxy, page);
  EXPECT_EQ(std::get<1>(*page.replies->take()), 3U);
  EXPECT_EQ(page.replies->count(), 0U);
  EXPECT_EQ(page.errors->count(), kMessages - 1);
}

TEST_F(Failures, AnswerThatTheDaemonDropsIsAFailure) {
  daemon->holds = true;
  Page page;
  list(client->remoteObjectProxyWithErrorHandler(page.errorHandler()), page);
  ASSERT_TRUE(daemon->held.waitForCount(1));
  daemon->held.take();  // destroyed uncalled
  unreachable(*page.errors->take());
  EXPECT_EQ(page.replies->count(), 0U);
  expectServed();
}

TEST_F(Failures, NobodyListens) {
  server.reset();
  Page page;
  const auto proxy = client->remoteObjectProxyWithErrorHandler(page.errorHandler());
  list(proxy, page);
  EXPECT_NE(unreachable(*page.errors->take())->localizedDescription().find("does not run"),
            std::string::npos);
  startServer();
  list(proxy, page);
  EXPECT_TRUE(page.replies->take().has_value());
}

TEST_F(Failures, VersionThatVanishesAndComesBackIsNoticed) {
  Inbox<int> connected;
  client->setConnectedHandler([&] { connected.add(1); });
  expectServed();
  server.reset();
  startServer();
  // The old connection may still be about to end: a message may fail, the next may not.
  Page page;
  const auto proxy = client->remoteObjectProxyWithErrorHandler(page.errorHandler());
  for (std::size_t sent = 1; page.replies->count() == 0; ++sent) {
    ASSERT_LT(sent, 100U);
    list(proxy, page);
    ASSERT_TRUE(
        becomesTrue([&] { return page.replies->count() > 0 || page.errors->count() >= sent; }));
  }
  EXPECT_TRUE(connected.waitForCount(2));
}

// A listener that never accepts stands for a stopped process: the system completes the
// connection, and nothing is ever answered.
TEST_F(Failures, SilentPeerFailsAtTheDeadline) {
  server.reset();
  const FileDescriptor listener = listenOnUnixSocket(socketPath, nullptr);
  client = newClient(std::chrono::milliseconds(50));
  Page page;
  const auto proxy = client->remoteObjectProxyWithErrorHandler(page.errorHandler());
  list(proxy, page);
  list(proxy, page);
  proxy->checkIndex(1, [](auto, auto) { ADD_FAILURE() << "nobody could answer"; });
  ASSERT_TRUE(page.errors->waitForCount(3));
  while (page.errors->count() > 0) {
    EXPECT_NE(unreachable(*page.errors->take())->localizedDescription().find("did not answer"),
              std::string::npos);
  }
}

TEST_F(Failures, SlowAnswerCostsThatMessageAlone) {
  client = newClient(std::chrono::milliseconds(50));
  daemon->holds = true;
  Page slow;
  Outcome<std::vector<IndexDifference>, NSErrorPtr> check;
  client->remoteObjectProxyWithErrorHandler(check.errorHandler())->checkIndex(9, check.reply());
  ASSERT_TRUE(daemon->heldChecks.waitForCount(1));
  list(client->remoteObjectProxyWithErrorHandler(slow.errorHandler()), slow);
  unreachable(*slow.errors->take());
  // The server lives, so the connection does, and with it what may take its time.
  (*daemon->heldChecks.take())({}, nullptr);
  EXPECT_EQ(std::get<1>(check.value()), nullptr);
  (*daemon->held.take())({}, 1, nullptr);
  expectServed();
  EXPECT_EQ(slow.replies->count(), 0U);
  EXPECT_EQ(slow.errors->count(), 0U);
}

TEST_F(Failures, ClosedClientFailsWhatIsUnderWayAndWhatComesLater) {
  daemon->holds = true;
  Page page;
  const auto proxy = client->remoteObjectProxyWithErrorHandler(page.errorHandler());
  list(proxy, page);
  ASSERT_TRUE(daemon->held.waitForCount(1));
  client.reset();
  ASSERT_TRUE(page.errors->waitForCount(1));
  list(proxy, page);
  ASSERT_TRUE(page.errors->waitForCount(2));
  unreachable(*page.errors->take());
}

// The deaths of proxies, clients, replies and connections on whichever threads, at once.
TEST_F(Failures, ManyThreadsAndDroppedConnections) {
  constexpr int kThreads = 4;
  constexpr int kRounds = 25;
  Page page;
  std::vector<std::thread> threads;
  for (int t = 0; t < kThreads; ++t) {
    threads.emplace_back([&, t] {
      std::shared_ptr<DaemonClient> mine = newClient();
      for (int round = 0; round < kRounds; ++round) {
        list((round % 2 == 0 ? mine : client)
                 ->remoteObjectProxyWithErrorHandler(page.errorHandler()),
             page, static_cast<std::uint64_t>(t));
        if (round % 5 == t) server->dropConnections();
        if (round % 10 == 9) mine = newClient();
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_TRUE(becomesTrue(
      [&] { return page.replies->count() + page.errors->count() >= kThreads * kRounds; }));
  EXPECT_EQ(page.replies->count() + page.errors->count(), std::size_t{kThreads * kRounds});
}

}  // namespace
}  // namespace skein
