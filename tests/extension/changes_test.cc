// A folder's pending changes and its sync anchors.
#include <future>
#include <thread>

#include "support/NSData+Additions.h"
#include "tests/extension/FolderFixture.h"

namespace skein {
namespace {

using Changes = FolderFixture;
constexpr auto kDeadline = std::chrono::seconds(20);

TEST_F(Changes, APushIsSignalledThenReplied) {
  push({makeItem(1)});
  EXPECT_EQ(env.run(), (Lines{"[DEBUG] signal changes to fileproviderd",
                              "manager: signal i0000000000000007", "replied"}));
  env.framework.manager.signals.next()->reply(kCocoa14);
  EXPECT_EQ(env.run(), Lines{"[ERROR] failed to signal enumerator for root container: "
                             "NSCocoaErrorDomain 14"});
  push({makeItem(1)});
  env.run();
  env.framework.manager.signals.next()->reply(nullptr);
  EXPECT_EQ(env.run(), Lines{}) << "a signal that went well says nothing";
  enumerator->receiveProgressUpdates({makeItem(2)},
                                     [this] { env.transcript.add("progress was replied"); });
  EXPECT_EQ(env.run(), Lines{});
  EXPECT_EQ(enumerator->pendingChangeCount(), 1u);
}

TEST_F(Changes, TheLaterEventOfAnItemWins) {
  const NSData anchor = currentAnchor();
  push({makeItem(1, false, "old"), makeItem(2), makeItem(3, true), makeItem(4)});
  push({makeItem(1, false, "new"), makeItem(2, true), makeItem(3, false, "back")});
  push({makeItem(5, true), makeItem(5, true), makeItem(6, true), makeItem(5, true)});
  env.run();
  const auto batch = changes(anchor);
  EXPECT_EQ(env.run(),
            (Lines{"[DEBUG] ┏1 listing changes", "[DEBUG] requested rank: 0",
                   "observer: updated [back, doc, new]",
                   // As often as it was deleted.
                   "observer: deleted [d0000000000000002, d0000000000000005, d0000000000000005, "
                   "d0000000000000005, d0000000000000006]",
                   "observer: anchor", "[DEBUG] ┗1 "}));
  EXPECT_EQ(batch->deleted,
            (Lines{documentID(2), documentID(5), documentID(5), documentID(6), documentID(5)}));
  EXPECT_FALSE(batch->moreComing);

  // An update takes every occurrence back.
  push({makeItem(5, true), makeItem(6, true), makeItem(5, true), makeItem(5, false, "five")});
  EXPECT_EQ(changes(batch->anchor)->deleted, Lines{documentID(6)});
}

TEST_F(Changes, EachBatchIsOneRankAndNothingIsNone) {
  const NSData first = currentAnchor();
  EXPECT_EQ(changes(first)->anchor, first);
  EXPECT_EQ(env.run(),
            (Lines{"[DEBUG] ┏1 listing changes", "[DEBUG] requested rank: 0",
                   "[DEBUG] no update to send back", "observer: anchor", "[DEBUG] ┗1 "}));
  push({makeItem(1)});
  env.run();
  const NSData second = changes(first)->anchor.value();
  // Both lists are reported, the empty one too.
  EXPECT_EQ(env.runCalls(),
            (Lines{"observer: updated [doc]", "observer: deleted []", "observer: anchor"}));
  push({makeItem(1, true)});
  env.run();
  const NSData third = changes(second)->anchor.value();
  EXPECT_EQ(env.runCalls(), (Lines{"observer: updated []", "observer: deleted [d0000000000000001]",
                                   "observer: anchor"}));
  EXPECT_EQ(changes(third)->anchor, third);
  uuid_t uuid;
  std::copy_n(third.bytes() + 8, uuid.size(), uuid.begin());
  EXPECT_EQ(vl_changeTokenRankWithUUID(third, uuid), 2);
  // The current anchor has rank 0 whatever the rank is, and so has expired by now.
  EXPECT_EQ(currentAnchor(), first);
  EXPECT_TRUE(expired(first));
  // The reset that came with it begins at rank 0 again.
  EXPECT_EQ(changes(currentAnchor())->error, nullptr);
}

TEST_F(Changes, AnExpiredAnchorIsToldThenTheStateIsReset) {
  const NSData first = currentAnchor();
  uuid_t uuid;
  std::copy_n(first.bytes() + 8, uuid.size(), uuid.begin());
  push({makeItem(1)});
  env.run();
  changes(vl_changeTokenFromRank(1, uuid));
  EXPECT_EQ(env.run(), (Lines{"[DEBUG] ┏1 listing changes", "[DEBUG] requested rank: 1",
                              "[DEBUG] token expired (current rank 0)",
                              "observer: error NSFileProviderErrorDomain -1002",
                              "[DEBUG] invalidating change token", "[DEBUG] ┗1 "}));
  EXPECT_EQ(enumerator->pendingChangeCount(), 0u);

  // Everything older than a reset has expired, and asking with it resets again.
  for (const std::optional<NSData>& stale :
       {std::optional(first), std::optional(vl_changeTokenFromRank(1ULL << 63, uuid)),
        std::optional(NSData()), std::optional<NSData>()}) {
    const NSData before = currentAnchor();
    EXPECT_EQ(brief(changes(stale)->error), kExpired);
    EXPECT_NE(currentAnchor(), before);
  }
  // The right uuid with a negative rank.
  std::copy_n(currentAnchor().bytes() + 8, uuid.size(), uuid.begin());
  env.run();
  EXPECT_TRUE(expired(vl_changeTokenFromRank(~0ULL, uuid)));
  EXPECT_EQ(env.run()[1], "[DEBUG] requested rank: -1");
}

TEST_F(Changes, MoreThanFiveThousandResetTheStateAndAreStillSignalled) {
  VLQueryItems items;
  for (std::uint64_t i = 0; i < 4998; ++i) items.push_back(makeItem(i));
  const NSData anchor = currentAnchor();
  push(items);
  push({makeItem(9001, true), makeItem(9001, true)});
  EXPECT_EQ(enumerator->pendingChangeCount(), 5000u);
  env.run();
  // One duplicate deletion too many.
  push({makeItem(9001, true)});
  EXPECT_EQ(env.run(),
            (Lines{"[DEBUG] invalidating change token", "[DEBUG] signal changes to fileproviderd",
                   "manager: signal i0000000000000007", "replied"}));
  EXPECT_EQ(enumerator->pendingChangeCount(), 0u);
  EXPECT_TRUE(expired(anchor));

  // Tested after the whole push: one that passes the cap and comes back under it stays.
  items.clear();
  for (int i = 0; i < 6000; ++i) items.push_back(makeItem(1, true));
  items.push_back(makeItem(1));
  push(items);
  EXPECT_EQ(enumerator->pendingChangeCount(), 1u);
}

// Asks for the current anchor from another thread, while it is being called.
struct AnchorAsker final : NSFileProviderChangeObserver {
  explicit AnchorAsker(VLFileEnumerator& enumerator) : _enumerator(enumerator) {}
  void didUpdateItems(const NSFileProviderItems&) override {}
  void didDeleteItemsWithIdentifiers(const std::vector<std::string>&) override {}
  void finishEnumeratingChangesUpToSyncAnchor(NSData, bool) override { ask(); }
  void finishEnumeratingWithError(NSErrorPtr) override { ask(); }
  void ask() {
    // On the heap and by reference count: when the other thread hangs, it is left to hang.
    const auto answered = std::make_shared<std::promise<void>>();
    std::thread([answered, enumerator = _enumerator.shared_from_this()] {
      enumerator->currentSyncAnchorWithCompletionHandler([&](auto) { answered->set_value(); });
    }).detach();
    EXPECT_EQ(answered->get_future().wait_for(kDeadline), std::future_status::ready)
        << "the current anchor waits for the enumerator's lock";
    // And on this thread the lock is re-entered: an observer may look again.
    again = _enumerator.pendingChangeCount();
  }
  std::size_t again = 99;
  VLFileEnumerator& _enumerator;
};

TEST_F(Changes, TheCurrentAnchorNeverWaitsForTheLock) {
  const auto observer = std::make_shared<AnchorAsker>(*enumerator);
  enumerator->enumerateChangesForObserver(observer, currentAnchor());
  EXPECT_EQ(observer->again, 0u);
  enumerator->enumerateChangesForObserver(observer, NSData());
}

// A batch is reported without the lock, so that another push is not held up by it.
struct Pusher final : NSFileProviderChangeObserver {
  explicit Pusher(VLFileEnumerator& enumerator) : _enumerator(enumerator) {}
  void didUpdateItems(const NSFileProviderItems&) override {
    const auto replied = std::make_shared<std::promise<void>>();
    std::thread([replied, enumerator = _enumerator.shared_from_this()] {
      enumerator->receiveUpdates({makeItem(2)}, {}, {}, [replied] { replied->set_value(); });
    }).detach();
    EXPECT_EQ(replied->get_future().wait_for(kDeadline), std::future_status::ready)
        << "a batch is reported with the lock held";
  }
  void didDeleteItemsWithIdentifiers(const std::vector<std::string>&) override {}
  void finishEnumeratingChangesUpToSyncAnchor(NSData upTo, bool) override { anchor = upTo; }
  void finishEnumeratingWithError(NSErrorPtr) override {}
  NSData anchor;
  VLFileEnumerator& _enumerator;
};

TEST_F(Changes, ABatchIsReportedWithoutTheLockAndLosesNothing) {
  const NSData anchor = currentAnchor();
  push({makeItem(1)});
  const auto observer = std::make_shared<Pusher>(*enumerator);
  enumerator->enumerateChangesForObserver(observer, anchor);
  const auto next = changes(observer->anchor);
  ASSERT_EQ(next->updated.size(), 1u);
  EXPECT_EQ(next->updated[0]->itemIdentifier(), documentID(2));
}

// Other threads that want the enumerator's lock.
struct LockProbe {
  explicit LockProbe(VLFileEnumerator& enumerator) : _enumerator(enumerator) {}
  ~LockProbe() {
    for (std::thread& thread : _threads) thread.join();
  }
  // Whether another thread gets the lock while this one waits for it, at most so long.
  bool isFree(std::chrono::milliseconds patience) {
    auto taken = std::make_shared<std::promise<void>>();
    auto future = taken->get_future();
    _threads.emplace_back([this, taken] {
      _enumerator.pendingChangeCount();
      taken->set_value();
    });
    return future.wait_for(patience) == std::future_status::ready;
  }

 private:
  VLFileEnumerator& _enumerator;
  std::vector<std::thread> _threads;
};

TEST_F(Changes, SignalsGoOutWithoutTheLockAndASenderIsInvalidatedUnderIt) {
  LockProbe lock(*enumerator);
  env.framework.manager.signals.handTo([&](const auto& call) {
    EXPECT_TRUE(lock.isFree(kDeadline)) << "a signal goes out with the lock held";
    call->reply(nullptr);
  });
  push({makeItem(1)});
  // Whoever has the lock may rely on it that the link is not taken down meanwhile.
  const auto sender = link();
  bool asked = false;
  sender->invalidated = [&] {
    asked = true;
    EXPECT_FALSE(lock.isFree(std::chrono::milliseconds(50)));
  };
  enumerator->invalidate();
  env.executor->runAll();
  EXPECT_TRUE(asked);
}

TEST_F(Changes, EachEnumeratorBeginsWithAnIdentityOfItsOwn) {
  const NSData first = currentAnchor();
  enumerator = make(kFolder);
  EXPECT_NE(currentAnchor(), first);
  EXPECT_TRUE(expired(first));
}

TEST_F(Changes, ARequestForChangesSetsUpNoLink) {
  changes(currentAnchor());
  EXPECT_EQ(env.runCalls(), Lines{"observer: anchor"});
}

}  // namespace
}  // namespace skein
