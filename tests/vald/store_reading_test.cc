// What the disk refuses to tell is never taken for what is not there.
#include <fcntl.h>

#include "linux/vald/scan/FolderReader.h"
#include "tests/vald/StoreFixture.h"
#include "tests/vald_files/ReadingFaults.h"

namespace skein::vald {
namespace {

class StoreReading : public StoreFixture {};

TEST_F(StoreReading, AFolderThatIsReadInPartIsNotRead) {
  makeFolder("folder");
  // More than one call of the system gives at once.
  for (int number = 0; number < 2000; ++number) {
    write("folder/" + std::to_string(number) + std::string(50, 'n'));
  }
  const FileDescriptor folder(::open(at("folder").c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  const auto isWhole = [&] {
    ::lseek(folder.get(), 0, SEEK_SET);
    const FolderSnapshot snapshot = readFolder(folder.get(), Detail::Full);
    EXPECT_EQ(snapshot.entries.size(), snapshot.look == Look::Seen ? 2000U : 0U);
    return snapshot.look == Look::Seen;
  };
  EXPECT_TRUE(isWhole());
  for (const int spared : {0, 1}) {
    const ReadingFault fault(ReadingCall::Getdents, "/folder", EIO, spared);
    EXPECT_FALSE(isWhole());
  }
  {
    const ReadingFault fault(ReadingCall::Statx, "/folder/77", EIO);
    EXPECT_FALSE(isWhole());
    FileState state;
    int error = 0;
    const std::string name = "77" + std::string(50, 'n');
    EXPECT_EQ(readEntry(folder.get(), name, state, error), Look::Unreadable);
    EXPECT_EQ(error, EIO);
  }
  EXPECT_TRUE(isWhole());
}

}  // namespace
}  // namespace skein::vald
