// Trash, untrash and delete.
#include <gtest/gtest.h>

#include "tests/extension/OperationsFixture.h"

namespace skein {
namespace {

struct Removal : OperationsFixture {
  Lines untrash(std::optional<std::string> into = std::nullopt) {
    host.untrashItemWithIdentifier(document, std::move(into), answer());
    return take();
  }
  void setContainer(const NSURLPtr& documentsURL) {
    framework.fileOperations.containers["/store/a"] = std::make_shared<VLContainer>(
        VLContainer::Properties{"app", documentsURL, "App", std::nullopt});
  }

  const NSURLPtr trashed = storeURL("/.Trash/a");
};

TEST_F(Removal, TrashingAnswersBeforeItReturnsAndTranslatesNothing) {
  framework.fileManager.trashedURL = trashed;
  framework.queryItems.items["/store/.Trash/a"] = makeItem(1, false, "trashed");
  framework.fileOperations.coordinatedURL = storeURL("/a2");
  framework.fileManager.trashes = false;  // said besides, and not asked
  host.trashItemWithIdentifier(document, answer());
  EXPECT_EQ(take(),
            (Lines{"[DEBUG] ┏1 trashing item " + document, "documents: physical file:///store/a",
                   "files: coordinate the deletion of file:///store/a",
                   "fp: [DEBUG] trashing file:///store/a2", "file manager: trash file:///store/a2",
                   "items: ask file:///store/.Trash/a after a scan", "answer: trashed, no error",
                   "[DEBUG] ┗1 "}));

  // An error beside the trashed item's URL: it is not looked up.
  framework.fileManager.trashError = cocoa(14);
  host.trashItemWithIdentifier(alias, answer());
  Lines lines = take();
  EXPECT_EQ(lines.at(1), "documents: physical file:///store/alias");
  EXPECT_EQ(lines.at(5), "answer: no item, NSCocoaErrorDomain 14");

  framework.fileManager.trashError = nullptr;
  framework.fileManager.trashedURL = nullptr;
  framework.fileOperations.coordinatedURL = NSURLPtr();
  host.trashItemWithIdentifier(document, answer());
  lines = take();
  EXPECT_EQ(Lines(lines.begin() + 3, lines.end() - 1),
            (Lines{"fp: [DEBUG] trashing (null)", "file manager: trash (null)",
                   "answer: no item, no error"}));

  // The lookup's error is as the lookup leaves it.
  framework.fileManager.trashedURL = trashed;
  framework.queryItems.error = cocoa(14);
  host.trashItemWithIdentifier(document, answer());
  EXPECT_EQ(take().at(6),
            "answer: trashed, NSFileProviderErrorDomain -1005 under NSCocoaErrorDomain 14");
}

TEST_F(Removal, TrashingNeedsTheItemAndTheCoordination) {
  host.trashItemWithIdentifier(unknown, answer());
  EXPECT_EQ(take(), (Lines{"[DEBUG] ┏1 trashing item " + unknown,
                           "answer: no item, NSFileProviderErrorDomain -1005 of " + unknown,
                           "[DEBUG] ┗1 "}));
  const NSErrorPtr failure = cocoa(4355);
  framework.fileOperations.coordinationError = failure;
  host.trashItemWithIdentifier(document, answer());
  EXPECT_EQ(take(),
            (Lines{"[DEBUG] ┏5 trashing item " + document, "documents: physical file:///store/a",
                   "files: coordinate the deletion of file:///store/a",
                   "[DEBUG] failed to coordinate the deletion: NSCocoaErrorDomain 4355",
                   "answer: no item, NSCocoaErrorDomain 4355", "[DEBUG] ┗5 "}));
  EXPECT_EQ(lastError, failure);
}

TEST_F(Removal, UntrashingGoesWhereItWasAsked) {
  EXPECT_EQ(untrash(folder),
            (Lines{"[DEBUG] ┏1 untrashing item " + document, "documents: physical file:///store/a",
                   "[DEBUG] untrashing from url: file:///store/a",
                   "[DEBUG] untrashing item to file:///store/f",
                   "files: move file:///store/a under file:///store/f, bouncing", "[DEBUG] ┗1 "}));
  EXPECT_EQ(finish(storeURL("/f/new")),
            (Lines{"[DEBUG] item was untrashed to file:///store/f/new",
                   "items: ask file:///store/f/new after a scan", "answer: new, no error"}));

  host.untrashItemWithIdentifier(unknown, folder, answer());
  EXPECT_EQ(take(), (Lines{"[DEBUG] ┏9 untrashing item " + unknown,
                           "answer: no item, NSFileProviderErrorDomain -1005 of " + unknown,
                           "[DEBUG] ┗9 "}));
  // The alias comes back, not what it points to.
  host.untrashItemWithIdentifier(alias, folder, answer());
  EXPECT_EQ(take().at(2), "[DEBUG] untrashing from url: file:///store/alias");
  finish(nullptr, cocoa(4));
}

TEST_F(Removal, UntrashingFallsBackToWhereItWasThenToItsContainer) {
  const std::string fallback = "[DEBUG] couldn't use putback url, fallback to default container";
  framework.fileManager.putBackURLs["/store/a"] = storeURL("/g/old");
  framework.fileManager.putBackError = cocoa(14);  // ignored
  framework.fileOperations.reachable = {"/store/g"};
  Lines lines = untrash(unknown);
  EXPECT_EQ(Lines(lines.begin() + 3, lines.end() - 1),
            (Lines{"file manager: where was file:///store/a",
                   "[DEBUG] untrash with putback url: file:///store/g/old",
                   "[DEBUG] untrashing item to file:///store/g",
                   "files: move file:///store/a under file:///store/g, bouncing"}));
  finish(nullptr, cocoa(4));

  // The folder is gone, or it was never known.
  framework.fileOperations.reachable.clear();
  setContainer(storeURL("/Documents"));
  EXPECT_EQ(untrash().at(5), fallback);
  finish(nullptr, cocoa(4));
  framework.fileManager.putBackURLs.clear();
  lines = untrash();
  EXPECT_EQ(
      Lines(lines.begin() + 3, lines.end() - 1),
      (Lines{"file manager: where was file:///store/a", "[DEBUG] untrash with putback url: (null)",
             fallback, "[DEBUG] untrashing item to file:///store/Documents",
             "files: move file:///store/a under file:///store/Documents, bouncing"}));
  finish(nullptr, cocoa(4));

  // Nowhere to go: the error names the destination as it was given, if it was.
  setContainer(nullptr);
  lines = untrash(unknown);
  EXPECT_EQ(Lines(lines.end() - 3, lines.end() - 1),
            (Lines{fallback, "answer: no item, NSFileProviderErrorDomain -1005 of " + unknown}));
  framework.fileOperations.containers.clear();
  lines = untrash();
  EXPECT_EQ(lines.at(lines.size() - 2), "answer: no item, NSFileProviderErrorDomain -1005");
  EXPECT_TRUE(lastError->userInfo().empty());
}

TEST_F(Removal, AFailedUntrashIsLoggedAndTranslatedTwice) {
  untrash(folder);
  EXPECT_EQ(finish(nullptr, cocoa(4354)),
            (Lines{"[ERROR] error untrashing item to (null): NSCocoaErrorDomain 4354",
                   "answer: no item, NSFileProviderErrorDomain -1003 under NSCocoaErrorDomain "
                   "4354"}));
  untrash(folder);
  EXPECT_EQ(finish(nullptr, fileExists(storeURL("/f/new"))).back(),
            "answer: no item, NSFileProviderErrorDomain -1001 with new");
}

TEST_F(Removal, DeletingTriesThePhysicalFileOnceWhenThereIsNoSuchFile) {
  const auto start = [&] {
    host.deleteItemWithIdentifier(alias, errorAnswer());
    return take();
  };
  EXPECT_EQ(start(),
            (Lines{"[DEBUG] ┏1 deleting item " + alias, "documents: physical file:///store/alias",
                   "files: delete file:///store/alias", "[DEBUG] ┗1 "}));
  EXPECT_EQ(finishDeletion(nullptr), Lines{"answer: no error"});

  framework.fileOperations.physicalURLs["/store/alias"] = storeURL("/physical");
  for (const NSErrorPtr& second : {NSErrorPtr(), cocoa(4), cocoa(14)}) {
    start();
    EXPECT_EQ(finishDeletion(cocoa(4)),
              (Lines{"[DEBUG] couldn't delete file:///store/alias, retrying with physical url "
                     "file:///store/physical",
                     "files: delete file:///store/physical"}));
    const Lines lines = finishDeletion(second);
    ASSERT_EQ(lines.size(), 1u);
    const bool translated = second && second->code() == 14;
    EXPECT_EQ(lines[0], translated ? "answer: NSFileProviderErrorDomain -1005 under "
                                     "NSCocoaErrorDomain 14"
                                   : "answer: " + say(second));
  }

  // Only that code of only that domain; a name that is taken is no error of a deletion.
  for (const NSErrorPtr& error : {NSError::errorWithDomain(NSPOSIXErrorDomain, 4), cocoa(512),
                                  cocoa(260), fileExists(storeURL("/f/new"))}) {
    start();
    EXPECT_EQ(finishDeletion(error), Lines{"answer: " + say(error)});
    EXPECT_EQ(lastError, error);
  }
  start();
  EXPECT_EQ(finishDeletion(cocoa(4355)),
            Lines{"answer: NSFileProviderErrorDomain -1004 under NSCocoaErrorDomain 4355"});

  framework.fileOperations.physicalURLs.clear();
  start();
  EXPECT_EQ(finishDeletion(cocoa(4)), (Lines{"answer: NSCocoaErrorDomain 4"}));
  host.deleteItemWithIdentifier(unknown, errorAnswer());
  EXPECT_EQ(take().at(1), "answer: NSFileProviderErrorDomain -1005 of " + unknown);
}

}  // namespace
}  // namespace skein
