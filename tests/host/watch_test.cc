// How a container is watched: the order of what is asked, and what the watchers hear.
#include "linux/host/WatchEvents.h"

#include <algorithm>

#include "linux/host/WorkingSetWatch.h"
#include "tests/host/HostFixture.h"
#include "tests/protocol/FakeDaemon.h"

namespace skein {
namespace {

TEST_F(HostTest, AnchorIsReadBeforeTheListing) {
  const auto subscription = host->watch("i1", watcher);
  EXPECT_EQ(calls(), (Words{"open i1", "anchor", "list start"}));
  enumerator().givePage({item(1, "one")}, "p2");
  EXPECT_EQ(calls(), (Words{"list p2"}));
  enumerator().givePage({item(2, "two")});
  EXPECT_EQ(calls(), (Words{"changes a0"}));
  EXPECT_EQ(watcher->take(), Words{});

  // What the listing showed already is no change; what came during it is.
  enumerator().giveChanges({item(2, "two")}, {}, "a0.1");
  run();
  EXPECT_EQ(watcher->take(), (Words{"begin"}));
  signal();
  EXPECT_EQ(calls(), (Words{"changes a0.1"}));
  enumerator().giveChanges({item(2, "two", 5), item(3, "three"), item(1, "uno")}, {}, "a0.2");
  run();
  EXPECT_EQ(watcher->take(), (Words{"~two", "+three", "~uno was one"}));
  signal();
  EXPECT_EQ(calls(), (Words{"changes a0.2"}));
  enumerator().giveChanges({}, {idOf(3), idOf(9)}, "a0.3", true);
  EXPECT_EQ(calls(), (Words{"changes a0.3"}));
  EXPECT_EQ(watcher->take(), (Words{"-three"}));
}

TEST_F(HostTest, SignalsCoalesceAndNoneIsLost) {
  const auto subscription = watchLive(watcher, {});
  signal();
  signal();
  signal();
  EXPECT_EQ(calls(), (Words{"changes a0"}));
  // During the round: one more round, however many there were.
  signal();
  run();
  signal();
  EXPECT_EQ(calls(), Words{});
  enumerator().giveChanges({item(1, "one")}, {}, "a0.1");
  EXPECT_EQ(calls(), (Words{"changes a0.1"}));
  enumerator().giveChanges({}, {}, "a0.1");
  EXPECT_EQ(calls(), Words{});

  // During the round that ends the first listing.
  const auto second = host->watch("i2", std::make_shared<Watcher>());
  run();
  enumerator(1).givePage({});
  EXPECT_EQ(calls(), (Words{"open i2", "anchor", "list start", "changes a1"}));
  host->signalEnumeratorForContainerItemIdentifier("i2", nullptr);
  run();
  enumerator(1).giveChanges({}, {}, "a1.1");
  EXPECT_EQ(calls(), (Words{"changes a1.1"}));
}

TEST_F(HostTest, SignalOfAnUnknownContainerAnswersAnError) {
  std::vector<std::int64_t> codes;
  const auto note = [&](const NSErrorPtr& error) { codes.push_back(error ? error->code() : 0); };
  host->signalEnumeratorForContainerItemIdentifier("i9", note);
  host->signalEnumeratorForContainerItemIdentifier(NSFileProviderRootContainerItemIdentifier, note);
  EXPECT_TRUE(codes.empty());  // never inside the call
  run();
  EXPECT_EQ(codes, (std::vector<std::int64_t>{NSFileProviderErrorNoSuchItem, 0}));
  // One that was listed is known.
  host->list("i9", NSFileProviderInitialPageSortedByName(), [](const auto&, const auto&) {});
  run();
  host->signalEnumeratorForContainerItemIdentifier("i9", note);
  run();
  EXPECT_EQ(codes.back(), 0);
}

TEST_F(HostTest, ExpiryIsFollowedByAListingAndTheDifference) {
  const auto subscription =
      watchLive(watcher, {item(1, "one"), item(2, "two"), item(3, "three"), item(4, "four")});
  signal();
  run();
  enumerator().failChanges(expired());
  // By a new enumerator: the folder may be elsewhere by now.
  EXPECT_EQ(calls(), (Words{"changes a0", "invalidate", "open i1", "anchor", "list start"}));
  enumerator(1).givePage({item(1, "one"), item(2, "zwei"), item(3, "three", 7), item(5, "five")});
  run();
  EXPECT_EQ(watcher->take(), Words{});
  // The round after the listing counts before anything is told.
  enumerator(1).giveChanges({item(5, "five", 1)}, {idOf(1)}, "a1.1");
  run();
  auto heard = watcher->take();
  std::sort(heard.begin(), heard.end());
  EXPECT_EQ(heard, (Words{"+five", "-four", "-one", "~three", "~zwei was two"}));
  signal();
  EXPECT_EQ(calls(), (Words{"changes a1", "changes a1.1"}));
}

TEST_F(HostTest, EndlessExpiryPausesInsteadOfSpinning) {
  // A folder that changes faster than it is listed, and one that is listed and cannot be
  // watched: that one is live in between.
  for (const bool isLiveBetween : {false, true}) {
    extension->enumerators.clear();
    auto subscription = watchLive(watcher, {item(1, "one")});
    signal();
    for (std::size_t i = 0; i < 3; ++i) {
      run();
      enumerator(i).failChanges(expired());
      run();
      enumerator(i + 1).givePage({item(1, "one")});
      run();
      if (!isLiveBetween) continue;
      enumerator(i + 1).giveChanges({}, {}, enumerator(i + 1).anchor);
      run();
      signal();
    }
    run();
    extension->calls.clear();
    for (const auto pause : {100, 200}) {
      extension->enumerators.back()->failChanges(expired());
      EXPECT_EQ(calls(), (Words{"invalidate"}));
      timers->advance(std::chrono::milliseconds(pause - 1));
      EXPECT_EQ(calls(), Words{});
      timers->advance(std::chrono::milliseconds(1));
      EXPECT_EQ(calls(), (Words{"open i1", "anchor", "list start"}));
      extension->enumerators.back()->givePage({item(1, "one")});
      EXPECT_EQ(calls(), (Words{"changes " + extension->enumerators.back()->anchor}));
    }
    EXPECT_EQ(watcher->take(), Words{});
    // A round of a live watch ends the series.
    extension->enumerators.back()->giveChanges({}, {}, "b");
    signal();
    run();
    extension->enumerators.back()->giveChanges({}, {}, "c");
    signal();
    run();
    extension->enumerators.back()->failChanges(expired());
    EXPECT_EQ(calls(),
              (Words{"changes b", "changes c", "invalidate", "open i1", "anchor", "list start"}));
    subscription.reset();
    calls();
    for (const auto& held : extension->enumerators) held->listings.clear();
  }
}

TEST_F(HostTest, WatchersShareAnEnumeratorUntilTheLastLeaves) {
  const auto second = std::make_shared<Watcher>();
  auto first = watchLive(watcher, {item(1, "one")});
  auto other = host->watch("i1", second);
  EXPECT_EQ(calls(), Words{});
  EXPECT_EQ(second->take(), (Words{"begin"}));
  signal();
  run();
  enumerator().giveChanges({item(2, "two")}, {}, "a0.1");
  first.reset();
  EXPECT_EQ(calls(), (Words{"changes a0"}));
  EXPECT_EQ(second->take(), (Words{"+two"}));
  signal();
  EXPECT_EQ(calls(), (Words{"changes a0.1"}));
  enumerator().giveChanges({}, {}, "a0.1");
  other.reset();
  EXPECT_EQ(calls(), (Words{"invalidate"}));
  EXPECT_EQ(host->watchedContainers(), 0U);
  // A later watcher begins anew.
  auto third = host->watch("i1", std::make_shared<Watcher>());
  EXPECT_EQ(calls(), (Words{"open i1", "anchor", "list start"}));
  third.reset();
  calls();
  // One who leaves before it is opened.
  host->watch("i1", std::make_shared<Watcher>());
  EXPECT_EQ(calls(), (Words{"open i1", "invalidate"}));
}

TEST_F(HostTest, TheWatchSurvivesADaemonThatDies) {
  const auto subscription = watchLive(watcher, {item(1, "one"), item(2, "two")});
  signal();
  run();
  enumerator().failChanges(vl_errorDaemonUnreachable("vald closed the connection"));
  EXPECT_EQ(calls(), (Words{"changes a0", "invalidate"}));
  EXPECT_EQ(watcher->take(), Words{});

  extension->error = vl_errorDaemonUnreachable("vald does not run");
  timers->advance(std::chrono::milliseconds(100));
  EXPECT_EQ(calls(), (Words{"open i1"}));
  extension->error = nullptr;
  timers->advance(std::chrono::milliseconds(200));
  EXPECT_EQ(calls(), (Words{"open i1", "changes a0"}));
  // Another enumerator's anchor: this one is new, and lists.
  enumerator(1).failChanges(expired());
  EXPECT_EQ(calls(), (Words{"anchor", "list start"}));
  // It dies again before that is complete: the listing's anchor is of no use.
  enumerator(1).givePage({item(2, "two")}, "p2");
  EXPECT_EQ(calls(), (Words{"list p2"}));
  timers->advance(deadlines::kPage);
  EXPECT_EQ(calls(), (Words{"invalidate"}));
  timers->advance(std::chrono::milliseconds(400));
  EXPECT_EQ(calls(), (Words{"open i1", "anchor", "list start"}));
  enumerator(2).givePage({item(2, "two"), item(3, "three")});
  run();
  enumerator(2).giveChanges({}, {}, "a2");
  run();
  EXPECT_EQ(watcher->take(), (Words{"-one", "+three"}));
}

// Its anchors are vald's own: what was heard is not asked for again.
TEST_F(HostTest, TheWorkingSetGoesOnFromItsAnchorAfterAFailure) {
  const std::string workingSet = NSFileProviderWorkingSetContainerItemIdentifier;
  auto subscription = watchLive(watcher, {}, workingSet);
  ASSERT_EQ(news->listeners, 1);
  news->handlers[0]();
  run();
  enumerator().giveChanges({item(1, "one")}, {}, "t1");
  news->handlers[0]();
  EXPECT_EQ(calls(), (Words{"changes a0", "changes t1"}));
  enumerator().failChanges(vl_errorDaemonUnreachable("vald closed the connection"));
  EXPECT_EQ(calls(), (Words{"invalidate"}));
  timers->advance(std::chrono::milliseconds(100));
  EXPECT_EQ(calls(), (Words{"open " + workingSet, "changes t1"}));
  enumerator(1).giveChanges({item(2, "two")}, {}, "t2", true);
  EXPECT_EQ(calls(), (Words{"changes t2"}));
  enumerator(1).giveChanges({}, {idOf(1)}, "t3");
  run();
  EXPECT_EQ(watcher->take(), (Words{"+one", "+two", "-one"}));
  EXPECT_EQ(news->handlers.size(), 1U);

  // Who joins while the last one leaves has news, too.
  const auto second = std::make_shared<Watcher>();
  auto other = host->watch(workingSet, second);
  subscription.reset();
  run();
  EXPECT_EQ(news->listeners, 1);
  other.reset();
  const auto third = host->watch(workingSet, std::make_shared<Watcher>());
  run();
  EXPECT_EQ(news->listeners, 1);
}

TEST_F(HostTest, NewsOfTheWorkingSetBeginAgainWhereTheyFailed) {
  const auto daemon = std::make_shared<FakeDaemon>();
  daemon->statusNow.store = "/drive";
  WorkingSetWatch watch([&](const auto&) { return daemon; }, timers);
  int told = 0;
  auto listening = watch.begin([&] { ++told; });
  ASSERT_EQ(daemon->senders.count(), 1U);
  auto sender = *daemon->senders.take();
  auto asked = *sender->watches.take();
  EXPECT_EQ(asked.path, "/drive");
  EXPECT_EQ(asked.options, 23U);
  EXPECT_EQ(told, 1) << "what changed while there was no link";
  sender->receiver->receiveUpdates({}, {}, {}, nullptr);
  EXPECT_EQ(told, 2);
  asked.reply(vlc_errorLoggedOut());
  timers->advance(std::chrono::milliseconds(500));
  run();
  ASSERT_EQ(daemon->senders.count(), 1U);
  sender = *daemon->senders.take();
  EXPECT_EQ(told, 3);
  listening.reset();
  EXPECT_EQ(sender->invalidations.count(), 1U);
}

// The target's own changes are none of what it holds; with the target it ends.
TEST_F(HostTest, AnAliasIsWatchedAsTheFolderThatItLeadsTo) {
  extension->aliases["i1"] = idOf(5);
  const auto subscription = watchLive(watcher, {item(1, "one")});
  signal();
  run();
  enumerator().giveChanges({item(5, "target"), item(2, "two")}, {}, "a0.1");
  run();
  EXPECT_EQ(watcher->take(), (Words{"+two"}));
  signal();
  run();
  enumerator().giveChanges({}, {idOf(5)}, "a0.2");
  run();
  EXPECT_EQ(watcher->take(), (Words{"end -1005"}));
}

TEST_F(HostTest, LogoutAndDeletionEndTheWatch) {
  auto subscription = watchLive(watcher, {item(1, "one")});
  signal();
  run();
  enumerator().failChanges(
      NSError::errorWithDomain(NSFileProviderErrorDomain, NSFileProviderErrorNotAuthenticated));
  run();
  EXPECT_EQ(watcher->take(), (Words{"end -1000"}));
  subscription.reset();
  run();

  const auto again = std::make_shared<Watcher>();
  const auto other = host->watch("i1", again);
  run();
  enumerator(1).givePage({});
  run();
  enumerator(1).giveChanges({}, {}, "a1.1");
  run();
  EXPECT_EQ(again->take(), (Words{"begin"}));
  signal();
  run();
  enumerator(1).giveChanges({}, {"i1"}, "a1.2");
  run();
  EXPECT_EQ(again->take(), (Words{"end -1005"}));
  EXPECT_EQ(calls().back(), "invalidate");

  // Gone between its listing and the first round: nothing more would come of it.
  const auto third = std::make_shared<Watcher>();
  const auto late = host->watch("i1", third);
  run();
  enumerator(2).givePage({});
  run();
  enumerator(2).giveChanges({}, {"i1"}, "a2.1");
  run();
  EXPECT_EQ(third->take(), (Words{"end -1005"}));
}

TEST_F(HostTest, ALostAnswerFailsTheFirstWatchAndIsIgnoredWhenItComesLate) {
  const auto subscription = host->watch("i1", watcher);
  run();
  timers->advance(deadlines::kPage - std::chrono::milliseconds(1));
  run();
  EXPECT_EQ(watcher->take(), Words{});
  timers->advance(std::chrono::milliseconds(1));
  run();
  EXPECT_EQ(watcher->take(), (Words{"end " + std::to_string(VLVellumErrorDaemonUnreachable)}));
  enumerator().givePage({item(1, "one")});
  run();
  EXPECT_EQ(watcher->take(), Words{});
}

HostChange change(HostChange::Kind kind, std::uint64_t id, const std::string& name) {
  HostChange change;
  change.kind = kind;
  change.identifier = idOf(id);
  change.filename = name;
  return change;
}

// A consumer that takes late hears the sum of what happened, one change per item.
TEST(WatchEvents, AreTheSumSinceTheLastTime) {
  using Kind = HostChange::Kind;
  WatchEvents events;
  events.add(change(Kind::Created, 1, "came and went"));
  events.add(change(Kind::Changed, 2, "two"));
  events.add(change(Kind::Deleted, 1, "came and went"));
  HostChange renamed = change(Kind::Changed, 2, "zwei");
  renamed.previousFilename = "two";
  events.add(renamed);
  events.add(change(Kind::Deleted, 3, "three"));
  events.add(change(Kind::Created, 3, "drei"));
  events.add(change(Kind::Changed, 4, "four"));
  events.add(change(Kind::Deleted, 4, "four"));

  const auto first = events.take(2);
  ASSERT_EQ(first.size(), 2U);
  EXPECT_EQ(first[0].kind, Kind::Changed);
  EXPECT_EQ(first[0].filename, "zwei");
  EXPECT_EQ(first[0].previousFilename, "two");
  EXPECT_EQ(first[1].kind, Kind::Changed);
  EXPECT_EQ(first[1].previousFilename, "three");
  events.add(change(Kind::Changed, 2, "zwei"));
  const auto rest = events.take(10);
  ASSERT_EQ(rest.size(), 2U);
  EXPECT_EQ(rest[0].kind, Kind::Deleted);
  EXPECT_EQ(rest[1].filename, "zwei");
  EXPECT_TRUE(events.empty());
}

TEST(WatchEvents, AreTakenInPiecesThatCanBeSent) {
  VLQueryItem::Properties properties;
  properties.tagData = NSData(std::string(60'000, 't'));
  WatchEvents events;
  for (std::uint64_t id = 1; id <= 200; ++id) {
    HostChange one = change(HostChange::Kind::Created, id, "name");
    one.item = std::make_shared<const VLQueryItem>(properties);
    events.add(std::move(one));
  }
  std::size_t taken = 0;
  while (!events.empty()) {
    const std::size_t count = events.take(200).size();
    ASSERT_GT(count, 0U);
    EXPECT_LT(count, 100U);
    taken += count;
  }
  EXPECT_EQ(taken, 200U);
}

}  // namespace
}  // namespace skein
