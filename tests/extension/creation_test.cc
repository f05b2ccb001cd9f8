// Import and folder creation.
#include <gtest/gtest.h>

#include "tests/extension/OperationsFixture.h"

namespace skein {
namespace {

struct Creation : OperationsFixture {
  void import(const std::string& into) {
    host.importDocumentAtURL(NSURL::fileURLWithPath("/home/x"), into, answer());
  }
  void create(const std::string& under) { host.createDirectoryWithName("new", under, answer()); }

  const NSURLPtr created = storeURL("/f/new");
  const std::string gotNewURL = "[DEBUG] got new URL file:///store/f/new; (null)";
};

TEST_F(Creation, ImportLooksTheFolderUpBeforeItsSection) {
  import(folder);
  EXPECT_EQ(take(), (Lines{"[DEBUG] ┏3 importing document at file:///home/x to file:///store/f",
                           "files: import file:///home/x under file:///store/f", "[DEBUG] ┗3 "}));
  EXPECT_EQ(finish(created), (Lines{gotNewURL, "items: ask file:///store/f/new after a scan",
                                    "answer: new, no error"}));

  import(alias);
  EXPECT_EQ(take().at(2), "files: import file:///home/x under file:///store/target");
  finish(nullptr, cocoa(4));
  import(unknown);
  EXPECT_EQ(take(), (Lines{"[DEBUG] ┏d importing document at file:///home/x to (null)",
                           "answer: no item, NSFileProviderErrorDomain -1005 of " + unknown,
                           "[DEBUG] ┗d "}));
}

TEST_F(Creation, ACreatedFolderIsNamedByItsParentsIdentifier) {
  create(alias);
  EXPECT_EQ(take(), (Lines{"[DEBUG] ┏1 creating directory new under " + alias,
                           "documents: resolve file:///store/alias",
                           "files: create \"new\" under file:///store/target", "[DEBUG] ┗1 "}));
  EXPECT_EQ(finish(created), (Lines{gotNewURL, "items: ask file:///store/f/new after a scan",
                                    "answer: new, no error"}));

  create(unknown);
  EXPECT_EQ(take(), (Lines{"[DEBUG] ┏7 creating directory new under " + unknown,
                           "answer: no item, NSFileProviderErrorDomain -1005 of " + unknown,
                           "[DEBUG] ┗7 "}));
}

TEST_F(Creation, OnlyTheFileSystemTranslationIsApplied) {
  for (const bool importing : {true, false}) {
    const auto failWith = [&](const NSErrorPtr& error) {
      if (importing) {
        import(folder);
      } else {
        create(folder);
      }
      take();
      Lines lines = finish(created, error);
      EXPECT_EQ(lines.front(), "[DEBUG] got new URL file:///store/f/new; " + description(error));
      return lines.back();
    };
    EXPECT_EQ(failWith(fileExists(created)),
              "answer: no item, NSFileProviderErrorDomain -1001 with new");
    const NSErrorPtr nothingThere = fileExists(storeURL("/f/old"));
    EXPECT_EQ(failWith(nothingThere), "answer: no item, NSCocoaErrorDomain 516");
    EXPECT_EQ(lastError, nothingThere);
    // What the host has codes of its own for reaches it as it is.
    for (const NSErrorPtr& error :
         {cocoa(14), cocoa(4355), NSError::errorWithDomain("VLVellumErrorDomain", 2)}) {
      failWith(error);
      EXPECT_EQ(lastError, error);
    }
  }
}

TEST_F(Creation, AResultThatCannotBeLookedUpIsNoErrorOfAnImport) {
  framework.queryItems.error = cocoa(14);
  framework.queryItems.items.clear();
  import(folder);
  take();
  EXPECT_EQ(finish(created),
            (Lines{gotNewURL, "items: ask file:///store/f/new after a scan",
                   "[DEBUG] couldn't find item after importing it: NSFileProviderErrorDomain -1005 "
                   "{NSCocoaErrorDomain 14}",
                   "answer: no item, no error"}));
  create(folder);
  take();
  EXPECT_EQ(
      finish(created),
      (Lines{gotNewURL, "items: ask file:///store/f/new after a scan",
             "answer: no item, NSFileProviderErrorDomain -1005 under NSCocoaErrorDomain 14"}));

  // Neither URL nor error: the lookup of nothing.
  import(folder);
  take();
  EXPECT_EQ(finish(nullptr),
            (Lines{"[DEBUG] got new URL (null); (null)",
                   "[DEBUG] couldn't find item after importing it: NSFileProviderErrorDomain -1005",
                   "answer: no item, no error"}));
  create(folder);
  take();
  EXPECT_EQ(finish(nullptr), (Lines{"[DEBUG] got new URL (null); (null)",
                                    "answer: no item, NSFileProviderErrorDomain -1005"}));
}

TEST_F(Creation, TheFrameworksHandlerKeepsTheExtension) {
  import(folder);
  host.createDirectoryWithName("new", folder, nullptr);
  take();
  const std::weak_ptr<VLFileProviderExtension> weak = extension;
  extension.reset();
  EXPECT_EQ(finish(created).back(), "answer: new, no error");
  EXPECT_FALSE(weak.expired());
  finish(created);
  EXPECT_TRUE(weak.expired());
}

}  // namespace
}  // namespace skein
