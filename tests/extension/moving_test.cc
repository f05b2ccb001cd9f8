// Rename and reparent.
#include <gtest/gtest.h>

#include "tests/extension/OperationsFixture.h"

namespace skein {
namespace {

struct Moving : OperationsFixture {
  void rename(const std::string& identifier) {
    host.renameItemWithIdentifier(identifier, "new", answer());
  }
  void move(const std::string& identifier, std::optional<std::string> newName = std::nullopt) {
    host.reparentItemWithIdentifier(identifier, folder, std::move(newName), answer());
  }
  const NSURLPtr moved = storeURL("/f/new");
};

TEST_F(Moving, RenamingAnAliasRenamesItsTarget) {
  rename(alias);
  EXPECT_EQ(
      take(),
      (Lines{"[DEBUG] ┏1 renaming " + alias + " to new", "documents: resolve file:///store/alias",
             "documents: physical file:///store/target", "[DEBUG] source URL: file:///store/target",
             "files: rename file:///store/target to \"new\"", "[DEBUG] ┗1 "}));
  EXPECT_EQ(finish(moved),
            (Lines{"[DEBUG] got new URL file:///store/f/new; (null)",
                   "items: ask file:///store/f/new after a scan", "answer: new, no error"}));

  rename(unknown);
  EXPECT_EQ(
      take(),
      (Lines{"[DEBUG] ┏7 renaming " + unknown + " to new", "[DEBUG] source URL: (null)",
             "answer: no item, NSFileProviderErrorDomain -1005 of " + unknown, "[DEBUG] ┗7 "}));
}

TEST_F(Moving, MovingAnAliasMovesTheAlias) {
  move(alias, "new");
  EXPECT_EQ(take(), (Lines{"[DEBUG] ┏1 reparenting " + alias + " under " + folder,
                           "documents: physical file:///store/alias",
                           "[DEBUG] reparenting url file:///store/alias under file:///store/f",
                           // Judged under the old name.
                           "files: may file:///store/alias become file:///store/f/alias",
                           "files: move file:///store/alias under file:///store/f as \"new\"",
                           "[DEBUG] ┗1 "}));
  EXPECT_EQ(finish(moved),
            (Lines{"[DEBUG] got new URL file:///store/f/new; (null)",
                   "items: ask file:///store/f/new after a scan", "answer: new, no error"}));
  move(document);
  EXPECT_EQ(take().at(4), "files: move file:///store/a under file:///store/f as nil");
  EXPECT_EQ(finish(nullptr).back(), "answer: no item, NSFileProviderErrorDomain -1005");
}

TEST_F(Moving, AMoveNamesTheIdentifierThatIsMissing) {
  move(unknown);
  EXPECT_EQ(take(), (Lines{"[DEBUG] ┏1 reparenting " + unknown + " under " + folder,
                           "answer: no item, NSFileProviderErrorDomain -1005 of " + unknown,
                           "[DEBUG] ┗1 "}));
  host.reparentItemWithIdentifier(document, unknown, std::nullopt, answer());
  EXPECT_EQ(take(), (Lines{"[DEBUG] ┏5 reparenting " + document + " under " + unknown,
                           "documents: physical file:///store/a",
                           "answer: no item, NSFileProviderErrorDomain -1005 of " + unknown,
                           "[DEBUG] ┗5 "}));
  // The destination's alias is followed, and gets no physical property.
  host.reparentItemWithIdentifier(document, alias, std::nullopt, answer());
  EXPECT_EQ(take().at(3), "[DEBUG] reparenting url file:///store/a under file:///store/target");
  finish(nullptr, cocoa(4));
}

TEST_F(Moving, AMoveNeedsOneOfTheBitsThatAllowIt) {
  for (int bit = 0; bit < 64; ++bit) {
    framework.fileOperations.capability = std::uint64_t{1} << bit;
    move(document);
    env.run();
    const bool allowed = framework.fileOperations.results.count() == 1;
    EXPECT_EQ(allowed, std::set({0, 3, 4, 5, 6, 7, 8, 10, 12}).contains(bit)) << bit;
    if (allowed) finish(nullptr, cocoa(4));
  }
}

TEST_F(Moving, ARefusedMoveIsAPermissionErrorUnlessTheCheckSaysWhy) {
  framework.fileOperations.capability = 0x6;
  move(document, "new");
  const Lines lines = take();
  EXPECT_EQ(Lines(lines.begin() + 4, lines.end()),
            (Lines{"[ERROR] can't move file:///store/a to file:///store/f; NSCocoaErrorDomain 512 "
                   "{NSPOSIXErrorDomain 13 \"The move between those locations is invalid\"}",
                   "answer: no item, NSCocoaErrorDomain 512 under NSPOSIXErrorDomain 13",
                   "[DEBUG] ┗1 "}));
  EXPECT_EQ(lastError->userInfo().size(), 1u);

  framework.fileOperations.capabilityError = cocoa(14);
  move(document);
  EXPECT_EQ(take().at(5),
            "answer: no item, NSFileProviderErrorDomain -1005 under NSCocoaErrorDomain 14");
}

TEST_F(Moving, TheChecksErrorStaysInTheSlotOfAMoveThatIsAllowed) {
  framework.fileOperations.capabilityError = NSError::errorWithDomain("VLVellumErrorDomain", 2);
  move(document);
  take();
  // Translated by the lookup that finds it there.
  EXPECT_EQ(finish(moved).back(),
            "answer: new, NSFileProviderErrorDomain -1000 under VLVellumErrorDomain 2");
  move(document);
  take();
  EXPECT_EQ(finish(moved, cocoa(513)).back(), "answer: no item, NSCocoaErrorDomain 513");
}

TEST_F(Moving, BothTranslationsAreApplied) {
  for (const bool renaming : {true, false}) {
    const auto failWith = [&](const NSErrorPtr& error) {
      if (renaming) {
        rename(document);
      } else {
        move(document);
      }
      take();
      Lines lines = finish(moved, error);
      EXPECT_EQ(lines.front(), "[DEBUG] got new URL file:///store/f/new; " + description(error));
      return lines.back();
    };
    EXPECT_EQ(failWith(fileExists(moved)),
              "answer: no item, NSFileProviderErrorDomain -1001 with new");
    EXPECT_EQ(failWith(cocoa(4354)),
              "answer: no item, NSFileProviderErrorDomain -1003 under NSCocoaErrorDomain 4354");
    EXPECT_EQ(failWith(cocoa(4)), "answer: no item, NSCocoaErrorDomain 4");
  }
}

}  // namespace
}  // namespace skein
