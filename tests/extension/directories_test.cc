// All folders of the store, page by page.
#include "enumeration/VLDirectoriesEnumerator.h"

#include <gtest/gtest.h>

#include "support/NSData+Additions.h"
#include "tests/support/Observers.h"
#include "tests/support/TestEnvironment.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

TEST(Directories, ListsPagesAndTranslatesRepliesErrorsAlone) {
  TestEnvironment env;
  ScriptedDaemon& daemon = env.framework.daemon;
  VLDirectoriesEnumerator enumerator(env.environment);
  const auto list = [&](std::optional<NSData> page) {
    const auto observer = std::make_shared<RecordingObserver>(env.transcript);
    enumerator.enumerateItemsForObserver(observer, std::move(page));
    return observer;
  };

  auto observer = list(NSFileProviderInitialPageSortedByDate());
  daemon.folderPages.next()->reply({makeItem(1)}, 200, nullptr);
  // No section, and no link first.
  EXPECT_EQ(env.run(), (Lines{"daemon: all folders order 1 offset 0 limit 200",
                              "observer: items [doc]", "observer: next page"}));
  EXPECT_EQ(observer->nextPage, vl_pageTokenFromSortOrder(1, 200));
  observer = list(observer->nextPage);
  daemon.folderPages.next()->reply({}, 0, nullptr);
  EXPECT_EQ(env.run(), (Lines{"daemon: all folders order 1 offset 200 limit 200",
                              "observer: items []", "observer: end"}));

  const NSErrorPtr loggedOut = NSError::errorWithDomain(VLVellumErrorDomain, 2);
  list(std::nullopt);
  daemon.folderPages.next()->reply({}, 0, loggedOut);
  EXPECT_EQ(env.run(),
            (Lines{"daemon: all folders order 0 offset 0 limit 200",
                   "[ERROR] there was an error when listing items: VLVellumErrorDomain 2",
                   "observer: error NSFileProviderErrorDomain -1000 under VLVellumErrorDomain 2"}));
  observer = list(std::nullopt);
  daemon.folderPages.next()->fail(loggedOut);
  EXPECT_EQ(env.run().back(), "observer: error VLVellumErrorDomain 2");
  EXPECT_EQ(observer->error, loggedOut);
}

}  // namespace
}  // namespace skein
