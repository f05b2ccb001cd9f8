// A folder's link to the daemon's updates: setup, errors, notifications, invalidation.
#include "tests/extension/FolderFixture.h"
#include "vellum/VLAccount.h"
#include "vellum/VLContainer.h"

namespace skein {
namespace {

struct Link : FolderFixture {
  // What a reset and a signal leave in the transcript.
  const Lines kResetAndSignal = {"[DEBUG] invalidating change token",
                                 "[DEBUG] signal changes to fileproviderd",
                                 "manager: signal i0000000000000007"};
  std::size_t observers(const char* name) { return env.notificationCenter.observerCount(name); }
};

TEST_F(Link, IsSetUpOnceWithoutWaitingForTheWatch) {
  setUpReceiving();
  EXPECT_EQ(env.run(), Lines{"daemon: sender"});
  const auto sender = daemon.makeSender();
  daemon.senders.next()->reply(sender, nullptr);
  // On the enumerator's queue, not on the reply thread.
  EXPECT_EQ(env.transcript.take(), Lines{});
  EXPECT_EQ(env.run(), (Lines{"sender 1 boostPriority", "sender 1 watch file:///store/f 19",
                              "set up: no error"}));
  EXPECT_EQ(sender->receiver(), enumerator);
  setUpReceiving();
  EXPECT_EQ(env.run(), Lines{"set up: no error"});
  sender->watches.next()->reply(nullptr);
  sender->boosts.next()->reply();
  EXPECT_EQ(env.run(), Lines{});

  enumerator = make(kFolder, /*recursive=*/true);
  setUpReceiving();
  daemon.senders.next()->reply(daemon.makeSender(), nullptr);
  EXPECT_EQ(env.run()[2], "sender 2 watch file:///store/f 23");
}

TEST_F(Link, AFailedSetupLeavesItUnlinkedAndTheNextTriesAgain) {
  setUpReceiving();
  daemon.senders.next()->reply(nullptr, kVellum9);
  EXPECT_EQ(env.run(), (Lines{"daemon: sender", "set up: VLVellumErrorDomain 9"}));
  // A sender beside an error is not used.
  setUpReceiving();
  daemon.senders.next()->reply(daemon.makeSender(), kVellum9);
  EXPECT_EQ(env.run(), (Lines{"daemon: sender", "set up: VLVellumErrorDomain 9"}));
  setUpReceiving();
  daemon.senders.next()->fail(kCocoa14);
  // The connection's error ends it at once, on the reply thread.
  EXPECT_EQ(env.transcript.take(), (Lines{"daemon: sender", "set up: NSCocoaErrorDomain 14"}));
  // The daemon has no sender to give, and no error.
  setUpReceiving();
  daemon.senders.next()->reply(nullptr, nullptr);
  EXPECT_EQ(env.run(), (Lines{"daemon: sender", "set up: no error"}));
  setUpReceiving();
  EXPECT_EQ(env.run(), Lines{"daemon: sender"});
}

TEST_F(Link, OverlappingSetupsAreAFaultAndTheLastSenderStays) {
  setUpReceiving();
  setUpReceiving();
  EXPECT_EQ(env.run(),
            (Lines{"daemon: sender", "[CRIT] Assertion failed: !_isSettingUpNotificationReceiving",
                   "daemon: sender"}));
  daemon.senders.next()->reply(daemon.makeSender(), nullptr);
  daemon.senders.next()->reply(daemon.makeSender(), nullptr);
  EXPECT_EQ(env.run(), (Lines{"sender 1 boostPriority", "sender 1 watch file:///store/f 19",
                              "set up: no error", "sender 2 boostPriority",
                              "sender 2 watch file:///store/f 19", "set up: no error"}));
  enumerator->invalidate();
  EXPECT_EQ(env.run(), Lines{"sender 2 invalidate"});
}

TEST_F(Link, AnErrorDropsItAndSignalsForTheVellumDomainAlone) {
  const auto broken = [](const std::string& error) {
    return Lines{"[DEBUG] There was an error while fetching items: " + error,
                 "[DEBUG] invalidating change token"};
  };
  Lines withSignal = broken("VLVellumErrorDomain 9");
  withSignal.insert(withSignal.end(), kResetAndSignal.begin() + 1, kResetAndSignal.end());
  // From the boost's proxy, the watch's proxy, and the watch's reply.
  link()->boosts.next()->fail(kVellum9);
  EXPECT_EQ(env.run(), withSignal);
  link()->watches.next()->fail(kCocoa14);
  EXPECT_EQ(env.run(), broken("NSCocoaErrorDomain 14"));
  const auto sender = link();
  const NSData anchor = currentAnchor();
  push({makeItem(1)});
  env.run();
  sender->watches.next()->reply(kVellum9);
  EXPECT_EQ(env.run(), withSignal);
  EXPECT_TRUE(expired(anchor));
  EXPECT_EQ(enumerator->pendingChangeCount(), 0u);
  // Not invalidated: dropped. A request for changes does not link again; a listing does.
  EXPECT_EQ(daemon.senders.count(), 0u);
  env.run();
  list();
  EXPECT_EQ(env.runCalls(), Lines{"daemon: sender"});
}

TEST_F(Link, AnAccountChangeMattersOnlyWhileUnlinked) {
  const std::string notice =
      "[NOTICE] received account did update notification, invalidating change token";
  env.notificationCenter.postNotificationName(VLAccountTokenDidChangeNotification);
  EXPECT_EQ(env.run(), Lines{}) << "observing before the first setup";

  const auto sender = link();
  env.notificationCenter.postNotificationName(VLAccountTokenDidChangeNotification);
  EXPECT_EQ(env.run(), Lines{notice});
  sender->watches.next()->fail(kCocoa14);
  env.run();
  env.notificationCenter.postNotificationName(VLAccountTokenDidChangeNotification);
  Lines expected = kResetAndSignal;
  expected.insert(expected.begin(), notice);
  // At once, on this thread: nothing was posted to run later.
  EXPECT_EQ(env.transcript.take(), expected);
}

// What no host may do: the poster would wait for a queue that waits for the poster. Here it
// shows at once.
TEST_F(Link, ANotificationPostedWhereTheQueueNeedsThePosterIsADeadlock) {
  testing::FLAGS_gtest_death_test_style = "threadsafe";
  link();
  enumerator->invalidate();  // work on the queue that only this thread runs
  EXPECT_DEATH(env.notificationCenter.postNotificationName(VLAccountTokenDidChangeNotification),
               "would wait for ever");
}

TEST_F(Link, TheContainersAreWatchedAtTheRootAlone) {
  link();
  EXPECT_EQ(observers(VLContainerListDidChangeNotification), 0u);
  enumerator = make(kRoot);
  enumerator->setupNotificationReceivingIfNeededWithCompletion([](NSErrorPtr) {});
  EXPECT_EQ(env.run(), (Lines{"containers: all", "daemon: sender"}));
  // Registered once, however often it is set up.
  daemon.senders.next()->fail(kCocoa14);
  setUpReceiving();
  daemon.senders.next()->reply(daemon.makeSender(), nullptr);
  env.run();
  EXPECT_EQ(observers(VLContainerListDidChangeNotification), 1u);
  const NSData anchor = currentAnchor();
  env.notificationCenter.postNotificationName(VLContainerListDidChangeNotification);
  EXPECT_EQ(env.transcript.take(),
            (Lines{"[DEBUG] ┏1 container list did change, invalidating our change token",
                   "[DEBUG] invalidating change token", "[DEBUG] signal changes to fileproviderd",
                   "manager: signal NSFileProviderRootContainerItemIdentifier", "[DEBUG] ┗1 "}));
  EXPECT_TRUE(expired(anchor));
}

TEST_F(Link, InvalidationEndsItAndAllObserving) {
  const auto sender = link();
  EXPECT_EQ(observers(VLAccountTokenDidChangeNotification), 1u);
  enumerator->invalidate();
  EXPECT_EQ(env.transcript.take(), Lines{});
  EXPECT_EQ(env.run(), Lines{"sender 1 invalidate"});
  EXPECT_EQ(observers(VLAccountTokenDidChangeNotification), 0u);
  enumerator->invalidate();
  EXPECT_EQ(env.run(), Lines{});
  // Asked once more it lists, without a link and without observing.
  list();
  env.run();
  daemon.senders.next()->reply(daemon.makeSender(), nullptr);
  EXPECT_EQ(env.run(), (Lines{"sender 2 invalidate",
                              "daemon: items in i0000000000000007 order 0 "
                              "offset 0 limit 200"}));
  EXPECT_EQ(observers(VLAccountTokenDidChangeNotification), 0u);
}

TEST_F(Link, ASenderThatComesAfterInvalidationIsInvalidated) {
  setUpReceiving();
  enumerator->invalidate();
  env.run();
  daemon.senders.next()->reply(daemon.makeSender(), nullptr);
  EXPECT_EQ(env.run(), (Lines{"sender 1 invalidate", "set up: no error"}));
}

TEST_F(Link, TheEnumeratorDiesAfterInvalidateAndWithTheLastHolderWithoutIt) {
  std::weak_ptr<VLFileEnumerator> weak = enumerator;
  auto sender = link();
  enumerator->invalidate();
  env.run();
  enumerator = nullptr;
  // The watch's reply is still out.
  EXPECT_FALSE(weak.expired());
  sender->watches.next()->reply(nullptr);
  EXPECT_TRUE(weak.expired());

  enumerator = make(kFolder);
  weak = enumerator;
  sender = link();
  sender->watches.next()->reply(nullptr);
  enumerator = nullptr;
  EXPECT_FALSE(weak.expired()) << "the daemon holds its receiver";
  // The daemon's end of the link dies: nothing else may hold the enumerator.
  const auto boost = sender->boosts.next();
  sender->releaseReceiver();
  EXPECT_TRUE(weak.expired());
  boost->fail(kVellum9);
  EXPECT_EQ(env.runCalls(), Lines{});
}

}  // namespace
}  // namespace skein
