// Contents: what is granted at once, the table of downloads, stopping, and many threads.
#include <gtest/gtest.h>

#include <atomic>
#include <random>
#include <thread>

#include "tests/extension/OperationsFixture.h"
#include "tests/support/CountingPool.h"

namespace skein {
namespace {

constexpr std::uint64_t kAlwaysFetches = 0x20000;

struct ProvidingContents : OperationsFixture {
  void start(const NSURLPtr& url, std::uint64_t readingOptions = 0) {
    host.startProvidingItemAtURL(url, readingOptions, errorAnswer());
  }
  std::shared_ptr<ScriptedProvidingOperation> nextOperation() {
    return framework.operations.next();
  }
  // Whether a stop finds no download for the document.
  bool tableIsEmpty() {
    host.stopProvidingItemAtURL(a);
    return take().back() == "file manager: evict file:///store/a";
  }

  const NSURLPtr a = storeURL("/a");
};

TEST_F(ProvidingContents, WhatIsOutsideTheSyncedLocationIsGrantedInSilence) {
  for (const NSURLPtr& url : {NSURL::fileURLWithPath("/elsewhere"), NSURLPtr()}) {
    start(url, kAlwaysFetches);
    EXPECT_EQ(take(), Lines{"answer: no error"});
  }
  host.providePlaceholderAtURL(a, errorAnswer());
  host.providePlaceholderAtURL(a, nullptr);
  host.itemChangedAtURL(a);
  EXPECT_EQ(take(), (Lines{"answer: no error", "[DEBUG] Item changed at URL file:///store/a"}));
}

TEST_F(ProvidingContents, APresentFileIsGrantedAndItsSectionStaysOpen) {
  framework.fileOperations.reachable = {"/store/a"};
  host.startProvidingItemAtURL(a, errorAnswer());
  start(a, 1 | 1 << 5);
  EXPECT_EQ(take(),
            (Lines{"[DEBUG] ┣1 start providing /store/a (readingOptions: none)",
                   "[DEBUG] url exists, granting the read", "answer: no error",
                   "[DEBUG] ┣3 start providing /store/a (readingOptions: without-changes|0x20)",
                   "[DEBUG] url exists, granting the read", "answer: no error"}));
}

TEST_F(ProvidingContents, APresentFileIsFetchedAllTheSameByOptionOrAsAPromise) {
  framework.fileOperations.reachable = {"/store/a", "/store/p"};
  framework.fileOperations.promises = {"/store/p"};
  start(a, kAlwaysFetches);
  start(storeURL("/p"));
  EXPECT_EQ(take(),
            (Lines{"[DEBUG] ┣1 start providing /store/a (readingOptions: always-fetches)",
                   "operation: providing file:///store/a options 131072",
                   "[DEBUG] ┣3 start providing /store/p (readingOptions: none)",
                   "[ERROR] Someone tries to coordinate at the side fault URL '/store/p', odd, but "
                   "allow it",
                   "operation: providing file:///store/p options 0",
                   "operation: start file:///store/a", "operation: start file:///store/p"}));
  nextOperation()->finish(nullptr);
  nextOperation()->finish(nullptr);
}

TEST_F(ProvidingContents, ADownloadEndsAfterTheCallersHandlerAndFreesItsPlace) {
  start(a);
  take();
  const auto operation = nextOperation();
  operation->finish(cocoa(4355));
  EXPECT_EQ(take(), (Lines{"[DEBUG] ┳1 item providing completion; NSCocoaErrorDomain 4355",
                           "answer: NSFileProviderErrorDomain -1004 under NSCocoaErrorDomain 4355",
                           "[DEBUG] ┗1 "}));
  EXPECT_TRUE(tableIsEmpty());

  host.startProvidingItemAtURL(a, kAlwaysFetches, nullptr);
  take();
  nextOperation()->finish(nullptr);
  EXPECT_EQ(take(), (Lines{"[DEBUG] ┳3 item providing completion; (null)", "[DEBUG] ┗3 "}));
}

TEST_F(ProvidingContents, StopCancelsADownloadAndEvictsOnlyWithoutOne) {
  start(a);
  take();
  host.stopProvidingItemAtURL(a);
  EXPECT_EQ(take(), (Lines{"[DEBUG] stop providing /store/a", "operation: cancel file:///store/a",
                           "[DEBUG] ┳1 item providing completion; NSCocoaErrorDomain 3072",
                           "answer: NSCocoaErrorDomain 3072", "[DEBUG] ┗1 "}));

  // Cancelled between the table and the queue: it is started all the same, and reports once.
  start(a);
  host.stopProvidingItemAtURL(a);
  host.stopProvidingItemAtURL(a);
  EXPECT_EQ(take(), (Lines{"[DEBUG] ┣3 start providing /store/a (readingOptions: none)",
                           "operation: providing file:///store/a options 0",
                           "[DEBUG] stop providing /store/a", "operation: cancel file:///store/a",
                           "[DEBUG] stop providing /store/a", "operation: cancel file:///store/a",
                           "operation: start file:///store/a",
                           "[DEBUG] ┳3 item providing completion; NSCocoaErrorDomain 3072",
                           "answer: NSCocoaErrorDomain 3072", "[DEBUG] ┗3 "}));

  host.stopProvidingItemAtURL(a);
  framework.fileManager.evictError = cocoa(14);
  host.stopProvidingItemAtURL(a);
  EXPECT_EQ(take(), (Lines{"[DEBUG] stop providing /store/a", "file manager: evict file:///store/a",
                           "[DEBUG] stop providing /store/a", "file manager: evict file:///store/a",
                           "[ERROR] can't evict item at url: NSCocoaErrorDomain 14"}));
  framework.fileManager.evictError = nullptr;
  host.stopProvidingItemAtURL(nullptr);
  EXPECT_EQ(take(), (Lines{"[DEBUG] stop providing (null)", "file manager: evict (null)",
                           "[ERROR] can't evict item at url: (null)"}));
}

TEST_F(ProvidingContents, ASecondStartTakesThePlaceAndBothAreAnswered) {
  start(a);
  start(a);
  EXPECT_EQ(take(),
            (Lines{"[DEBUG] ┣1 start providing /store/a (readingOptions: none)",
                   "operation: providing file:///store/a options 0",
                   "[DEBUG] ┣3 start providing /store/a (readingOptions: none)",
                   "operation: providing file:///store/a options 0",
                   "[CRIT] Assertion failed: _downloadOperationByPath[path] == nil",
                   "operation: start file:///store/a", "operation: start file:///store/a"}));
  const auto older = nextOperation();
  const auto newer = nextOperation();
  // The older one's end removes the newer one's entry: a stop no longer finds it.
  older->finish(nullptr);
  EXPECT_EQ(take(), (Lines{"[DEBUG] ┳1 item providing completion; (null)", "answer: no error",
                           "[DEBUG] ┗1 "}));
  EXPECT_TRUE(tableIsEmpty());
  newer->finish(cocoa(4));
  EXPECT_EQ(take(), (Lines{"[DEBUG] ┳3 item providing completion; NSCocoaErrorDomain 4",
                           "[CRIT] Assertion failed: self->_downloadOperationByPath[path]",
                           "answer: NSCocoaErrorDomain 4", "[DEBUG] ┗3 "}));
}

TEST_F(ProvidingContents, AStopCancelsTheNewerOfTwoStarts) {
  start(a);
  start(a);
  take();
  const auto older = nextOperation();
  const auto newer = nextOperation();
  host.stopProvidingItemAtURL(a);
  EXPECT_FALSE(newer->finish(nullptr)) << "the newer one goes on";
  EXPECT_TRUE(older->finish(nullptr));
}

TEST_F(ProvidingContents, HandlersRunWithoutTheLockAndKeepTheExtension) {
  // The handler waits for another thread that needs the lock, while a stop is under way.
  bool answered = false;
  host.startProvidingItemAtURL(a, 0, [&, this](const NSErrorPtr&) {
    std::thread([this] { host.stopProvidingItemAtURL(storeURL("/b")); }).join();
    answered = true;
  });
  take();
  host.stopProvidingItemAtURL(a);
  EXPECT_TRUE(answered);

  start(a);
  take();
  nextOperation();
  const auto operation = nextOperation();
  const std::weak_ptr<VLFileProviderExtension> weak = extension;
  extension.reset();
  EXPECT_FALSE(weak.expired());
  operation->finish(nullptr);
  EXPECT_EQ(take().at(1), "answer: no error");
  EXPECT_TRUE(weak.expired());
}

TEST(ProvidingContentsUnderThreads, EveryStartIsAnsweredExactlyOnce) {
  constexpr std::size_t kThreads = 4;
  constexpr std::size_t kStarts = 500;
  const auto pool = std::make_shared<CountingPool>();
  TestEnvironment env(pool);
  for (const LogType type : {LogType::Debug, LogType::Fault, LogType::Error}) {
    env.log.setEnabled(type, false);
  }
  // An operation ends some time after its start, unless a stop is faster.
  env.framework.operations.started = [&](std::shared_ptr<ScriptedProvidingOperation> operation) {
    pool->post([operation = std::move(operation)] { operation->finish(nullptr); });
  };
  auto extension =
      VLFileProviderExtension::init(std::make_shared<NSExtensionAttributes>(), env.environment);

  std::vector<std::atomic<int>> answers(kThreads * kStarts);
  std::vector<std::thread> threads;
  for (std::size_t t = 0; t < kThreads; ++t) {
    threads.emplace_back([&, t] {
      std::minstd_rand random(static_cast<unsigned>(t + 1));
      for (std::size_t i = 0; i < kStarts; ++i) {
        const NSURLPtr url = storeURL("/" + std::to_string(random() % 3));
        extension->startProvidingItemAtURL(
            url, 0, [&answer = answers[t * kStarts + i]](const NSErrorPtr&) { ++answer; });
        if (random() % 2 == 0) extension->stopProvidingItemAtURL(url);
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  ASSERT_TRUE(pool->waitIdle());
  for (const auto& count : answers) ASSERT_EQ(count, 1);

  env.run();
  for (const char* path : {"/0", "/1", "/2"}) extension->stopProvidingItemAtURL(storeURL(path));
  EXPECT_EQ(env.run(),
            (Lines{"file manager: evict file:///store/0", "file manager: evict file:///store/1",
                   "file manager: evict file:///store/2"}));
}

}  // namespace
}  // namespace skein
