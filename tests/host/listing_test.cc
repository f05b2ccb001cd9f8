// Listings page by page, their deadlines, and how the extension is instantiated.
#include <fstream>

#include "linux/host/Deadline.h"
#include "linux/host/ItemPaths.h"
#include "linux/host/NSExtensionMain.h"
#include "linux/host/RequestTurns.h"
#include "tests/host/HostFixture.h"

namespace skein {
namespace {

struct Pages {
  Listing::PageReply reply() {
    return [this](const NSFileProviderItems& items, bool last, const NSErrorPtr& error) {
      heard.push_back(error ? "error " + std::to_string(error->code())
                            : std::to_string(items.size()) + (last ? " last" : ""));
    };
  }
  std::vector<std::string> heard;
};

class ListingTest : public HostTest {
 protected:
  std::shared_ptr<Listing> open() {
    std::shared_ptr<Listing> listing;
    host->list("i1", NSFileProviderInitialPageSortedByName(),
               [&](std::shared_ptr<Listing> made, const NSErrorPtr& error) {
                 listing = std::move(made);
                 openError = error;
               });
    run();
    return listing;
  }
  Pages pages;
  NSErrorPtr openError;
};

TEST_F(ListingTest, AsksAFewPagesAheadAndInvalidatesAtTheEnd) {
  const auto listing = open();
  for (const char* next : {"p2", "p3", "p4"}) {
    enumerator().givePage({item(1, "a")}, next);
    run();
  }
  // Nobody takes pages, so no more are asked for.
  EXPECT_EQ(calls(), (Words{"open i1", "list start", "list p2", "list p3"}));
  listing->next(pages.reply());
  EXPECT_EQ(calls(), (Words{"list p4"}));
  enumerator().givePage({item(2, "b"), item(3, "c")});
  EXPECT_EQ(calls(), (Words{"invalidate"}));
  for (int i = 0; i < 4; ++i) listing->next(pages.reply());
  run();
  EXPECT_EQ(pages.heard, (Words{"1", "1", "1", "2 last", "0 last"}));
}

TEST_F(ListingTest, FailsWhenAnAnswerIsLostOrGivenUp) {
  const auto listing = open();
  listing->next(pages.reply());
  run();
  timers->advance(deadlines::kPage);
  run();
  EXPECT_EQ(pages.heard, (Words{"error " + std::to_string(VLVellumErrorDaemonUnreachable)}));
  EXPECT_EQ(calls().back(), "invalidate");
  enumerator().givePage({item(1, "late")});
  run();
  EXPECT_EQ(pages.heard.size(), 1U);

  const auto given = open();
  given->next(pages.reply());
  given->cancel();
  run();
  EXPECT_EQ(pages.heard.back(), "error " + std::to_string(NSUserCancelledError));
  // Nor is a page handed out that came before.
  const auto full = open();
  enumerator(2).givePage({item(1, "a")}, "p2");
  run();
  full->cancel();
  full->next(pages.reply());
  run();
  EXPECT_EQ(pages.heard.back(), "error " + std::to_string(NSUserCancelledError));
  EXPECT_EQ(pages.heard.size(), 3U);
}

// The enumerator holds a sender of vald's, which nobody else would give back.
TEST_F(ListingTest, OneThatNobodyTakesInvalidatesItsEnumerator) {
  open();
  EXPECT_EQ(calls(), (Words{"open i1", "list start"}));
  enumerator().givePage({item(1, "a")}, "p2");
  run();
  EXPECT_EQ(calls(), (Words{"list p2"})) << "a page that is on its way keeps it";
  enumerator().listings.clear();
  EXPECT_EQ(calls(), (Words{"invalidate"}));
}

TEST_F(ListingTest, RequestsAboveTheMostWaitTheirTurnAndExpireThere) {
  const auto turns = std::make_shared<RequestTurns>(executor, 2);
  const HostTools tools{executor, timers};
  std::vector<RequestTurns::Turn> held;
  Words heard;
  const auto begin = [&](const std::string& name) {
    auto timed = TimedReply<>::begin(tools, [&heard, name](const NSErrorPtr& error) {
      heard.push_back(name + (error ? " late" : " answered"));
    });
    turns->take([&, name, timed](RequestTurns::Turn turn) {
      if (!timed->keep(turn)) return;
      heard.push_back(name);
      held.push_back(std::move(turn));
    });
    return timed;
  };
  const auto first = begin("1");
  const auto second = begin("2");
  const auto third = begin("3");
  run();
  EXPECT_EQ(std::exchange(heard, {}), (Words{"1", "2"}));
  (*first)(nullptr);
  run();
  EXPECT_EQ(std::exchange(heard, {}), (Words{"1 answered"})) << "its work still holds a thread";
  held.erase(held.begin());
  run();
  EXPECT_EQ(std::exchange(heard, {}), (Words{"3"}));
  const auto fourth = begin("4");
  timers->advance(deadlines::kRequest);
  run();
  EXPECT_EQ(std::exchange(heard, {}), (Words{"2 late", "3 late", "4 late"}));
  held.clear();
  run();
  EXPECT_EQ(heard, Words{}) << "nobody wants the work any more";
  const auto fifth = begin("5");
  EXPECT_EQ(heard, (Words{"5"}));
  (*fifth)(nullptr);
  run();
}

TEST_F(ListingTest, OpeningIsTimedAndItsErrorToldAsItIs) {
  extension->error = vlc_errorLoggedOut();
  EXPECT_EQ(open(), nullptr);
  EXPECT_EQ(openError, extension->error);
}

TEST(ItemPaths, NormalisesAndRefuses) {
  EXPECT_EQ(ItemPaths::normalised("//a///b/", nullptr), "/a/b");
  EXPECT_EQ(ItemPaths::normalised("/", nullptr), "/");
  EXPECT_EQ(ItemPaths::normalised("/...", nullptr), "/...");
  for (const char* bad : {"", "a", "/a/..", "/./a"}) {
    NSErrorPtr error;
    EXPECT_FALSE(ItemPaths::normalised(bad, &error)) << bad;
    ASSERT_TRUE(error);
    EXPECT_EQ(error->code(), VLVellumErrorInvalidParameter);
  }
}

using NSExtensionMainTest = HostTest;

TEST_F(NSExtensionMainTest, ReadsInstantiatesAndHandsOver) {
  const std::string path = testing::TempDir() + "skein-attributes-test";
  std::shared_ptr<const NSExtensionAttributes> seen;
  const NSExtensionPrincipalClasses classes{
      {"Known",
       [&](auto attributes) -> std::shared_ptr<NSFileProviderExtension> {
         seen = attributes;
         return extension;
       }},
      {"Refusing", [](auto) { return nullptr; }}};
  const auto enter = [&](const std::string& from) {
    NSErrorPtr error;
    const bool isEntered = NSExtensionMain(from, classes, *host, &error);
    EXPECT_EQ(isEntered, error == nullptr);
    return error ? error->localizedDescription() : "";
  };
  const auto enterWith = [&](const std::string& text) {
    std::ofstream(path) << text;
    return enter(path);
  };
  const std::string point = "NSExtensionPointIdentifier=com.tessel.fileprovider\n";
  const std::string place = "NSExtensionFileProviderDocumentGroup=drive\n";
  const std::string lists = "NSExtensionFileProviderSupportsEnumeration=YES\n";
  const auto named = [](const std::string& name) {
    return "NSExtensionPrincipalClass = " + name + "\n";
  };

  ASSERT_EQ(enterWith("# words\n\n" + point + named("Known") + place + lists), "");
  ASSERT_TRUE(seen);
  EXPECT_EQ(seen->principalClass, "Known");
  const auto listed = [&] {
    std::int64_t code = 0;
    host->list("i1", NSFileProviderInitialPageSortedByName(),
               [&](auto, const NSErrorPtr& error) { code = error ? error->code() : 0; });
    run();
    return code;
  };
  EXPECT_EQ(listed(), 0);
  enumerator().givePage({});
  ASSERT_EQ(
      enterWith(point + named("Known") + place + "NSExtensionFileProviderSupportsEnumeration=NO\n"),
      "");
  EXPECT_EQ(listed(), NSFeatureUnsupportedError);

  const auto says = [](const std::string& failure, const std::string& words) {
    return failure.find(words) != std::string::npos;
  };
  EXPECT_TRUE(says(enterWith(point + named("Nobody") + place + lists), "\"Nobody\""));
  EXPECT_TRUE(says(enterWith(point + named("Refusing") + place + lists), "refused"));
  EXPECT_TRUE(says(enterWith(point + place + lists), "NSExtensionPrincipalClass is missing"));
  EXPECT_TRUE(says(enterWith(named("Known") + place + lists), "PointIdentifier is missing"));
  EXPECT_TRUE(says(enterWith(point + "words alone\n"), ":2: a line is KEY=VALUE"));
  EXPECT_TRUE(says(enterWith(point + "Other=1\n"), ":2: there is no such key"));
  EXPECT_TRUE(says(enterWith("NSExtensionPointIdentifier=other\n"), ":1: NSExtensionPoint"));
  EXPECT_TRUE(says(enterWith(std::string(70'000, '#')), "too large"));
  EXPECT_TRUE(says(enter(testing::TempDir()), "it is no file"));
  std::remove(path.c_str());
  EXPECT_TRUE(says(enter(path), "No such file"));
}

}  // namespace
}  // namespace skein
