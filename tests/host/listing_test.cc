// Listings page by page, their deadlines, and how the extension is instantiated.
#include <fstream>

#include "linux/host/ItemPaths.h"
#include "linux/host/NSExtensionMain.h"
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
  timers->advance(std::chrono::milliseconds(4500));
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

TEST(NSExtensionMain, InstantiatesTheClassThatTheAttributesName) {
  const std::string path = testing::TempDir() + "skein-attributes-test";
  const auto attributesOf = [&](const std::string& text) {
    std::ofstream(path) << text;
    NSErrorPtr error;
    auto attributes = readExtensionAttributes(path, &error);
    return std::pair(attributes, error);
  };
  std::shared_ptr<const NSExtensionAttributes> seen;
  const NSExtensionPrincipalClasses classes{
      {"Known",
       [&](auto attributes) -> std::shared_ptr<NSFileProviderExtension> {
         seen = attributes;
         return std::make_shared<FakeExtension>();
       }},
      {"Refusing", [](auto) { return nullptr; }}};
  const auto failureOf = [&](const std::string& text) {
    NSErrorPtr error;
    EXPECT_EQ(NSExtensionInstantiatePrincipalClass(attributesOf(text).first, classes, &error),
              nullptr);
    return error ? error->localizedDescription() : "";
  };

  const auto [good, none] =
      attributesOf("# words\n\nNSExtensionPrincipalClass = Known\nOther=a=b\n");
  ASSERT_TRUE(good);
  EXPECT_TRUE(NSExtensionInstantiatePrincipalClass(good, classes, nullptr));
  EXPECT_EQ(seen, good);
  EXPECT_EQ(good->values.at("Other"), "a=b");

  EXPECT_NE(failureOf("NSExtensionPrincipalClass=Nobody\n").find("\"Nobody\""), std::string::npos);
  EXPECT_NE(failureOf("NSExtensionPrincipalClass=Refusing\n").find("refused"), std::string::npos);
  EXPECT_NE(failureOf("Other=1\n").find("missing"), std::string::npos);
  EXPECT_NE(attributesOf("a=b\nwords alone\n").second->localizedDescription().find(":2:"),
            std::string::npos);
  std::remove(path.c_str());
  EXPECT_EQ(readExtensionAttributes(path, nullptr), nullptr);
}

}  // namespace
}  // namespace skein
