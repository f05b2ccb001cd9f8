// Last used date, favourite rank and tags.
#include <gtest/gtest.h>

#include "platform/fileprovider/FPTags.h"
#include "tests/extension/OperationsFixture.h"

namespace skein {
namespace {

struct Metadata : OperationsFixture {
  Metadata() {
    framework.queryItems.items["/store/alias"] = makeItem(9, false, "alias");
    framework.queryItems.items["/store/target"] = makeItem(8, false, "target");
  }
};

TEST_F(Metadata, DateAndRankAreTheAliasesOwnAndDifferInThePhysicalProperty) {
  const NSDate date = std::chrono::sys_days(std::chrono::year(2026) / 2 / 28) +
                      std::chrono::seconds(3661) + std::chrono::milliseconds(999);
  host.setLastUsedDate(date, alias, answer());
  EXPECT_EQ(take(), (Lines{"[DEBUG] ┏1 set last used date 2026-02-28 01:01:01 +0000 for " + alias,
                           "file manager: date 2026-02-28 01:01:01 +0000 on file:///store/alias",
                           "items: ask file:///store/alias after a scan", "answer: alias, no error",
                           "[DEBUG] ┗1 "}));
  host.setFavoriteRank(-3, alias, answer());
  EXPECT_EQ(take(), (Lines{"[DEBUG] ┏7 set favorite rank -3 for " + alias,
                           "documents: physical file:///store/alias",
                           "file manager: rank -3 on file:///store/alias",
                           "items: ask file:///store/alias after a scan", "answer: alias, no error",
                           "[DEBUG] ┗7 "}));
}

TEST_F(Metadata, AnIdentifierThatNamesNothingIsNotCheckedFor) {
  host.setLastUsedDate(std::nullopt, unknown, answer());
  EXPECT_EQ(take(), (Lines{"[DEBUG] ┏1 set last used date (null) for " + unknown,
                           "file manager: date (null) on (null)",
                           "answer: no item, NSFileProviderErrorDomain -1005", "[DEBUG] ┗1 "}));
  EXPECT_TRUE(lastError->userInfo().empty());
  host.setFavoriteRank(std::nullopt, unknown, answer());
  EXPECT_EQ(take(), (Lines{"[DEBUG] ┏5 set favorite rank (null) for " + unknown,
                           "file manager: rank (null) on (null)",
                           "answer: no item, NSFileProviderErrorDomain -1005", "[DEBUG] ┗5 "}));
  host.setTagData(std::nullopt, unknown, answer());
  EXPECT_EQ(take(), (Lines{"[DEBUG] ┏9 set tag data (0 bytes) for " + unknown,
                           "files: tag (null) ()", "[ERROR] can't set tags for (null); (null)",
                           "answer: no item, no error", "[DEBUG] ┗9 "}));
}

TEST_F(Metadata, TagsAreTheTargetsInTheirOrder) {
  const auto data = FPGetTagsDataFromTags({{"Red", FPTag::Color::Red}, {"a b", {}}});
  host.setTagData(data, alias, answer());
  EXPECT_EQ(take(), (Lines{"[DEBUG] ┏1 set tag data (13 bytes) for " + alias,
                           "documents: resolve file:///store/alias",
                           "documents: physical file:///store/target",
                           "files: tag file:///store/target (Red, a b)",
                           "items: ask file:///store/target after a scan",
                           "answer: target, no error", "[DEBUG] ┗1 "}));
}

TEST_F(Metadata, AFailedTagWriteIsLoggedAndTranslated) {
  framework.fileOperations.setsTags = false;
  framework.fileOperations.tagError = cocoa(4355);
  host.setTagData(NSData(), document, answer());
  EXPECT_EQ(take(),
            (Lines{"[DEBUG] ┏1 set tag data (0 bytes) for " + document,
                   "documents: physical file:///store/a", "files: tag file:///store/a ()",
                   "[ERROR] can't set tags for file:///store/a; NSCocoaErrorDomain 4355",
                   "answer: no item, NSFileProviderErrorDomain -1004 under NSCocoaErrorDomain 4355",
                   "[DEBUG] ┗1 "}));
  host.setTagData(NSData(), document, nullptr);
  EXPECT_EQ(take().at(3), "[ERROR] can't set tags for file:///store/a; NSCocoaErrorDomain 4355");

  // An error that a write leaves although it succeeds goes through the lookup's slot.
  framework.fileOperations.setsTags = true;
  framework.queryItems.items["/store/a"] = makeItem(1, false, "a");
  host.setTagData(NSData(), document, answer());
  EXPECT_EQ(take().at(4),
            "answer: a, NSFileProviderErrorDomain -1004 under NSCocoaErrorDomain 4355");
}

}  // namespace
}  // namespace skein
