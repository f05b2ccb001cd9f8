// A batch of thumbnails between the extension and whoever takes it out.
#include <gtest/gtest.h>

#include <atomic>
#include <future>
#include <thread>

#include "base/ThreadPool.h"
#include "linux/host/ThumbnailStream.h"
#include "tests/host/HostFixture.h"
#include "tests/protocol/Waiting.h"

namespace skein {
namespace {

struct Thumbnails : HostTest {
  // What was handed out since the last time: "INDEX kind DATA", then how far it is.
  Words take() {
    stream->next([this](const HostThumbnailStep& step, const NSErrorPtr& error) {
      for (const HostThumbnail& one : step.thumbnails) {
        words.push_back(std::to_string(one.index) + " " + kNames[static_cast<int>(one.kind)] +
                        (one.data ? " " + std::string(one.data->view().substr(0, 8)) : "") +
                        (one.error ? " " + std::to_string(one.error->code()) : ""));
      }
      words.push_back(std::to_string(step.done) + "/" + std::to_string(step.total) +
                      (step.finished ? " end" : "") + (error ? " with error" : ""));
    });
    run();
    return std::exchange(words, {});
  }
  void come(const std::string& identifier, std::optional<NSData> data, NSErrorPtr error = nullptr) {
    stream->thumbnailDidCome(identifier, std::move(data), std::nullopt, std::move(error));
  }

  static constexpr const char* kNames[] = {"thumbnail", "icon", "none", "missing", "error"};
  const std::shared_ptr<ThumbnailStream> stream =
      std::make_shared<ThumbnailStream>(HostTools{executor, timers}, 5);
  const std::string folder = "i0000000000000007";
  Words words;
};

TEST_F(Thumbnails, EachTargetIsToldOfOnceWhateverTheExtensionCalls) {
  stream->fail(0, expired());
  // One is named twice, one will be left out.
  stream->expect({{idOf(1), 1}, {folder, 2}, {idOf(1), 3}, {idOf(4), 4}});
  EXPECT_EQ(take(), (Words{"0 error -1002", "1/5"}));
  come(idOf(1), NSData("picture"));
  come(idOf(1), NSData("again"));
  come(folder, NSData("icon"));
  come("stranger", std::nullopt);
  EXPECT_EQ(take(), (Words{"1 thumbnail picture", "3 thumbnail picture", "2 icon icon", "4/5"}));
  EXPECT_EQ(take(), Words{});
  stream->batchDidEnd(nullptr);
  run();
  EXPECT_EQ(words, (Words{"4 missing", "5/5 end"}));
  words.clear();
  EXPECT_EQ(take(), Words{"5/5 end"});
}

TEST_F(Thumbnails, WhatIsLeftOutOfAFailedBatchFailsWithIt) {
  stream->expect({{idOf(1), 0}, {folder, 1}});
  come(folder, std::nullopt);
  stream->batchDidEnd(expired());
  run();
  EXPECT_EQ(take(), (Words{"1 none", "0 error -1002", "2/5 end with error"}));
}

TEST(ThumbnailsOfThreads, WhoBringsMoreThanFitsWaitsUntilItIsTakenOrNotWanted) {
  const auto pool = std::make_shared<ThreadPool>(1, "thumbnails");
  const auto stream = std::make_shared<ThumbnailStream>(HostTools{pool, nullptr}, 5);
  stream->expect({{idOf(1), 1}, {idOf(2), 2}, {idOf(3), 3}, {idOf(4), 4}, {idOf(5), 5}});
  const NSData large(std::string(5 << 20, 'p'));
  std::atomic<std::size_t> brought{0};
  std::thread bringer([&] {
    for (std::uint64_t number = 1; number <= 5; ++number) {
      stream->thumbnailDidCome(idOf(number), large, std::nullopt, nullptr);
      ++brought;
    }
  });
  for (std::size_t taken = 0; taken < 2;) {
    const auto came = std::make_shared<std::promise<std::size_t>>();
    stream->next([came](const HostThumbnailStep& step, const NSErrorPtr&) {
      came->set_value(step.thumbnails.size());
    });
    auto count = came->get_future();
    if (count.wait_until(testDeadline()) != std::future_status::ready) {
      ADD_FAILURE() << "nothing came after " << taken;
      break;
    }
    taken += count.get();
    // There is no room for two of them.
    EXPECT_LE(brought, taken + 1);
  }
  stream->letGo();
  bringer.join();
  EXPECT_EQ(brought, 5U);
}

// The extension calls once for each time that a folder is named, and the first call tells of
// all of them: nobody takes the pictures of the others, so they must not fill the room.
TEST(ThumbnailsOfThreads, APictureThatWasToldOfTakesNoRoom) {
  const auto pool = std::make_shared<ThreadPool>(1, "thumbnails");
  const auto stream = std::make_shared<ThumbnailStream>(HostTools{pool, nullptr}, 6);
  const std::string folder = "i0000000000000007";
  stream->expect({{folder, 0}, {folder, 1}, {folder, 2}, {idOf(1), 3}, {idOf(2), 4}, {idOf(3), 5}});
  const NSData large(std::string(3 << 20, 'p'));
  std::thread bringer([&] {
    for (int call = 0; call < 3; ++call) {
      stream->thumbnailDidCome(folder, large, std::nullopt, nullptr);
    }
    for (std::uint64_t number = 1; number <= 3; ++number) {
      stream->thumbnailDidCome(idOf(number), large, std::nullopt, nullptr);
    }
    stream->batchDidEnd(nullptr);
  });
  std::size_t taken = 0;
  for (bool isOver = false; !isOver;) {
    const auto came = std::make_shared<std::promise<HostThumbnailStep>>();
    stream->next(
        [came](HostThumbnailStep step, const NSErrorPtr&) { came->set_value(std::move(step)); });
    auto next = came->get_future();
    if (next.wait_until(testDeadline()) != std::future_status::ready) {
      ADD_FAILURE() << "nothing came after " << taken;
      break;
    }
    const HostThumbnailStep step = next.get();
    taken += step.thumbnails.size();
    isOver = step.finished;
  }
  stream->letGo();
  bringer.join();
  EXPECT_EQ(taken, 6U);
}

TEST_F(Thumbnails, LettingGoCancelsTheBatchAlsoBeforeItHasBegun) {
  const auto progress = NSProgress::progressWithTotalUnitCount(0);
  int cancellations = 0;
  progress->setCancellationHandler([&] { ++cancellations; });
  stream->setProgress(progress);
  EXPECT_EQ(cancellations, 0);
  stream->letGo();
  EXPECT_EQ(cancellations, 1);

  const auto late = std::make_shared<ThumbnailStream>(HostTools{executor, timers}, 1);
  late->letGo();
  const auto second = NSProgress::progressWithTotalUnitCount(0);
  late->setProgress(second);
  EXPECT_TRUE(second->isCancelled());
}

}  // namespace
}  // namespace skein
