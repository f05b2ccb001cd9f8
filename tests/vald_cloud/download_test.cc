// Documents on their way down: progress, cancelling at any moment, failures, many at once.
#include <algorithm>

#include "base/ThreadPool.h"
#include "tests/support/ManualExecutor.h"
#include "tests/vald_cloud/CloudRig.h"

namespace skein::vald {
namespace {

using std::chrono::milliseconds;

constexpr std::size_t kSize = 1'000'000;

class DownloadTest : public testing::Test {
 protected:
  // A document that is in the cloud alone.
  std::string evicted(std::uint64_t number) {
    const std::string path =
        rig.write(std::to_string(number), std::string(kSize, static_cast<char>('a' + number)));
    EXPECT_TRUE(std::holds_alternative<UploadDone>(rig.upload(documentNumber(number), path)));
    EXPECT_EQ(brief(rig.evict(documentNumber(number), path)), "none");
    return path;
  }

  struct Answer {
    Event came;
    std::string error;
    int times = 0;
  };
  Downloader::Request request(std::uint64_t number, const std::string& path, Answer& answer,
                              DownloadTransfer::Progress progress = nullptr) {
    return {documentNumber(number), path, false, std::move(progress), [&answer](NSErrorPtr error) {
              answer.error = brief(error);
              ++answer.times;
              answer.came.set();
            }};
  }

  TemporaryFolder folder;
  CloudRig rig{folder.path()};
  std::shared_ptr<ThreadPool> threads = std::make_shared<ThreadPool>(4, "download");
};

TEST_F(DownloadTest, ProgressGrowsToTheWholeAndTheBandwidthIsKept) {
  const std::string path = evicted(1);
  rig.conditions.change([](auto& settings) {
    settings.bytesPerSecond = kSize;
    settings.delay = milliseconds(500);
  });
  Answer answer;
  std::vector<std::uint64_t> seen;
  Downloader downloader(rig.places(), rig.conditions, rig.clock, threads);
  downloader.download(request(1, path, answer, [&](std::uint64_t bytes, std::uint64_t total) {
    EXPECT_EQ(total, kSize);
    seen.push_back(bytes);
  }));
  ASSERT_TRUE(rig.clock.waitForTimer());
  EXPECT_EQ(rig.names(), (std::vector<std::string>{".1.skein", ".1.skein-part"}));
  rig.clock.advance(milliseconds(500));
  for (int tenth = 0; tenth < 10; ++tenth) {
    ASSERT_TRUE(rig.clock.waitForTimer());
    EXPECT_EQ(answer.times, 0);
    rig.clock.advance(milliseconds(100));
  }
  ASSERT_TRUE(answer.came.wait());
  EXPECT_EQ(answer.error, "none");
  EXPECT_TRUE(std::is_sorted(seen.begin(), seen.end()));
  EXPECT_EQ(seen.size(), 11u);
  EXPECT_EQ(seen.back(), kSize);
  EXPECT_EQ(contentsOf(path), std::string(kSize, 'b'));
}

TEST_F(DownloadTest, CancellingAnswersAtOnceAndLeavesNothing) {
  const std::string path = evicted(1);
  rig.conditions.change([](auto& settings) { settings.delay = std::chrono::hours(1); });
  auto downloader = std::make_unique<Downloader>(rig.places(), rig.conditions, rig.clock, threads);
  Answer cancelled;
  const auto ticket = downloader->download(request(1, path, cancelled));
  ASSERT_TRUE(rig.clock.waitForTimer());
  ticket->cancel();
  EXPECT_EQ(cancelled.error, "NSCocoaErrorDomain 3072");
  EXPECT_EQ(rig.names(), std::vector<std::string>{".1.skein"});
  ticket->cancel();
  EXPECT_EQ(cancelled.times, 1);
  rig.clock.advance(std::chrono::hours(2));

  // When the cancelled one has ended its note: until then what is there is taken for its own.
  downloader.reset();
  downloader = std::make_unique<Downloader>(rig.places(), rig.conditions, rig.clock, threads);
  // Somebody else's file where the part would be is not touched.
  const std::string other = rig.write(".1.skein-part", "somebody's own");
  Answer refused;
  downloader->download(request(1, path, refused));
  ASSERT_TRUE(refused.came.wait());
  EXPECT_EQ(refused.error, "NSCocoaErrorDomain 516");
  EXPECT_EQ(contentsOf(other), "somebody's own");
  std::filesystem::remove(other);

  // The downloader goes while it waits.
  Answer left;
  const auto late = downloader->download(request(1, path, left));
  ASSERT_TRUE(rig.clock.waitForTimer());
  downloader.reset();
  EXPECT_EQ(left.error, "NSCocoaErrorDomain 3072");
  late->cancel();
  EXPECT_EQ(left.times, 1);
  EXPECT_EQ(rig.names(), std::vector<std::string>{".1.skein"});
}

TEST_F(DownloadTest, CancelledAtEveryPieceItEitherCameOrDidNot) {
  const std::string path = evicted(1);
  const std::string marker = portraitOf((rig.top / "drive/.1.skein").string());
  for (std::uint64_t piece = 0;; ++piece) {
    Answer answer;
    std::shared_ptr<Downloader::Ticket> ticket;
    std::uint64_t pieces = 0;
    const auto executor = std::make_shared<ManualExecutor>();
    Downloader downloader(rig.places(), rig.conditions, rig.clock, executor);
    ticket = downloader.download(request(1, path, answer, [&](std::uint64_t, std::uint64_t) {
      if (pieces++ == piece) ticket->cancel();
    }));
    executor->runAll();
    EXPECT_EQ(answer.times, 1);
    if (pieces <= piece) {
      EXPECT_EQ(answer.error, "none");
      EXPECT_GT(piece, 3u);
      break;
    }
    EXPECT_EQ(answer.error, "NSCocoaErrorDomain 3072");
    EXPECT_EQ(rig.names(), std::vector<std::string>{".1.skein"});
    EXPECT_EQ(portraitOf((rig.top / "drive/.1.skein").string()), marker);
    EXPECT_TRUE(rig.records->unfinishedWork()->empty());
  }
  EXPECT_EQ(rig.names(), std::vector<std::string>{"1"});

  // Once it has its name it is there, whoever cancels then.
  ASSERT_EQ(brief(rig.evict(documentNumber(1), path)), "none");
  Answer answer;
  const auto executor = std::make_shared<ManualExecutor>();
  Downloader downloader(rig.places(), rig.conditions, rig.clock, executor);
  const auto ticket = downloader.download(request(1, path, answer));
  rig.files.before = [&](FileStep step, std::string_view) {
    if (step == FileStep::Unlink) ticket->cancel();
  };
  executor->runAll();
  rig.files.before = nullptr;
  EXPECT_EQ(answer.error, "none");
  EXPECT_EQ(answer.times, 1);
}

TEST_F(DownloadTest, ACloudThatFailsLeavesTheMarkerAlone) {
  const std::string path = evicted(1);
  using Settings = CloudConditions::Settings;
  const std::vector<std::pair<std::function<void(Settings&)>, std::string>> failures = {
      {[](Settings& settings) { settings.offline = true; }, "NSCocoaErrorDomain 4355"},
      {[](Settings& settings) { settings.corrupt = true; }, "NSCocoaErrorDomain 259"},
      {[](Settings& settings) { settings.failures = 1; }, "NSCocoaErrorDomain 4355"},
  };
  for (const auto& [change, expected] : failures) {
    rig.conditions.change(change);
    EXPECT_EQ(brief(rig.download(documentNumber(1), path)), expected);
    EXPECT_EQ(rig.names(), std::vector<std::string>{".1.skein"});
    rig.conditions.change([](Settings& settings) { settings = {}; });
  }
  // Another marker takes the place of the one that it began with.
  const auto marker = rig.top / "drive/.1.skein";
  DownloadTransfer replaced(rig.places(), rig.conditions, rig.clock, documentNumber(1), path, false,
                            [&](std::uint64_t bytes, std::uint64_t) {
                              if (bytes != kSize) return;
                              std::filesystem::copy_file(marker, rig.top / "drive/new");
                              std::filesystem::rename(rig.top / "drive/new", marker);
                            });
  EXPECT_EQ(brief(replaced.run()), "NSCocoaErrorDomain 4");
  EXPECT_EQ(rig.names(), std::vector<std::string>{".1.skein"});
  // Removed, or moved, while it comes.
  DownloadTransfer transfer(rig.places(), rig.conditions, rig.clock, documentNumber(1), path, false,
                            [&](std::uint64_t bytes, std::uint64_t) {
                              if (bytes == kSize) {
                                std::filesystem::rename(rig.top / "drive/.1.skein",
                                                        rig.top / "drive/.2.skein");
                              }
                            });
  EXPECT_EQ(brief(transfer.run()), "NSCocoaErrorDomain 4");
  EXPECT_EQ(rig.names(), std::vector<std::string>{".2.skein"});
  // It is the document still, under the other name.
  const std::string moved = (rig.top / "drive/2").string();
  EXPECT_EQ(brief(rig.download(documentNumber(1), moved)), "none");
  EXPECT_EQ(contentsOf(moved), std::string(kSize, 'b'));
}

TEST_F(DownloadTest, WhoAsksForTheSameDocumentIsAnsweredByTheSameDownload) {
  const std::string path = evicted(1);
  const auto executor = std::make_shared<ManualExecutor>();
  Downloader downloader(rig.places(), rig.conditions, rig.clock, executor);
  Answer first;
  Answer second;
  Answer third;
  std::uint64_t came = 0;
  downloader.download(request(1, path, first));
  const auto ticket = downloader.download(request(1, path, second));
  downloader.download(
      request(1, path, third, [&](std::uint64_t bytes, std::uint64_t) { came = bytes; }));
  EXPECT_EQ(executor->pending(), 1u);
  ticket->cancel();
  EXPECT_EQ(second.error, "NSCocoaErrorDomain 3072");
  executor->runAll();
  EXPECT_EQ(first.error, "none");
  EXPECT_EQ(third.error, "none");
  EXPECT_EQ(second.times, 1);
  EXPECT_EQ(came, kSize);

  // A marker that was copied is another one's download.
  ASSERT_EQ(brief(rig.evict(documentNumber(1), path)), "none");
  std::filesystem::copy_file(rig.top / "drive/.1.skein", rig.top / "drive/.2.skein");
  Answer one;
  Answer copy;
  downloader.download(request(1, path, one));
  Downloader::Request ofCopy = request(1, (rig.top / "drive/2").string(), copy);
  ofCopy.isCopy = true;
  downloader.download(std::move(ofCopy));
  executor->runAll();
  EXPECT_EQ(rig.names(), (std::vector<std::string>{"1", "2"}));
}

TEST_F(DownloadTest, NoMoreThanTheLimitAtATimeAndTheOthersInTheirTurn) {
  constexpr int kDocuments = 7;
  std::vector<std::string> paths;
  for (int number = 0; number < kDocuments; ++number) paths.push_back(evicted(number));

  Mutex mutex;
  int running = 0;
  int most = 0;
  Event full;
  Event go;
  std::vector<std::unique_ptr<Answer>> answers;
  Downloader downloader(rig.places(), rig.conditions, rig.clock,
                        std::make_shared<ThreadPool>(kDocuments, "download"), 3);
  for (int number = 0; number < kDocuments; ++number) {
    answers.push_back(std::make_unique<Answer>());
    downloader.download(
        request(number, paths[number], *answers.back(), [&](std::uint64_t bytes, std::uint64_t) {
          MutexLock lock(mutex);
          if (bytes == kSize) --running;
          if (bytes != 0) return;
          most = std::max(most, ++running);
          if (running == 3) full.set();
          lock.unlock();
          EXPECT_TRUE(go.wait());
        }));
  }
  EXPECT_TRUE(full.wait());
  go.set();
  for (int number = 0; number < kDocuments; ++number) {
    ASSERT_TRUE(answers[number]->came.wait());
    EXPECT_EQ(answers[number]->error, "none");
    EXPECT_EQ(contentsOf(paths[number]), std::string(kSize, static_cast<char>('a' + number)));
  }
  EXPECT_EQ(most, 3);
}

}  // namespace
}  // namespace skein::vald
