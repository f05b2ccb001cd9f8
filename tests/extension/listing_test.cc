// A folder's pages.
#include "support/NSData+Additions.h"
#include "tests/extension/FolderFixture.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

using Listing = FolderFixture;

TEST_F(Listing, LinksFirstThenAsksForThePage) {
  const auto observer = list();
  EXPECT_EQ(env.transcript.take(),
            (Lines{"[DEBUG] ┏1 listing items", "[DEBUG] ┣3 calling vald", "[DEBUG] ┗1 "}));
  EXPECT_EQ(env.run(), Lines{"daemon: sender"});
  daemon.senders.next()->reply(daemon.makeSender(), nullptr);
  EXPECT_EQ(env.run(), (Lines{"sender 1 boostPriority", "sender 1 watch file:///store/f 19",
                              "daemon: items in i0000000000000007 order 0 offset 0 limit 200"}));
  daemon.pages.next()->reply({makeItem(1), makeItem(2)}, 200, nullptr);
  EXPECT_EQ(env.run(), (Lines{"[DEBUG] ┳3 received next page 200 items=(<d0000000000000001 "
                              "\"doc\">, <d0000000000000002 \"doc\">)",
                              "observer: items [doc, doc]", "observer: next page", "[DEBUG] ┗3 "}));
  EXPECT_EQ(observer->nextPage, vl_pageTokenFromSortOrder(0, 200));
}

TEST_F(Listing, KeepsItsOrderFromPageToPageAndEndsAtOffsetZero) {
  link();
  const struct {
    std::optional<NSData> page;
    std::string fromPage, asked;
  } kCases[] = {
      {std::nullopt, "", "order 0 offset 0"},
      {NSFileProviderInitialPageSortedByName(), "[DEBUG] from page 0", "order 0 offset 0"},
      {NSFileProviderInitialPageSortedByDate(), "[DEBUG] from page 0", "order 1 offset 0"},
      {vl_pageTokenFromSortOrder(1, 200), "[DEBUG] from page 200", "order 1 offset 200"},
      // Foreign bytes are read as they come, the rest as zero.
      {NSData(std::string_view("\x05")), "[DEBUG] from page 5", "order 0 offset 5"},
  };
  for (const auto& [page, fromPage, asked] : kCases) {
    const auto observer = list(page);
    const Lines head = env.transcript.take();
    EXPECT_EQ(head.size(), page ? 4u : 3u);
    if (page) {
      EXPECT_EQ(head[1], fromPage);
    }
    EXPECT_EQ(env.runCalls(), Lines{"daemon: items in i0000000000000007 " + asked + " limit 200"});
    const std::uint8_t order = vl_pageTokenSortOrder(page);
    daemon.pages.next()->reply(NSFileProviderItems(200, makeItem(1)), 400, nullptr);
    EXPECT_EQ(observer->nextPage, vl_pageTokenFromSortOrder(order, 400));
    list(observer->nextPage);
    EXPECT_EQ(env.runCalls().back(), "daemon: items in i0000000000000007 order " +
                                         std::to_string(order) + " offset 400 limit 200");
    // A full page that is the last one.
    daemon.pages.next()->reply(NSFileProviderItems(200, makeItem(1)), 0, nullptr);
    EXPECT_EQ(env.runCalls().back(), "observer: end");
  }
}

TEST_F(Listing, AnEmptyFolderStillReportsItsItems) {
  link();
  list();
  env.run();
  daemon.pages.next()->reply({}, 0, nullptr);
  EXPECT_EQ(env.runCalls(), (Lines{"observer: items []", "observer: end"}));
}

TEST_F(Listing, EveryEndTranslatesItsErrorAndClosesTheRequestsSectionOnce) {
  const std::string translated =
      "observer: error NSFileProviderErrorDomain -1005 under NSCocoaErrorDomain 14";
  // The setup's reply, then the setup's connection.
  list();
  env.run();
  daemon.senders.next()->reply(nullptr, kCocoa14);
  EXPECT_EQ(env.run(), (Lines{translated, "[DEBUG] ┗3 "}));
  list();
  env.run();
  daemon.senders.next()->fail(kCocoa14);
  EXPECT_EQ(env.run(), (Lines{translated, "[DEBUG] ┗7 "}));
  // The page's reply, then the page's connection.
  link();
  list();
  env.run();
  daemon.pages.next()->reply({makeItem(1)}, 200, kCocoa14);
  EXPECT_EQ(env.run(),
            (Lines{"[DEBUG] ┳b received next page 200 items=(<d0000000000000001 "
                   "\"doc\">)",
                   "[ERROR] there was an error when listing items: NSCocoaErrorDomain 14",
                   translated, "[DEBUG] ┗b "}));
  list();
  env.run();
  daemon.pages.next()->fail(kCocoa14);
  EXPECT_EQ(env.run(), (Lines{translated, "[DEBUG] ┗f "}));
}

TEST_F(Listing, TheObserverIsHeldByARunningRequestAlone) {
  link();
  std::weak_ptr<RecordingObserver> observer = list();
  env.run();
  EXPECT_FALSE(observer.expired());
  // The daemon keeps its proxies, whose error handlers have let go all the same.
  daemon.pages.next()->reply({}, 0, nullptr);
  EXPECT_TRUE(observer.expired());
}

TEST_F(Listing, AskingAnEnumeratorOfNothing) {
  EXPECT_FALSE(
      VLFileEnumerator::initWithFileObjectID(std::nullopt, nullptr, kRoot, false, env.environment));
  EXPECT_EQ(env.run(), Lines{"[ERROR] can't create a file enumeration without a url"});
}

}  // namespace
}  // namespace skein
