// The serial queue and the pool it runs on: order, inline turns, waiting, faults.
#include "base/SerialQueue.h"

#include <gtest/gtest.h>

#include <atomic>
#include <future>
#include <stdexcept>
#include <thread>

#include "base/Completion.h"
#include "base/Fault.h"
#include "base/Mutex.h"
#include "base/ThreadPool.h"
#include "platform/log/Log.h"

namespace skein {
namespace {

constexpr auto kDeadline = std::chrono::seconds(20);

struct FaultCatcher {
  FaultCatcher() {
    previous = setFaultHandler([this](std::string_view text) {
      MutexLock lock(mutex);
      faults.emplace_back(text);
    });
  }
  ~FaultCatcher() { setFaultHandler(previous); }
  FaultHandler previous;
  Mutex mutex;
  std::vector<std::string> faults SKEIN_GUARDED_BY(mutex);
  std::size_t count() {
    MutexLock lock(mutex);
    return faults.size();
  }
};

TEST(SerialQueue, RunsOneAtATimeInOrderAcrossThreads) {
  auto pool = std::make_shared<ThreadPool>(4, "test");
  SerialQueue queue("order", pool);
  std::vector<int> seen;
  std::promise<void> done;
  for (int i = 0; i < 1000; ++i) queue.async([&seen, i] { seen.push_back(i); });
  queue.async([&done] { done.set_value(); });
  ASSERT_EQ(done.get_future().wait_for(kDeadline), std::future_status::ready);
  ASSERT_EQ(seen.size(), 1000u);
  for (int i = 0; i < 1000; ++i) EXPECT_EQ(seen[static_cast<std::size_t>(i)], i);
}

TEST(SerialQueue, AnIdleQueueIsTakenOverByTheCallingThread) {
  auto pool = std::make_shared<ThreadPool>(1, "test");
  SerialQueue queue("inline", pool);
  const auto here = std::this_thread::get_id();
  EXPECT_FALSE(queue.isCurrent());
  EXPECT_EQ(queue.sync([&] {
    EXPECT_TRUE(queue.isCurrent());
    return std::this_thread::get_id();
  }),
            here);
  EXPECT_FALSE(queue.isCurrent());
}

TEST(SerialQueue, ManySyncsAndAsyncsNeverOverlapNorStarveThePool) {
  auto pool = std::make_shared<ThreadPool>(2, "test");
  SerialQueue queue("mixed", pool);
  SerialQueue other("other", pool);
  std::int64_t counter = 0;  // only on `queue`
  std::atomic<int> finished{0};
  std::promise<void> done;
  constexpr int kTasks = 200;
  // Each task waits for the queue from inside a pool thread; with two workers this
  // stands still unless waiting adds threads.
  for (int i = 0; i < kTasks; ++i) {
    pool->post([&] {
      queue.async([&] { ++counter; });
      queue.sync([&] { ++counter; });
      other.sync([&] { queue.sync([&] { ++counter; }); });
      if (++finished == kTasks) done.set_value();
    });
  }
  ASSERT_EQ(done.get_future().wait_for(kDeadline), std::future_status::ready);
  EXPECT_EQ(queue.sync([&] { return counter; }), 3 * kTasks);
}

TEST(SerialQueue, SyncOntoItselfIsAFaultAndRunsInline) {
  FaultCatcher faults;
  auto pool = std::make_shared<ThreadPool>(1, "test");
  SerialQueue queue("self", pool);
  SerialQueue nested("nested", pool);
  int ran = 0;
  queue.sync([&] { nested.sync([&] { queue.sync([&] { ++ran; }); }); });
  EXPECT_EQ(ran, 1);
  EXPECT_EQ(faults.count(), 1u);
}

TEST(SerialQueue, QueueAndPoolMayLoseTheirLastReferenceOnTheirOwnWorker) {
  std::promise<void> gone;
  {
    auto pool = std::make_shared<ThreadPool>(1, "test");
    auto queue = std::make_shared<SerialQueue>("last", pool);
    SerialQueue* raw = queue.get();
    // Destroyed with its closure, on the worker, after queue and pool.
    std::shared_ptr<void> last(nullptr, [&gone](void*) { gone.set_value(); });
    raw->async([last, queue = std::move(queue), pool = std::move(pool)]() mutable {
      queue.reset();
      pool.reset();
    });
  }
  ASSERT_EQ(gone.get_future().wait_for(kDeadline), std::future_status::ready);
}

TEST(Completion, TwiceOrNeverIsAFaultAndEmptyIsNone) {
  FaultCatcher faults;
  int calls = 0;
  {
    Completion<int> once([&](int) { ++calls; });
    Completion<int> moved = std::move(once);
    moved(1);
    EXPECT_EQ(faults.count(), 0u);
    moved(2);
    EXPECT_EQ(faults.count(), 1u);
  }
  {
    Completion<int> never([&](int) { ++calls; });
  }
  EXPECT_EQ(faults.count(), 2u);
  {
    Completion<int> deliberate([&](int) { ++calls; });
    deliberate.neverAnswered();
    Completion<int> empty = nullptr;
    empty(3);
    empty(4);
  }
  EXPECT_EQ(faults.count(), 2u);
  EXPECT_EQ(calls, 1);
}

struct LineLog final : Log {
  void write(LogType, std::string_view line) override { lines.emplace_back(line); }
  std::vector<std::string> lines;
};

TEST(Log, RendersConversionsAndNilAndEvaluatesOnlyWhenEnabled) {
  LineLog log;
  int evaluated = 0;
  const auto number = [&] {
    ++evaluated;
    return std::uint64_t{255};
  };
  VL_DEBUG(log, "[DEBUG] %llx", number());
  EXPECT_EQ(evaluated, 0);
  log.setEnabled(LogType::Debug, true);
  VL_DEBUG(log, "[DEBUG] ┏%llx rank %lld of %@ at (%.2f) in %@", number(), std::int64_t{-1},
           NSErrorPtr(), 1.5, std::vector<std::string>{"a", "b"});
  VL_ERROR(log, "[ERROR] %s: %@", "name", std::optional<std::string>());
  EXPECT_EQ(log.lines,
            (std::vector<std::string>{"[DEBUG] ┏ff rank -1 of (null) at (1.50) in (a, b)",
                                      "[ERROR] name: (null)"}));
}

TEST(ThreadPool, SpareThreadsEnd) {
  ThreadPool pool(1, "test", std::chrono::milliseconds(1));
  std::promise<void> reply;
  const std::shared_future<void> replied = reply.get_future().share();
  std::promise<void> allDone;
  std::atomic<int> done{0};
  for (int i = 0; i < 8; ++i) {
    pool.post([&] {
      ScopedWait wait(pool);
      replied.wait();
      if (++done == 8) allDone.set_value();
    });
  }
  pool.post([&] { reply.set_value(); });
  ASSERT_EQ(allDone.get_future().wait_for(kDeadline), std::future_status::ready);
  const auto deadline = std::chrono::steady_clock::now() + kDeadline;
  while (pool.threadCount() > 1 && std::chrono::steady_clock::now() < deadline) {
    std::this_thread::yield();
  }
  EXPECT_EQ(pool.threadCount(), 1u);
}

TEST(Faults, AnExceptionThatNobodyCaughtLeavesItsCause) {
  EXPECT_DEATH(
      {
        reportUncaughtExceptions();
        std::thread([] { throw std::runtime_error("the cause"); }).join();
      },
      "the cause");
}

}  // namespace
}  // namespace skein
