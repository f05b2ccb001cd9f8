// What the cloud lets go of, and what it never does.
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <fstream>
#include <thread>

#include "tests/vald_cloud/CloudRig.h"

namespace skein::vald {
namespace {

using namespace std::chrono_literals;
namespace fs = std::filesystem;

constexpr auto kTime = 24h * 30;
constexpr std::uint64_t kRoom = 1'000'000;
const VLFileObjectID kDocument = documentNumber(3);

class CollectorTest : public testing::Test {
 protected:
  ContentHash upload(const std::string& name, const std::string& words,
                     VLFileObjectID document = kDocument) {
    EXPECT_TRUE(std::holds_alternative<UploadDone>(rig.upload(document, rig.write(name, words))));
    return (*rig.records->record(document))->contents.hash;
  }
  // Uploaded, evicted; its marker is gone from the drive, and the document forgotten.
  ContentHash lose(const std::string& name, const std::string& words) {
    const ContentHash hash = upload(name, words);
    EXPECT_EQ(brief(rig.evict(kDocument, path(name))), "none");
    fs::rename(path("." + name + ".skein"), elsewhere());
    EXPECT_EQ(brief(rig.records->remove(kDocument)), "none");
    return hash;
  }
  std::string path(const std::string& name) const { return (rig.top / "drive" / name).string(); }
  fs::path elsewhere() const { return rig.top / "away"; }
  // How many went.
  std::uint64_t collect(std::chrono::nanoseconds time = kTime, std::uint64_t bytes = kRoom) {
    const auto result = rig.collect(time, bytes);
    EXPECT_EQ(brief(result.error()), "none");
    return result ? result->freed.files : ~0ULL;
  }

  TemporaryFolder folder;
  CloudRig rig{folder.path()};
};

TEST_F(CollectorTest, RevisionsAndRemovedDocumentsGoWithTimeOrTheOldestForRoom) {
  const ContentHash first = upload("a", "one");
  rig.clock.advance(1h);
  const ContentHash second = upload("a", "two2");
  rig.clock.advance(1h);
  const ContentHash third = upload("a", "three");
  EXPECT_EQ(rig.records->kept()->bytes, 7u);

  EXPECT_EQ(collect(kTime, 7), 0u);
  EXPECT_EQ(collect(kTime, 6), 1u);  // the oldest, and no more than is needed
  EXPECT_FALSE(rig.hasObject(first));
  EXPECT_TRUE(rig.hasObject(second));
  // What comes back into use is no garbage any more.
  upload("a", "two2");
  rig.clock.advance(kTime);
  EXPECT_TRUE(rig.hasObject(third));
  EXPECT_EQ(collect(), 1u);
  EXPECT_FALSE(rig.hasObject(third));
  EXPECT_TRUE(rig.hasObject(second));

  ASSERT_EQ(brief(rig.records->remove(kDocument)), "none");
  const auto freed = rig.collect(0s, kRoom);
  ASSERT_TRUE(freed);
  EXPECT_EQ(freed->freed.bytes, 4u);
  EXPECT_EQ(freed->kept.files, 0u);
  EXPECT_EQ(rig.records->kept()->files, 0u);
}

TEST_F(CollectorTest, TheOnlyCopyStaysForTheWholeTimeAndIsNeverMissedByOneLook) {
  const ContentHash hash = lose("a", "words");
  EXPECT_EQ(collect(kTime, 0), 0u);  // not for its room
  EXPECT_EQ(rig.records->kept()->givenUpBytes, 5u);
  rig.clock.advance(kTime - 1h);
  // Back for a moment: the time begins anew, and the looks before do not count.
  fs::rename(elsewhere(), path(".a.skein"));
  EXPECT_EQ(collect(kTime, 0), 0u);
  fs::rename(path(".a.skein"), elsewhere());
  rig.clock.advance(kTime);
  EXPECT_EQ(collect(kTime, 0), 0u);  // the first look that misses it
  rig.clock.advance(CloudCollector::kMargin / 2);
  EXPECT_EQ(collect(kTime, 0), 0u);
  EXPECT_TRUE(rig.hasObject(hash));
  rig.clock.advance(CloudCollector::kMargin);
  EXPECT_EQ(collect(kTime, 0), 1u);
  EXPECT_FALSE(rig.hasObject(hash));
}

TEST_F(CollectorTest, WhatAMarkerNamesStaysWhereverItLies) {
  const ContentHash hash = lose("a", "words");
  ASSERT_TRUE(fs::create_directories(path(".Trash-1000/files/deep")));
  fs::rename(elsewhere(), path(".Trash-1000/files/deep/.b.skein"));
  for (int look = 0; look < 3; ++look) {
    rig.clock.advance(kTime);
    EXPECT_EQ(collect(0s, 0), 0u);
  }
  // It was uploaded and evicted by name of another document, whose record is gone, too.
  EXPECT_EQ(brief(rig.download(kDocument, path(".Trash-1000/files/deep/b"))), "none");
  EXPECT_EQ(contentsOf(path(".Trash-1000/files/deep/b")), "words");
  EXPECT_TRUE(rig.hasObject(hash));
}

TEST_F(CollectorTest, WhatAMarkerInTheDesktopsTrashNamesStays) {
  const ContentHash hash = lose("a", "words");
  rig.trashes = {(rig.top / "Trash").string(), (rig.top / "none").string()};
  ASSERT_TRUE(fs::create_directories(rig.top / "Trash/files"));
  fs::rename(elsewhere(), rig.top / "Trash/files/.a.skein");
  for (int look = 0; look < 3; ++look) {
    rig.clock.advance(kTime);
    EXPECT_EQ(collect(0s, 0), 0u);
  }
  EXPECT_TRUE(rig.hasObject(hash));
  fs::remove_all(rig.top / "Trash");
  EXPECT_EQ(collect(0s, 0), 0u);
  rig.clock.advance(CloudCollector::kMargin);
  EXPECT_EQ(collect(0s, 0), 1u);
}

TEST_F(CollectorTest, WhereSomethingCannotBeReadNothingIsCollected) {
  upload("a", "one");
  upload("a", "two");
  ASSERT_TRUE(fs::create_directory(path("closed")));
  ASSERT_EQ(chmod(path("closed").c_str(), 0), 0);
  const pid_t child = fork();
  if (child == 0) {
    // Who may read everything sees no closed folder.
    if (geteuid() == 0 && (setgid(65534) != 0 || setuid(65534) != 0)) _exit(3);
    const auto result = rig.collect(0s, 0);
    _exit(!result && result.error()->localizedDescription().find("closed") != std::string::npos
              ? 0
              : 1);
  }
  int status = 0;
  ASSERT_EQ(waitpid(child, &status, 0), child);
  EXPECT_EQ(WEXITSTATUS(status), 0);
  ASSERT_EQ(chmod(path("closed").c_str(), 0700), 0);
  EXPECT_EQ(collect(0s, 0), 1u);
}

TEST_F(CollectorTest, WhatIsOlderThanTheRecordsCountsAsTheOnlyCopy) {
  const ContentHash lost = upload("a", "words");
  rig.records.reset();
  fs::remove(rig.top / "cloud/records");
  CloudRig again(folder.path());
  EXPECT_EQ(again.records->kept()->givenUpBytes, 5u);
  // Also when it is uploaded again, and removed.
  ASSERT_TRUE(std::holds_alternative<UploadDone>(again.upload(kDocument, path("a"))));
  EXPECT_EQ(again.records->kept()->files, 0u);
  ASSERT_EQ(brief(again.records->remove(kDocument)), "none");
  again.clock.advance(1h);
  EXPECT_EQ(again.collect(0s, 0)->freed.files, 0u);
  EXPECT_TRUE(again.hasObject(lost));
  // So does what a crash left behind.
  const std::string digits(64, 'a');
  fs::create_directories(again.top / "cloud/objects/aa");
  std::ofstream(again.top / "cloud/objects/aa" / digits) << "left";
  EXPECT_EQ(again.collect(0s, 0)->freed.files, 0u);
  EXPECT_EQ(again.records->kept()->givenUpBytes, 9u);
}

TEST_F(CollectorTest, WhatIsBeingUploadedOrDownloadedWaitsOrIsWaitedFor) {
  const ContentHash hash = upload("a", "one");
  upload("a", "two");
  rig.clock.advance(1h);
  {
    const auto hold = rig.contents->hold({hash, 3});
    ASSERT_TRUE(hold);
    EXPECT_EQ(collect(0s, 0), 0u);
  }
  // Whoever comes while they go finds them gone, and brings them again.
  std::thread other;
  Event begun;
  rig.files.before = [&](FileStep step, std::string_view) {
    if (step != FileStep::Unlink || other.joinable()) return;
    other = std::thread([&] {
      begun.set();
      upload("b", "one", documentNumber(4));
    });
    EXPECT_TRUE(begun.wait());
  };
  EXPECT_EQ(collect(0s, 0), 1u);
  other.join();
  rig.files.before = nullptr;
  EXPECT_TRUE(rig.hasObject(hash));
  rig.clock.advance(1h);
  EXPECT_EQ(collect(0s, 0), 0u);
}

TEST_F(CollectorTest, KilledAtEachStepNothingThatIsNamedIsLost) {
  std::uint64_t step = 1;
  for (bool done = false; !done; ++step) {
    ASSERT_LT(step, 50u);
    SCOPED_TRACE("step " + std::to_string(step));
    const TemporaryFolder own;
    const pid_t child = fork();
    if (child == 0) {
      CloudRig crashing(own.path());
      for (const char* words : {"one", "two", "three", "four"}) {
        crashing.upload(kDocument, crashing.write("a", words));
      }
      crashing.clock.advance(1h);
      crashing.files.crashAt(step);
      const auto result = crashing.collect(0s, 0);
      _exit(result && result->freed.files == 3 ? 0 : 1);
    }
    int status = 0;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    done = WEXITSTATUS(status) == 0;
    ASSERT_TRUE(done || WEXITSTATUS(status) == FaultyFileLayer::kCrashStatus);
    CloudRig after(own.path());
    const auto record = *after.records->record(kDocument);
    ASSERT_TRUE(record);
    EXPECT_TRUE(after.hasObject(record->contents.hash));
    // What was let go of and stayed is found again, and goes in the end.
    for (int look = 0; look < 3; ++look) {
      after.clock.advance(2h);
      EXPECT_TRUE(after.collect(0s, 0));
    }
    EXPECT_EQ(after.records->kept()->files, 0u);
    std::size_t objects = 0;
    for (const auto& entry : fs::recursive_directory_iterator(own.path() / "cloud/objects")) {
      objects += entry.is_regular_file() ? 1 : 0;
    }
    EXPECT_EQ(objects, 1u);
  }
  EXPECT_GT(step, 4u);
}

}  // namespace
}  // namespace skein::vald
