// The platform's value types and the small machines beside them.
#include <gtest/gtest.h>

#include <future>
#include <string>
#include <thread>
#include <vector>

#include "platform/fileprovider/NSFileProviderError.h"
#include "platform/foundation/NSData.h"
#include "platform/foundation/NSNotificationCenter.h"
#include "platform/foundation/NSProgress.h"
#include "platform/foundation/NSURL.h"
#include "vellum/VLFileObjectID.h"

namespace skein {
namespace {

class Observer {
 public:
  void heard() {
    ++count;
    thread = std::this_thread::get_id();
    if (onHeard) onHeard();
  }
  int count = 0;
  std::thread::id thread;
  std::function<void()> onHeard;
};

TEST(NotificationCenter, DeliversOnThePostersThreadByNameInOrderUntilRemoved) {
  NSNotificationCenter center;
  auto first = std::make_shared<Observer>();
  auto second = std::make_shared<Observer>();
  std::vector<int> order;
  first->onHeard = [&] { order.push_back(1); };
  second->onHeard = [&] { order.push_back(2); };
  center.addObserver(first, &Observer::heard, "a");
  center.addObserver(first, &Observer::heard, "b");
  center.addObserver(second, &Observer::heard, "a");

  std::thread poster([&] {
    center.postNotificationName("a");
    EXPECT_EQ(first->thread, std::this_thread::get_id());
  });
  poster.join();
  EXPECT_EQ(order, (std::vector<int>{1, 2}));

  center.removeObserver(first.get(), "a");
  center.postNotificationName("a");
  center.postNotificationName("b");
  EXPECT_EQ(first->count, 2);
  EXPECT_EQ(second->count, 2);
  center.removeObserver(first.get());
  EXPECT_EQ(center.observerCount("b"), 0u);
}

TEST(NotificationCenter, HoldsNoLockAndNoObserverWhileDelivering) {
  NSNotificationCenter center;
  auto gone = std::make_shared<Observer>();
  auto observer = std::make_shared<Observer>();
  center.addObserver(gone, &Observer::heard, "a");
  center.addObserver(observer, &Observer::heard, "a");
  gone.reset();
  // A handler that registers and removes from another thread would deadlock on a held lock.
  observer->onHeard = [&] {
    std::async(std::launch::async, [&] { center.removeObserver(observer.get()); }).get();
  };
  center.postNotificationName("a");
  center.postNotificationName("a");
  EXPECT_EQ(observer->count, 1);
}

TEST(Progress, CancelsOnceAndRunsALateHandlerAtOnce) {
  auto progress = NSProgress::progressWithTotalUnitCount(3);
  int cancelled = 0;
  progress->setCancellable(false);
  progress->setCancellationHandler([&] { ++cancelled; });
  progress->cancel();
  EXPECT_FALSE(progress->isCancelled());
  progress->setCancellable(true);
  progress->cancel();
  progress->cancel();
  EXPECT_EQ(cancelled, 1);
  progress->setCancellationHandler([&] { cancelled += 10; });
  EXPECT_EQ(cancelled, 11);
}

TEST(URL, TakesPathsApartAndComparesByPathAlone) {
  const NSURLPtr url = NSURL::fileURLWithPath("/drive/a b/caf\xC3\xA9/");
  EXPECT_EQ(url->path(), "/drive/a b/caf\xC3\xA9");
  EXPECT_EQ(url->lastPathComponent(), "caf\xC3\xA9");
  EXPECT_EQ(url->URLByDeletingLastPathComponent()->path(), "/drive/a b");
  EXPECT_EQ(url->absoluteString(), "file:///drive/a%20b/caf%C3%A9");
  const NSURLPtr root = NSURL::fileURLWithPath("/");
  EXPECT_EQ(root->URLByAppendingPathComponent("x")->path(), "/x");
  EXPECT_EQ(root->URLByDeletingLastPathComponent()->path(), "/");
  const NSURLPtr copy = url->copy();
  copy->attachPhysicalProperty();
  EXPECT_FALSE(url->isPhysical());
  EXPECT_TRUE(copy->copy()->isPhysical());
  EXPECT_TRUE(isEqualURL(url, copy));
  EXPECT_FALSE(isEqualURL(url, nullptr));
  EXPECT_TRUE(isEqualURL(nullptr, nullptr));
}

TEST(Data, ComesFromPlainFilesAloneAndWhole) {
  const auto read = [](const char* path) {
    return NSData::dataWithContentsOfURL(NSURL::fileURLWithPath(path));
  };
  // Longer than its size tells.
  ASSERT_TRUE(read("/proc/self/status"));
  EXPECT_GT(read("/proc/self/status")->length(), 100u);
  EXPECT_FALSE(read("/dev/null"));
  EXPECT_FALSE(read("/proc/self/mem"));  // cannot be read at its start
  EXPECT_FALSE(read("/"));
  EXPECT_FALSE(NSData::dataWithContentsOfURL(nullptr));
}

TEST(FileObjectID, ParsesExactlyWhatItPrints) {
  const auto document = VLFileObjectID::documentWithRawID(0xFEDCBA9876543210);
  const auto folder = VLFileObjectID::folderOrAliasWithRawID(7);
  EXPECT_EQ(document.asString(), "dfedcba9876543210");
  EXPECT_EQ(folder.asString(), "i0000000000000007");
  EXPECT_EQ(VLFileObjectID::fileObjectIDWithString(document.asString()), document);
  EXPECT_EQ(VLFileObjectID::fileObjectIDWithString(folder.asString()), folder);
  EXPECT_TRUE(folder.isFolderOrAliasID());
  for (const char* wrong :
       {"", "d", "i7", "dFEDCBA9876543210", "d0000000000000007 ", "x0000000000000007",
        "d00000000000000070", "d-000000000000007", NSFileProviderRootContainerItemIdentifier,
        NSFileProviderWorkingSetContainerItemIdentifier,
        NSFileProviderAllDirectoriesContainerItemIdentifier}) {
    EXPECT_FALSE(VLFileObjectID::fileObjectIDWithString(std::string(wrong))) << wrong;
  }
  EXPECT_FALSE(VLFileObjectID::fileObjectIDWithString(std::nullopt));
}

TEST(FileProviderErrors, CarryWhatTheyAreAboutAndNothingElse) {
  const auto missing = fileProviderErrorForNonExistentItemWithIdentifier("x");
  EXPECT_EQ(missing->code(), NSFileProviderErrorNoSuchItem);
  EXPECT_EQ(std::get<std::string>(
                missing->userInfo().at(NSFileProviderErrorNonExistentItemIdentifierKey)),
            "x");
  EXPECT_TRUE(fileProviderErrorForNonExistentItemWithIdentifier(std::nullopt)->userInfo().empty());
  const auto url = NSURL::fileURLWithPath("/a");
  EXPECT_EQ(fp_collidingURL(NSError::errorWithDomain(NSCocoaErrorDomain, NSFileWriteFileExistsError,
                                                     {{NSURLErrorKey, url}})),
            url);
  EXPECT_EQ(fp_collidingURL(nullptr), nullptr);
  EXPECT_EQ(fp_collidingURL(missing), nullptr);
}

}  // namespace
}  // namespace skein
