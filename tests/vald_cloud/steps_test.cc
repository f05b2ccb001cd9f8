// In which order what reaches the disk: a step, or a wait, that is left out loses documents
// only when the power fails, which no other test sees.
#include <fcntl.h>
#include <sys/stat.h>

#include <filesystem>
#include <functional>

#include "linux/vald/cloud/CloudRecovery.h"
#include "tests/vald_cloud/CloudRig.h"
#include "tests/vald_cloud/DiskWaits.h"

namespace skein::vald {
namespace {

namespace fs = std::filesystem;
using Steps = std::vector<std::string>;

const VLFileObjectID kDocument = documentNumber(3);
const std::string kWords = "words";

class StepsTest : public testing::Test {
 protected:
  // What changes names, and what waits for the disk: of what, below the rig's folder. "commit"
  // is a wait that the records asked for.
  Steps stepsOf(const std::function<void()>& operation) {
    Steps steps;
    std::uint64_t expected = diskWaits();
    const auto noteCommits = [&] {
      if (diskWaits() != expected) steps.emplace_back("commit");
      expected = diskWaits();
    };
    rig.files.before = [&](FileStep step, std::string_view name) {
      noteCommits();
      switch (step) {
        case FileStep::Sync:
          ++expected;  // it follows now
          steps.push_back("sync " + below(fs::read_symlink(name)));
          return;
        case FileStep::MakeFolder:
        case FileStep::CreateFile:
        case FileStep::Rename:
        case FileStep::Unlink:
        case FileStep::JournalBegin:
        case FileStep::JournalEnd:
          steps.push_back(std::string(fileStepName(step)) + ' ' + below(name));
          return;
        default: return;
      }
    };
    operation();
    noteCommits();
    rig.files.before = nullptr;
    return steps;
  }
  std::string below(const fs::path& path) const {
    const std::string text = path.string();
    const std::string beginning = fs::canonical(rig.top).string() + '/';
    return text.starts_with(beginning) ? text.substr(beginning.size()) : text;
  }
  void upload(const std::string& words = kWords) {
    rig.write("a", words);
    EXPECT_TRUE(std::holds_alternative<UploadDone>(rig.upload(kDocument, path)));
  }

  TemporaryFolder folder;
  CloudRig rig{fs::canonical(folder.path())};
  const std::string path = (rig.top / "drive/a").string();
};

TEST_F(StepsTest, ContentsAreOnTheDiskBeforeTheRecordSaysSo) {
  rig.write("a", kWords);
  const Steps steps = stepsOf([&] { upload(); });
  const std::string hash = (*rig.records->record(kDocument))->contents.hash.asString();
  const std::string shard = hash.substr(0, 2);
  EXPECT_EQ(steps,
            (Steps{"sync drive/a", "create file 0", "sync cloud/incoming/0", "make folder " + shard,
                   "sync cloud/objects", "rename 0", "sync cloud/objects/" + shard, "commit"}));
}

TEST_F(StepsTest, AnEvictionIsNotedThenItsMarkerAndOnlyThenTheFileGoes) {
  upload();
  EXPECT_EQ(stepsOf([&] { EXPECT_EQ(brief(rig.evict(kDocument, path)), "none"); }),
            (Steps{"journal begin drive/a", "commit", "create file .a.skein-new",
                   "sync drive/.a.skein-new", "rename .a.skein-new", "sync drive", "rename a",
                   "sync drive", "unlink .a.skein-old", "sync drive", "journal end drive/a"}));
}

TEST_F(StepsTest, ADownloadIsOnTheDiskBeforeItsMarkerGoes) {
  upload();
  ASSERT_EQ(brief(rig.evict(kDocument, path)), "none");
  EXPECT_EQ(stepsOf([&] { EXPECT_EQ(brief(rig.download(kDocument, path)), "none"); }),
            (Steps{"journal begin drive/a", "commit", "create file .a.skein-part",
                   "sync drive/.a.skein-part", "sync drive/.a.skein-part", "rename .a.skein-part",
                   "sync drive", "unlink .a.skein", "sync drive", "journal end drive/a"}));
}

TEST_F(StepsTest, TheKeyOfANewCloudIsOnTheDiskBeforeItSealsAnything) {
  EXPECT_EQ(stepsOf([&] { CloudContents::open((rig.top / "new").string(), rig.files); }),
            (Steps{"make folder objects", "make folder incoming", "create file key",
                   "sync new/incoming/key", "rename key", "sync new"}));
}

TEST_F(StepsTest, WhatIsRecoveredIsOnTheDiskBeforeItsNoteEnds) {
  rig.write(".a.skein-old", "late words");
  StorePlace place;
  ASSERT_EQ(brief(rig.roots.locate(path, place)), "none");
  ASSERT_TRUE(rig.places().beginWork(place, {}));
  EXPECT_EQ(stepsOf([&] { EXPECT_EQ(brief(recoverUnfinishedWork(rig.places())), "none"); }),
            (Steps{"rename .a.skein-old", "sync drive", "journal end drive/a"}));
}

TEST_F(StepsTest, WhatIsCollectedIsLetGoOfBeforeItGoes) {
  upload();
  const std::string hash = (*rig.records->record(kDocument))->contents.hash.asString();
  upload("other words");
  rig.clock.advance(std::chrono::hours(1));
  // The look itself is noted first.
  EXPECT_EQ(
      stepsOf([&] { EXPECT_EQ(rig.collect(std::chrono::nanoseconds(0), 0)->freed.files, 1u); }),
      (Steps{"commit", "journal begin collect", "commit", "unlink " + hash}));
}

TEST_F(StepsTest, WhatTheRecordsPromiseIsOnTheDiskWhenTheyAnswer) {
  upload();
  const HashedContents contents = (*rig.records->record(kDocument))->contents;
  const auto waits = [](const std::function<void()>& call) {
    const std::uint64_t before = diskWaits();
    call();
    return diskWaits() != before;
  };
  const auto works = [&](const NSErrorPtr& error) { EXPECT_EQ(brief(error), "none"); };
  CloudRecords::Work work;
  for (int round = 0; round < 2; ++round) {
    EXPECT_TRUE(waits([&] { work = *rig.records->beginWork({0, path, 1, contents.hash}); }));
    // Found again when a power cut loses it; what follows waits again.
    EXPECT_FALSE(waits([&] { works(rig.records->endWork(work)); }));
    EXPECT_TRUE(waits([&] { works(rig.records->setPinned(kDocument, true)); }));
    EXPECT_FALSE(waits([&] { works(rig.records->setStamp(kDocument, std::nullopt)); }));
    EXPECT_TRUE(waits([&] { works(rig.records->setKeeping({1, 2})); }));
    EXPECT_FALSE(waits([&] { works(rig.records->setThumbnail(kDocument, contents.hash, "/t")); }));
    const ContentHash unknown({static_cast<std::uint8_t>(round)});
    EXPECT_TRUE(waits([&] { works(rig.records->addUnknown({unknown, 1}, rig.clock.date())); }));
  }
  EXPECT_TRUE(waits([&] { works(rig.records->remove(kDocument)); }));
}

}  // namespace
}  // namespace skein::vald
