// What update senders push, and when they stop.
#include <atomic>
#include <chrono>
#include <future>
#include <map>

#include "base/ThreadPool.h"
#include "linux/protocol/DocumentURL.h"
#include "linux/vald/ClosableExecutor.h"
#include "tests/protocol/Waiting.h"
#include "tests/vald/TestDaemon.h"
#include "vellum/VLErrors.h"

namespace skein::vald {
namespace {

using Names = std::vector<std::string>;
using SenderPtr = std::shared_ptr<VLItemNotificationSender>;

class Senders : public testing::Test {
 protected:
  explicit Senders(SenderLimits limits = {}) : d(limits) {}

  SenderPtr make() {
    auto [sender, dictionary, error] = d.call<SenderPtr, VLDaemon::Dictionary, NSErrorPtr>(
        [this](LocalDaemon& daemon, auto reply) {
          daemon.getItemUpdateSenderWithReceiver(receiver, std::move(reply));
        });
    EXPECT_FALSE(error);
    return sender;
  }

  // Sends the watch; the gathering is done when the executor has run.
  void watch(const SenderPtr& sender, VLFileObjectID folder, std::uint64_t options = 19) {
    sender->watchItemAtURL(NSURL::fileURLWithPath(*d.store->pathForID(folder, nullptr)), options,
                           [this](NSErrorPtr error) { gathered.push_back(std::move(error)); });
  }

  Names pushed() {
    d.executor->runAll();
    return receiver->seen();
  }

  static std::string dead(VLFileObjectID id) { return "-" + id.asString(); }

  TestDaemon d;
  FakeStore& store = *d.store;
  std::shared_ptr<Receiver> receiver = std::make_shared<Receiver>();
  std::vector<NSErrorPtr> gathered;
  const VLFileObjectID folder = store.addFolder("a", store.root());
  const VLFileObjectID other = store.addFolder("ab", store.root());
};

TEST_F(Senders, PushTheFoldersOwnChildrenAndItselfAndWhatMovesInAndOut) {
  const SenderPtr sender = make();
  watch(sender, folder);
  d.executor->runAll();
  ASSERT_EQ(gathered, std::vector<NSErrorPtr>{nullptr});
  EXPECT_EQ(store.watches(folder), 1);

  const auto below = store.addFolder("below", folder);
  store.addFile("deep", below);
  const auto file = store.addFile("file", folder);
  const auto stranger = store.addFile("stranger", other);
  store.touch(folder);
  EXPECT_EQ(pushed(), (Names{below.asString(), file.asString(), folder.asString()}));
  receiver->reply();

  store.move(file, other);
  store.move(stranger, folder);
  store.remove(below);
  EXPECT_EQ(pushed(), (Names{dead(file), stranger.asString(), dead(below)}));
  receiver->reply();

  // Back again before the push: it never left.
  store.move(file, folder);
  store.move(file, other);
  store.move(file, folder);
  EXPECT_EQ(pushed(), (Names{file.asString()}));
}

TEST_F(Senders, HoldOnePushAtATimeAndCoalesceWhatWaits) {
  const SenderPtr sender = make();
  watch(sender, folder);
  const auto first = store.addFile("1", folder);
  EXPECT_EQ(pushed(), (Names{first.asString()}));

  const auto second = store.addFile("2", folder);
  const auto third = store.addFile("3", folder);
  store.touch(second);
  store.touch(second);
  store.remove(third);
  store.touch(first);
  EXPECT_EQ(pushed(), Names());  // the first push is unanswered
  receiver->reply();
  d.executor->runAll();
  ASSERT_EQ(receiver->pushes.size(), 1u);
  EXPECT_EQ(receiver->pushes[0][0]->properties().size, 2u);  // the latest state
  EXPECT_EQ(receiver->seen(), (Names{second.asString(), dead(third), first.asString()}));

  std::vector<VLFileObjectID> many;
  for (int i = 0; i < 450; ++i) {
    many.push_back(store.addFile("many" + std::to_string(i), folder));
  }
  std::size_t total = 0;
  for (const std::size_t expected : {200, 200, 51}) {
    receiver->reply();
    d.executor->runAll();
    ASSERT_EQ(receiver->pushes.size(), 1u);
    EXPECT_EQ(receiver->pushes[0].size(), expected);
    if (total == 0) store.touch(many.front());   // it was just told, and is told again
    if (total == 200) store.touch(many.back());  // it waits, at another place by now
    if (total == 400) {
      EXPECT_EQ(receiver->pushes[0][49]->fileObjectID(), many.back());
      EXPECT_EQ(receiver->pushes[0][49]->properties().size, 1u);
      EXPECT_EQ(receiver->pushes[0][50]->fileObjectID(), many.front());
    }
    total += receiver->seen().size();
  }
  EXPECT_EQ(total, 451u);
}

TEST_F(Senders, CollectFromTheVeryCallThatStartsTheWatch) {
  const SenderPtr sender = make();
  watch(sender, folder);
  // The client lists at once, without waiting for the gathering.
  const auto file = store.addFile("file", folder);
  const auto passing = store.addFile("passing", other);
  store.move(passing, folder);
  store.move(passing, other);
  EXPECT_TRUE(gathered.empty());
  EXPECT_TRUE(d.executor->runOne());
  ASSERT_EQ(gathered, std::vector<NSErrorPtr>{nullptr});
  // What comes before the first visit is told after what waits for it.
  store.remove(file);
  EXPECT_EQ(pushed(), (Names{dead(file), dead(passing)}));
}

TEST_F(Senders, WatchASubtreeByWhereFoldersAre) {
  const auto deep = store.addFolder("deep", store.addFolder("x", folder));
  const SenderPtr sender = make();
  watch(sender, folder, 23);
  d.executor->runAll();
  const auto file = store.addFile("file", deep);
  store.addFile("stranger", other);  // whose path begins alike
  EXPECT_EQ(pushed(), (Names{file.asString()}));
  receiver->reply();
  store.move(file, other);
  store.touch(file);
  EXPECT_EQ(pushed(), (Names{dead(file)}));
  receiver->reply();
  store.remove(store.addFile("gone", deep));
  store.remove(deep);
  EXPECT_EQ(pushed().size(), 2u);
}

TEST_F(Senders, RefuseOtherOptionsAndPlacesAndASecondWatch) {
  const SenderPtr sender = make();
  watch(sender, folder, 4);
  sender->watchItemAtURL(nullptr, 19, [this](NSErrorPtr error) { gathered.push_back(error); });
  sender->watchItemAtURL(NSURL::fileURLWithPath(d.drive.path + "/missing"), 19,
                         [this](NSErrorPtr error) { gathered.push_back(error); });
  d.executor->runAll();
  ASSERT_EQ(gathered.size(), 3u);
  EXPECT_NE(gathered[0]->localizedDescription().find("options"), std::string::npos);
  EXPECT_NE(gathered[1]->localizedDescription().find("url"), std::string::npos);
  // Of the one domain whose errors make a client that has listed already ask again.
  EXPECT_EQ(gathered[2]->domain(), VLVellumErrorDomain);
  EXPECT_EQ(gathered[2]->code(), VLVellumErrorChangesLost);
  EXPECT_EQ(gathered[2]->underlyingError()->code(), NSFileNoSuchFileError);

  watch(sender, folder);  // a failed watch may be tried again
  watch(sender, other);
  d.executor->runAll();
  ASSERT_EQ(gathered.size(), 5u);
  EXPECT_FALSE(gathered[3]);
  ASSERT_TRUE(gathered[4]);
}

TEST_F(Senders, WatchTheItemThatTheURLWasOfWhereverItIs) {
  const SenderPtr sender = make();
  const std::string path = *store.pathForID(folder, nullptr);
  store.remove(other);
  // Its place was taken while the client still had the URL.
  const auto imposter = store.addFolder("a", store.addFolder("c", store.root()));
  const auto watchOf = [&](VLFileObjectID id) {
    make()->watchItemAtURL(documentURL(path, id), 19,
                           [this](NSErrorPtr error) { gathered.push_back(std::move(error)); });
    d.executor->runAll();
  };
  sender->watchItemAtURL(documentURL(path, imposter), 19,
                         [this](NSErrorPtr error) { gathered.push_back(std::move(error)); });
  d.executor->runAll();
  store.addFile("not this", folder);
  const auto file = store.addFile("file", imposter);
  EXPECT_EQ(pushed(), (Names{file.asString()}));
  watchOf(other);
  ASSERT_EQ(gathered.size(), 2u);
  EXPECT_FALSE(gathered[0]);
  ASSERT_TRUE(gathered[1]);
  EXPECT_EQ(gathered[1]->code(), VLVellumErrorChangesLost);
}

// App containers lie beside the drive and are shown in it.
TEST_F(Senders, ADriveWithItsSubtreeIsEverythingThereIs) {
  const SenderPtr sender = make();
  watch(sender, store.root(), 23);
  d.executor->runAll();
  StoreChange change;
  VLQueryItem::Properties elsewhere;
  elsewhere.fileObjectID = VLFileObjectID::documentWithRawID(99);
  change.item = std::make_shared<const VLQueryItem>(elsewhere);
  change.folder = change.previousFolder = VLFileObjectID::folderOrAliasWithRawID(77);
  d.senders.storeDidChange({change});
  EXPECT_EQ(pushed(), (Names{elsewhere.fileObjectID.asString()}));
  receiver->reply();
  const auto file = store.addFile("file", folder);
  EXPECT_EQ(pushed(), (Names{file.asString()}));
}

TEST_F(Senders, PushNothingAfterInvalidateOrTheLastReference) {
  for (const bool dropped : {false, true}) {
    receiver = std::make_shared<Receiver>();
    SenderPtr sender = make();
    watch(sender, folder);
    d.executor->runAll();
    store.addFile(dropped ? "a1" : "a2", folder);
    d.executor->runAll();
    store.addFile(dropped ? "b1" : "b2", folder);  // waits for the reply
    if (dropped) {
      sender.reset();
    } else {
      sender->invalidate();
    }
    receiver->reply();
    store.addFile(dropped ? "c1" : "c2", folder);
    EXPECT_EQ(pushed().size(), 1u);
    EXPECT_EQ(receiver.use_count(), 1);
    EXPECT_EQ(d.senders.count(), 0u);
    EXPECT_EQ(store.watches(folder), 0);
  }
  // Nor does one that is ended before its folder is found.
  const SenderPtr early = make();
  watch(early, folder);
  early->invalidate();
  d.executor->runAll();
  EXPECT_TRUE(gathered.back());
  EXPECT_EQ(store.watches(folder), 0);
}

class BoundedSenders : public Senders {
 protected:
  BoundedSenders() : Senders({2, 5}) {}

  // Breaks of the link, as the server hears of them.
  void listen(const SenderPtr& sender) {
    auto& link = dynamic_cast<LinkBreaking&>(*sender);
    link.setLinkBrokenHandler([this](NSErrorPtr error) { broken.push_back(std::move(error)); });
  }
  std::vector<NSErrorPtr> broken;
};

TEST_F(BoundedSenders, BreakTheLinkOfAReceiverThatStopped) {
  for (const std::uint64_t options : {19, 23}) {
    broken.clear();
    receiver = std::make_shared<Receiver>();
    const SenderPtr sender = make();
    listen(sender);
    std::vector<NSErrorPtr> proxyHeard;
    const auto proxy = sender->remoteObjectProxyWithErrorHandler(
        [&](NSErrorPtr error) { proxyHeard.push_back(std::move(error)); });
    watch(sender, folder, options);
    d.executor->runAll();
    for (int i = 0; i < 6; ++i) {
      store.addFile(std::to_string(options) + std::to_string(i), folder);
      d.executor->runAll();
    }
    EXPECT_TRUE(broken.empty());  // one under way, five waiting
    for (int i = 6; i < 10; ++i) {
      store.addFile(std::to_string(options) + std::to_string(i), folder);
      d.executor->runAll();
    }
    ASSERT_EQ(broken.size(), 1u);
    EXPECT_EQ(broken[0]->domain(), VLVellumErrorDomain);
    EXPECT_EQ(proxyHeard, broken);
    EXPECT_EQ(receiver->pushes.size(), 1u);
    receiver->reply();
    d.executor->runAll();
    EXPECT_EQ(receiver->pushes.size(), 1u);
    EXPECT_EQ(receiver.use_count(), 1);
    EXPECT_EQ(store.watches(folder), 0);
    // Who asks too late hears of it too.
    listen(sender);
    d.executor->runAll();
    EXPECT_EQ(broken.size(), 2u);
  }
}

// Without that, the receiver would wait for ever for what it was not told.
TEST_F(BoundedSenders, BreakTheLinkWhenAPushIsLost) {
  const SenderPtr sender = make();
  listen(sender);
  watch(sender, folder);
  store.addFile("1", folder);
  d.executor->runAll();
  receiver->reply();
  d.executor->runAll();
  EXPECT_TRUE(broken.empty());
  store.addFile("2", folder);
  d.executor->runAll();
  ASSERT_EQ(receiver->pushes.size(), 2U);
  receiver->replies.clear();
  d.executor->runAll();
  ASSERT_EQ(broken.size(), 1U);
  EXPECT_EQ(broken[0]->domain(), VLVellumErrorDomain);
  EXPECT_EQ(broken[0]->code(), VLVellumErrorChangesLost);
  store.addFile("3", folder);
  d.executor->runAll();
  EXPECT_EQ(receiver->pushes.size(), 2U);
}

TEST_F(BoundedSenders, BreakWhatTheStoresOverflowConcerns) {
  const auto deep = store.addFolder("deep", folder);
  const auto broke = [&](VLFileObjectID watched, std::uint64_t options,
                         std::optional<VLFileObjectID> overflow) {
    broken.clear();
    const SenderPtr sender = make();
    listen(sender);
    watch(sender, watched, options);
    d.executor->runAll();
    d.senders.storeDidOverflow(overflow);
    d.executor->runAll();
    return !broken.empty();
  };
  EXPECT_TRUE(broke(folder, 19, folder));
  EXPECT_TRUE(broke(deep, 19, folder));
  EXPECT_TRUE(broke(folder, 23, deep));
  EXPECT_TRUE(broke(folder, 19, std::nullopt));
  EXPECT_FALSE(broke(folder, 19, deep));
  EXPECT_FALSE(broke(other, 23, folder));
  broken.clear();
  const SenderPtr sender = make();
  listen(sender);
  watch(sender, other);
  d.executor->runAll();
  store.remove(other);
  d.executor->runAll();
  d.senders.storeDidOverflow(folder);
  d.executor->runAll();
  EXPECT_FALSE(broken.empty()) << "where the folder was cannot be told any more";
  EXPECT_TRUE(broke(store.root(), 23, VLFileObjectID::folderOrAliasWithRawID(77)));
}

// Replies from another thread, a little later, as a client does.
class RemoteReceiver final : public VLItemNotificationReceiving {
 public:
  explicit RemoteReceiver(std::shared_ptr<Executor> executor) : _executor(std::move(executor)) {}

  void receiveUpdates(const VLQueryItems& items, const std::vector<std::string>&,
                      const std::vector<std::string>&, Reply<> reply) override {
    MutexLock lock(_mutex);
    for (const auto& item : items) _latest[item->fileObjectID()] = item->properties().size;
    overlapped = overlapped || std::exchange(_unanswered, true);
    _pushed.notifyAll();
    _executor->post([this, reply = std::move(reply)]() mutable {
      {
        MutexLock replying(_mutex);
        _unanswered = false;
      }
      reply();
    });
  }
  void receiveProgressUpdates(const VLQueryItems&, Reply<>) override {}

  // Whether the item came to this state before the deadline.
  bool waitFor(VLFileObjectID id, std::uint64_t size) {
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(30);
    MutexLock lock(_mutex);
    while (_latest[id] != size) {
      if (!_pushed.waitUntil(_mutex, deadline)) return _latest[id] == size;
    }
    return true;
  }

  std::atomic<bool> overlapped{false};

 private:
  const std::shared_ptr<Executor> _executor;
  Mutex _mutex;
  CondVar _pushed;
  bool _unanswered SKEIN_GUARDED_BY(_mutex) = false;
  std::map<VLFileObjectID, std::uint64_t> _latest SKEIN_GUARDED_BY(_mutex);
};

TEST(SendersWithThreads, DeliverTheLatestStateOfEveryItemOneByOne) {
  FakeStore::Settings settings;
  const auto executor = std::make_shared<ClosableExecutor>(4, "test");
  const auto clients = std::make_shared<ThreadPool>(2, "clients");
  ItemUpdateSenders senders(executor);
  FakeStore store("/drive", senders, settings);
  std::vector<VLFileObjectID> files;
  for (int i = 0; i < 300; ++i) {
    files.push_back(store.addFile(std::to_string(i), store.root()));
  }
  std::vector<std::shared_ptr<RemoteReceiver>> receivers;
  std::vector<std::shared_ptr<ItemUpdateSender>> watches;
  for (int i = 0; i < 4; ++i) {
    receivers.push_back(std::make_shared<RemoteReceiver>(clients));
    watches.push_back(senders.make(receivers.back(), store, nullptr));
    std::promise<NSErrorPtr> gathered;
    watches.back()->watchItemAtURL(NSURL::fileURLWithPath("/drive"), 19,
                                   [&](NSErrorPtr error) { gathered.set_value(error); });
    ASSERT_FALSE(gathered.get_future().get());
  }

  constexpr std::uint64_t kRounds = 50;
  for (std::uint64_t round = 1; round <= kRounds; ++round) {
    for (const auto& file : files) store.touch(file);
    if (round == kRounds / 2) watches.back()->invalidate();
  }
  for (int i = 0; i < 3; ++i) {
    for (const auto& file : files) EXPECT_TRUE(receivers[i]->waitFor(file, kRounds));
    EXPECT_FALSE(receivers[i]->overlapped);
  }
  // Whoever is the last to hold a sender gives its watch back, also once the executor runs
  // nothing any more: that may be a client's late answer.
  watches.clear();
  executor->close();
  EXPECT_TRUE(becomesTrue([&] { return store.watches(store.root()) == 0; }));
}

}  // namespace
}  // namespace skein::vald
