// One folder's enumerator under real threads: pushes, change requests, listings, broken
// links, notifications and invalidation at once. A host that follows the rules must end
// with what the store holds.
#include <map>
#include <set>
#include <thread>

#include "tests/extension/FolderFixture.h"
#include "tests/support/CountingPool.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

constexpr int kPushers = 3;
constexpr int kActors = kPushers + 3;
constexpr int kPushes = 800;
constexpr std::uint64_t kItemsPerPusher = 40;
constexpr int kFloodEvery = 200;  // one push in so many passes the cap

// What the store holds: the version of each live item.
class Store {
 public:
  using Items = std::map<std::string, std::string>;
  void set(const VLQueryItem& item) {
    MutexLock lock(_mutex);
    if (item.isDead()) {
      _items.erase(item.itemIdentifier());
    } else {
      _items[item.itemIdentifier()] = item.filename();
    }
  }
  Items items() {
    MutexLock lock(_mutex);
    return _items;
  }

 private:
  Mutex _mutex;
  Items _items SKEIN_GUARDED_BY(_mutex);
};

std::uint64_t rankOf(const NSData& anchor) {
  std::uint64_t rank = 0;
  anchor.getBytes(&rank, sizeof rank);
  return rank;
}
std::string uuidOf(const NSData& anchor) { return std::string(anchor.view().substr(8)); }

// The host's part: one round after the other, listing afresh when its anchor expired.
struct Host {
  void list() {
    // Before the listing, or what is reset in between would be lost.
    enumerator.currentSyncAnchorWithCompletionHandler(
        [&](const auto& current) { anchor = current.value(); });
    items = store.items();
  }
  // False when there was nothing new.
  bool round() {
    const auto batch = std::make_shared<RecordingChangeObserver>(unread);
    enumerator.enumerateChangesForObserver(batch, anchor);
    unread.take();
    EXPECT_EQ(batch->finishes, 1);
    if (batch->error) {
      EXPECT_EQ(batch->error->code(), -1002);
      list();
      return true;
    }
    EXPECT_LE(batch->updated.size() + batch->deleted.size(), 5000u);
    const bool any = !batch->updated.empty() || !batch->deleted.empty();
    EXPECT_EQ(uuidOf(*batch->anchor), uuidOf(anchor));
    EXPECT_EQ(rankOf(*batch->anchor), rankOf(anchor) + (any ? 1 : 0));
    const std::set<std::string> deleted(batch->deleted.begin(), batch->deleted.end());
    for (const auto& item : batch->updated) {
      EXPECT_FALSE(deleted.contains(item->itemIdentifier())) << "both updated and deleted";
      items[item->itemIdentifier()] = item->filename();
    }
    for (const std::string& identifier : deleted) items.erase(identifier);
    anchor = *batch->anchor;
    return any;
  }

  // Rounds until there is nothing new.
  void catchUp() {
    for (int rounds = 0; round(); ++rounds) {
      if (rounds == 100'000) {
        ADD_FAILURE() << "the host never catches up";
        return;
      }
    }
  }

  VLFileEnumerator& enumerator;
  Store& store;
  Store::Items items = {};
  NSData anchor = {};
  Transcript unread = {};
};

void pushAll(VLFileEnumerator& enumerator, Store& store, std::uint64_t pusher) {
  std::uint64_t random = pusher + 1;
  for (int push = 0; push < kPushes; ++push) {
    VLQueryItems items;
    for (int i = push % kFloodEvery == kFloodEvery - 1 ? 6000 : 5; i > 0; --i) {
      random = random * 6364136223846793005ULL + 1442695040888963407ULL;
      const std::uint64_t id = pusher * kItemsPerPusher + (random >> 40) % kItemsPerPusher;
      const bool isDead = (random >> 33) % 3 == 0;
      items.push_back(makeItem(id, isDead, std::to_string(push) + "." + std::to_string(i)));
      store.set(*items.back());
    }
    enumerator.receiveUpdates(items, {}, {}, [] {});
  }
}

TEST(Stress, AHostEndsWithWhatTheStoreHolds) {
  for (int repeat = 0; repeat < 3; ++repeat) {
    const auto pool = std::make_shared<CountingPool>(8);
    TestEnvironment env(pool);
    env.log.setEnabled(LogType::Debug, false);
    ScriptedFramework& framework = env.framework;
    Store store;
    const auto enumerator = VLFileEnumerator::initWithFileObjectID(std::nullopt, storeURL(), kRoot,
                                                                   false, env.environment);

    // The daemon answers on its own threads: now with a sender whose watch breaks, now with
    // an error, now not at all because the connection breaks.
    std::atomic<unsigned> setups{0};
    framework.daemon.senders.handTo([&](const auto& call) {
      pool->post([&, call, way = setups++ % 4] {
        if (way == 0) return call->reply(nullptr, kCocoa14);
        if (way == 1) return void(call->fail(kVellum9));
        const auto sender = framework.daemon.makeSender();
        sender->watches.handTo([&, way](const auto& watch) {
          pool->post([watch, way] { watch->reply(way == 2 ? kVellum9 : nullptr); });
        });
        sender->boosts.handTo([&](const auto& boost) { pool->post([boost] { boost->reply(); }); });
        call->reply(sender, nullptr);
      });
    });
    framework.daemon.pages.handTo(
        [&](const auto& call) { pool->post([call] { call->reply({}, 0, nullptr); }); });
    framework.manager.signals.handTo(
        [&](const auto& call) { pool->post([call] { call->reply(nullptr); }); });

    std::atomic<int> pushersLeft{kPushers};
    std::atomic<int> listed{0}, ended{0};
    // Nobody begins before all can, or one would be done before the next.
    std::atomic<int> ready{0};
    const auto begin = [&ready] {
      for (++ready; ready < kActors;) std::this_thread::yield();
    };
    Host host{*enumerator, store};
    host.list();
    for (std::uint64_t pusher = 0; pusher < kPushers; ++pusher) {
      pool->post([&, pusher] {
        begin();
        pushAll(*enumerator, store, pusher);
        --pushersLeft;
      });
    }
    pool->post([&] {
      begin();
      while (pushersLeft > 0) {
        host.round();
        EXPECT_LE(enumerator->pendingChangeCount(), 5000u);
      }
      host.catchUp();
    });
    struct Ending final : NSFileProviderEnumerationObserver {
      explicit Ending(std::atomic<int>& count) : _count(count) {}
      void didEnumerateItems(const NSFileProviderItems&) override {}
      void finishEnumeratingUpToPage(std::optional<NSData>) override { ++_count; }
      void finishEnumeratingWithError(NSErrorPtr) override { ++_count; }
      std::atomic<int>& _count;
    };
    pool->post([&] {
      begin();
      while (pushersLeft > 0 && listed < 2000) {
        enumerator->enumerateItemsForObserver(std::make_shared<Ending>(ended),
                                              NSFileProviderInitialPageSortedByName());
        if (++listed == 500) enumerator->invalidate();
      }
    });
    pool->post([&] {
      begin();
      while (pushersLeft > 0) {
        env.notificationCenter.postNotificationName(VLAccountTokenDidChangeNotification);
        env.notificationCenter.postNotificationName(VLContainerListDidChangeNotification);
        enumerator->currentSyncAnchorWithCompletionHandler(
            [](auto anchor) { EXPECT_EQ(rankOf(anchor.value()), 0u); });
      }
    });
    if (!pool->waitIdle()) {
      std::cerr << "the enumerator stands still: " << ended << " of " << listed << " listings, "
                << pushersLeft << " pushers left" << std::endl;
      std::abort();
    }
    // Resets may have come after the last round.
    host.catchUp();
    EXPECT_EQ(host.items, store.items());
    EXPECT_EQ(ended, listed);
    enumerator->invalidate();
    ASSERT_TRUE(pool->waitIdle());
    EXPECT_EQ(env.notificationCenter.observerCount(VLAccountTokenDidChangeNotification), 0u);
  }
}

}  // namespace
}  // namespace skein
