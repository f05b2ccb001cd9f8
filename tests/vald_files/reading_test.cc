// What the disk refuses to tell is never taken for what is not there.
#include "tests/vald_files/FilesFixture.h"
#include "tests/vald_files/ReadingFaults.h"

namespace skein::vald {
namespace {

const FileRequest kPlain{"a test", {}, {}};

TEST(Reading, ThatFailsEndsACopyWhichLeavesNothing) {
  const struct {
    ReadingCall call;
    const char* part;
    int error;
    int spared;
  } faults[] = {
      {ReadingCall::Fstatat, "/tree/sub/two", EIO, 0},    // while it is measured
      {ReadingCall::Fstatat, "/tree/sub/two", EIO, 1},    // while it is copied
      {ReadingCall::Readdir, "/tree/sub", EIO, 2},        // in the middle of a folder
      {ReadingCall::CopyFileRange, "/tree/one", EIO, 1},  // in the middle of a file
      {ReadingCall::Pread, "/tree/one", EIO, 2},
  };
  for (const bool isMove : {false, true}) {
    for (const auto& fault : faults) {
      SCOPED_TRACE(std::string(isMove ? "move" : "import") + " fault " +
                   std::to_string(static_cast<int>(fault.call)) + " at " + fault.part);
      if (isMove && TestDrive::otherVolume().empty()) continue;
      TestDrive drive;
      FileOperations& files = drive.open();
      const std::string source = isMove ? drive.at("tree") : drive.outside + "/tree";
      TestDrive::put(source + "/one", std::string(40'000'000, '1'));
      TestDrive::put(source + "/sub/two", "two");
      TestDrive::put(source + "/sub/three", "three");
      const auto before = drive.snapshot(true);
      // Only reading is left where the system cannot copy by itself.
      std::optional<ReadingFault> readsOnly;
      if (fault.call == ReadingCall::Pread) {
        readsOnly.emplace(ReadingCall::CopyFileRange, "/tree/one", ENOSYS);
      }
      FileResult result;
      int met = 0;
      {
        const ReadingFault planned(fault.call, fault.part, fault.error, fault.spared);
        result = isMove ? files.move(source, drive.container, {}, false, kPlain)
                        : files.importDocument(source, drive.store, {}, kPlain);
        met = planned.met();
      }
      // Between volumes the system does not copy by itself.
      if (met == 0 && isMove && fault.call == ReadingCall::CopyFileRange) continue;
      EXPECT_GT(met, 0);
      EXPECT_EQ(posixOf(result.error), EIO);
      EXPECT_EQ(drive.snapshot(true), before);
      EXPECT_TRUE(std::filesystem::is_empty(drive.state + "/staging"));
    }
  }
}

TEST(Reading, WritesThatTakeLittleLoseNothing) {
  TestDrive drive;
  FileOperations& files = drive.open();
  std::string bytes;
  for (int number = 0; number < 5000; ++number) bytes += std::to_string(number) + ' ';
  TestDrive::put(drive.outside + "/doc", bytes);
  const ReadingFault readsOnly(ReadingCall::CopyFileRange, "/doc", ENOSYS);
  const ReadingFault littleAtOnce(ReadingCall::Write, ".skein-import-", 1000);
  ASSERT_EQ(wordsOf(files.importDocument(drive.outside + "/doc", drive.store, {}, kPlain).error),
            "");
  EXPECT_GT(littleAtOnce.met(), 5);
  EXPECT_EQ(TestDrive::get(drive.at("doc")), bytes);
}

}  // namespace
}  // namespace skein::vald
