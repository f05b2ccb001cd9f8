// Who waits for whom, and what files have in attributes.
#include <sys/file.h>
#include <sys/xattr.h>

#include <future>
#include <thread>

#include "linux/vald/files/DocumentHint.h"
#include "linux/vald/files/FileCoordinator.h"
#include "tests/protocol/Waiting.h"
#include "tests/vald_files/FilesFixture.h"

namespace skein::vald {
namespace {

using Clock = std::chrono::steady_clock;
const FileRequest kRequest{"a test", {}, {}};

TEST(Coordinator, OverlappingPathsFollowEachOtherInOrder) {
  FileCoordinator coordinator;
  const auto later = Clock::now() + std::chrono::minutes(1);
  const auto now = Clock::now();
  FileCoordinator::Claim held;
  FileCoordinator::Claim other;
  ASSERT_EQ(coordinator.claim({"/s/folder/a", "/s/b"}, later, held), nullptr);
  for (const char* path : {"/s/folder/a", "/s/folder", "/s", "/s/b/below"}) {
    const NSErrorPtr error = coordinator.claim({path}, now, other);
    EXPECT_EQ(codeOf(error), NSFileLockingError) << path;
  }
  for (const char* path : {"/s/folder/ab", "/s/folde", "/s/c"}) {
    EXPECT_EQ(coordinator.claim({path}, now, other), nullptr) << path;
  }
  other.release();

  // A waiter for the folder is served before those who asked after it.
  std::promise<void> served;
  std::thread waiter([&] {
    FileCoordinator::Claim own;
    EXPECT_EQ(coordinator.claim({"/s/folder"}, later, own), nullptr);
    served.set_value();
  });
  // It is in line once a name beside the held one is refused.
  EXPECT_TRUE(becomesTrue([&] {
    const bool isFree = coordinator.claim({"/s/folder/z"}, now, other) == nullptr;
    if (isFree) other.release();
    return !isFree;
  }));
  held.release();
  EXPECT_EQ(served.get_future().wait_for(std::chrono::seconds(30)), std::future_status::ready);
  waiter.join();
  EXPECT_EQ(coordinator.claim({"/s"}, now, other), nullptr);
  other.release();

  // Who waits behind one that gives up is served then, and not at its own deadline.
  ASSERT_EQ(coordinator.claim({"/s/folder/a"}, later, held), nullptr);
  std::thread impatient([&] {
    FileCoordinator::Claim own;
    EXPECT_NE(coordinator.claim({"/s"}, Clock::now() + std::chrono::seconds(1), own), nullptr);
  });
  EXPECT_TRUE(becomesTrue([&] {
    const bool isFree = coordinator.claim({"/s/z"}, now, other) == nullptr;
    if (isFree) other.release();
    return !isFree;
  }));
  EXPECT_EQ(coordinator.claim({"/s/z"}, later, other), nullptr);
  EXPECT_LT(Clock::now(), later - std::chrono::seconds(30));
  impatient.join();
}

TEST(Operations, OfManyThreadsOnOneTreeLoseNothing) {
  TestDrive drive;
  FileOperations& files = drive.open(std::chrono::minutes(1));
  constexpr int kThreads = 4;
  constexpr int kRounds = 30;
  drive.makeFolder("a");
  drive.makeFolder("b");
  for (int thread = 0; thread < kThreads; ++thread) {
    drive.write("a/f" + std::to_string(thread), std::to_string(thread));
  }
  std::vector<std::thread> threads;
  for (int thread = 0; thread < kThreads; ++thread) {
    threads.emplace_back([&, thread] {
      std::string path = drive.at("a/f" + std::to_string(thread));
      for (int round = 0; round < kRounds; ++round) {
        // All go to the same name, so they clash and bounce.
        FileResult result = round % 3 == 2 ? files.trash(path, kRequest)
                                           : files.move(path, drive.at(round % 2 ? "a" : "b"),
                                                        "same.txt", true, kRequest);
        ASSERT_EQ(result.error, nullptr) << wordsOf(result.error);
        path = result.path;
      }
      EXPECT_EQ(TestDrive::get(path), std::to_string(thread));
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_TRUE(files.journal().openEntries(nullptr).empty());
}

TEST(DocumentLock, HonoursOthersAndNamesTheHolder) {
  TestDrive drive;
  FileOperations& files = drive.open();
  drive.write("a", "a");
  {
    const int file = ::open(drive.at("a").c_str(), O_RDWR | O_CLOEXEC);
    ASSERT_EQ(::flock(file, LOCK_EX), 0);
    const NSErrorPtr error = files.rename(drive.at("a"), "b", kRequest).error;
    EXPECT_EQ(codeOf(error), NSFileLockingError);
    EXPECT_NE(wordsOf(error).find("process " + std::to_string(::getpid())), std::string::npos)
        << wordsOf(error);
    ASSERT_EQ(::flock(file, LOCK_UN), 0);
    struct flock range {};
    range.l_type = F_WRLCK;
    ASSERT_EQ(::fcntl(file, F_OFD_SETLK, &range), 0);
    EXPECT_EQ(codeOf(files.trash(drive.at("a"), kRequest).error), NSFileLockingError);
    ::close(file);
  }
  DirectoryHandle root;
  ASSERT_EQ(DirectoryHandle::openRoot(drive.store, root), 0);
  const int file = ::open(drive.at("a").c_str(), O_RDWR | O_CLOEXEC);
  {
    DocumentLock lock;
    ASSERT_EQ(lock.acquire(root, "a", "a", Clock::now()), nullptr);
    EXPECT_NE(::flock(file, LOCK_SH | LOCK_NB), 0);
  }
  EXPECT_EQ(::flock(file, LOCK_SH | LOCK_NB), 0);
  ::close(file);
  EXPECT_EQ(files.rename(drive.at("a"), "b", kRequest).path, drive.at("b"));
}

TEST(Tags, AreWhatFileManagersWriteAndStayWithTheDocument) {
  TestDrive drive;
  FileOperations& files = drive.open();
  drive.write("a", "a");
  drive.makeFolder("folder");
  const std::string path = drive.at("a");
  const std::string foreign = "Grün,,red,red";
  ASSERT_EQ(::setxattr(path.c_str(), kTagsAttribute, foreign.data(), foreign.size(), 0), 0);
  EXPECT_EQ(files.tags(path).names, (std::vector<std::string>{"Grün", "red"}));
  EXPECT_EQ(files.setTags(path, {"b", "a", "b"}).names, (std::vector<std::string>{"b", "a"}));
  char bytes[16] = {};
  ASSERT_EQ(::getxattr(path.c_str(), kTagsAttribute, bytes, sizeof(bytes)), 3);
  EXPECT_STREQ(bytes, "b,a");

  const std::string moved = files.move(path, drive.at("folder"), "c", false, kRequest).path;
  const std::string trashed = files.trash(moved, kRequest).path;
  EXPECT_EQ(files.tags(trashed).names, (std::vector<std::string>{"b", "a"}));

  for (const char* name : {"", "a,b", "a\nb", "\xFF"}) {
    EXPECT_EQ(codeOf(files.setTags(trashed, {name}).error), NSFileWriteInvalidFileNameError);
  }
  EXPECT_EQ(codeOf(files.setTags(trashed, {std::string(100'000, 'x')}).error),
            NSFileWriteOutOfSpaceError);
  EXPECT_EQ(files.tags(trashed).names.size(), 2u) << "a refused set changes nothing";
  EXPECT_EQ(files.setTags(trashed, {}).storage, TagStorage::Kept);
  EXPECT_EQ(::getxattr(trashed.c_str(), kTagsAttribute, bytes, sizeof(bytes)), -1);

  std::filesystem::create_symlink("folder", drive.at("link"));
  EXPECT_EQ(files.setTags(drive.at("link"), {"t"}).storage, TagStorage::Unsupported);
  EXPECT_EQ(codeOf(files.tags(drive.at("none")).error), 4);
}

TEST(Hints, AreReadOnlyAsTheyAreWritten) {
  const std::string text = DocumentHint{0x75bcd15, 12, 4294967295U}.asText();
  EXPECT_EQ(text, "1 00000000075bcd15 12 4294967295");
  ASSERT_TRUE(DocumentHint::parse(text));
  EXPECT_EQ(DocumentHint::parse(text)->asText(), text);
  for (const char* other :
       {"", "1", "2 00000000075bcd15 12 0", "1 75bcd15 12 0", "1 00000000075BCD15 12 0",
        "1 0x0000000075bcd1 12 0", "1 00000000075bcd15  12 0", "1 00000000075bcd15 +12 0",
        "1 00000000075bcd15 -1 0", "1 00000000075bcd15 99999999999999999999 0",
        "1 00000000075bcd15 12 4294967296", "1 00000000075bcd15 12 0 ",
        "1 0000000000000000 12 0"}) {
    EXPECT_FALSE(DocumentHint::parse(other)) << other;
  }
  EXPECT_FALSE(DocumentHint::parse(text + '\0'));
}

}  // namespace
}  // namespace skein::vald
