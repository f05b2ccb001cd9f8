// Moving between volumes: what is kept, what is refused, and what is left when it comes to nothing.
#include <sys/xattr.h>

#include "linux/vald/files/DocumentHint.h"
#include "linux/vald/files/FileKey.h"
#include "tests/vald_files/FilesFixture.h"

namespace skein::vald {
namespace {

const FileRequest kPlain{"a test", {}, {}};

class Across : public testing::Test {
 protected:
  void SetUp() override {
    if (TestDrive::otherVolume().empty()) GTEST_SKIP() << "no second volume";
    drive.write("folder/sub/deep", "deep");
    drive.write("folder/one", std::string(3'000'000, 'x'));
    drive.write("a", "words");
    files = &drive.open();
  }
  FileResult move(const std::string& what, const FileRequest& request = kPlain) {
    return files->move(drive.at(what), drive.container, {}, false, request);
  }
  std::string there(const std::string& name) const { return drive.container + '/' + name; }
  // As it was, with nothing left over anywhere.
  void expectUntouched(const std::map<std::string, std::string>& before) {
    EXPECT_EQ(drive.snapshot(true), before);
    EXPECT_TRUE(std::filesystem::is_empty(drive.state + "/staging"));
    EXPECT_TRUE(files->journal().openEntries(nullptr).empty());
  }
  static struct stat statusOf(const std::string& path) {
    struct stat status {};
    EXPECT_EQ(::lstat(path.c_str(), &status), 0) << path;
    return status;
  }

  TestDrive drive;
  FileOperations* files = nullptr;
};

TEST_F(Across, AMoveKeepsWhatIsKnownOfEachFile) {
  const timespec times[2] = {{5, 0}, {1'000'000, 42}};
  drive.tag("folder/one", {"red", "blue"});
  ASSERT_EQ(::setxattr(drive.at("folder/sub/deep").c_str(), "user.other", "v", 1, 0), 0);
  ASSERT_EQ(::setxattr(drive.at("folder").c_str(), "user.skein.shareable", "no", 2, 0), 0);
  ASSERT_TRUE(files->writeHint(drive.at("folder/one"), 77));
  ASSERT_EQ(::symlink("one", drive.at("folder/link").c_str()), 0);
  ASSERT_EQ(::truncate(drive.at("folder/one").c_str(), 100'000'000), 0);
  ASSERT_EQ(::chmod(drive.at("folder/one").c_str(), 0640), 0);
  ASSERT_EQ(::chmod(drive.at("folder/sub").c_str(), 03750), 0);
  for (const char* name : {"folder/one", "folder/sub", "folder"}) {
    ASSERT_EQ(::utimensat(AT_FDCWD, drive.at(name).c_str(), times, 0), 0);
  }
  FileProgress last;
  FileRequest request = kPlain;
  request.progress = [&](const FileProgress& progress) {
    if (progress.totalItems > 0) last = progress;
    return true;
  };
  std::vector<std::string> told;
  request.leaves = [&](const std::string& path) {
    told.push_back(path);
    EXPECT_TRUE(drive.exists("folder"));
  };
  request.moved = [&](const std::string& path, bool isCopy) {
    told.push_back(path);
    EXPECT_TRUE(isCopy);
    EXPECT_FALSE(drive.exists("folder"));
    EXPECT_EQ(TestDrive::get(path + "/sub/deep"), "deep");
  };
  const FileResult result = move("folder", request);
  ASSERT_EQ(wordsOf(result.error), "");
  EXPECT_EQ(result.path, there("folder"));
  EXPECT_EQ(told, (std::vector<std::string>{there("folder"), there("folder")}));
  EXPECT_EQ(last.doneItems, 5u);
  EXPECT_GE(last.doneBytes, 3'000'000u);  // holes are not copied
  EXPECT_EQ(TestDrive::get(there("folder/sub/deep")), "deep");
  const struct stat one = statusOf(there("folder/one"));
  EXPECT_EQ(one.st_mode & 07777, 0640u);
  EXPECT_LT(one.st_blocks * 512, 50'000'000) << "holes stay holes";
  EXPECT_EQ(statusOf(there("folder/sub")).st_mode & 07777, 03750u);
  for (const char* name : {"folder/one", "folder/sub", "folder"}) {
    EXPECT_EQ(statusOf(there(name)).st_mtim.tv_sec, 1'000'000) << name;
    EXPECT_EQ(statusOf(there(name)).st_mtim.tv_nsec, 42) << name;
  }
  EXPECT_EQ(files->tags(there("folder/one")).names, (std::vector<std::string>{"red", "blue"}));
  EXPECT_EQ(std::filesystem::read_symlink(there("folder/link")), "one");
  const auto attribute = [&](const std::string& path, const char* name) {
    char value[128];
    const ssize_t size = ::getxattr(path.c_str(), name, value, sizeof value);
    return size < 0 ? std::string("none") : std::string(value, static_cast<std::size_t>(size));
  };
  EXPECT_EQ(attribute(there("folder/sub/deep"), "user.other"), "v");
  EXPECT_EQ(attribute(there("folder"), "user.skein.shareable"), "no");
  // It says of itself which document it is; a copy says it of another file.
  FileKey key;
  ASSERT_EQ(readFileKey(AT_FDCWD, there("folder/one"), key), 0);
  const auto hint = DocumentHint::parse(attribute(there("folder/one"), kHintAttribute));
  ASSERT_TRUE(hint);
  EXPECT_EQ(hint->document, 77u);
  EXPECT_EQ(hint->inode, key.inode);
}

TEST_F(Across, WhatComesToNothingLeavesNothing) {
  drive.write("set-id", "program");
  ASSERT_EQ(::chmod(drive.at("set-id").c_str(), 04755), 0);
  TestDrive::put(there("taken"), "other");
  drive.write("taken", "own");
  const auto before = drive.snapshot(true);
  const auto cancelledAfter = [&](int calls) {
    FileRequest request = kPlain;
    request.progress = [calls](const FileProgress&) mutable { return calls-- > 0; };
    return request;
  };
  // At whatever point it is asked whether to go on, until it is told that it is moved.
  bool isMoved = false;
  for (int calls = 0; !isMoved && calls < 100; ++calls) {
    SCOPED_TRACE(calls);
    const FileResult result = move("folder", cancelledAfter(calls));
    isMoved = !result.error;
    if (isMoved) {
      EXPECT_GT(calls, 6);
      ASSERT_EQ(wordsOf(files->move(there("folder"), drive.store, {}, false, kPlain).error), "");
    } else {
      EXPECT_EQ(codeOf(result.error), NSUserCancelledError);
    }
    expectUntouched(before);
  }
  EXPECT_TRUE(isMoved);

  EXPECT_NE(wordsOf(move("set-id").error).find("permissions can't be kept"), std::string::npos);
  EXPECT_EQ(urlOf(move("taken").error), there("taken"));
  expectUntouched(before);

  // Saved between the copy and the move, by a program that is done, or still has it open.
  for (const bool staysOpen : {true, false}) {
    FileDescriptor other;
    FileRequest request = kPlain;
    request.leaves = [&](const std::string&) {
      other = FileDescriptor(::open(drive.at("a").c_str(), O_WRONLY | O_CLOEXEC));
      ASSERT_EQ(::pwrite(other.get(), staysOpen ? "W" : "V", 1, 0), 1);
      if (!staysOpen) other = FileDescriptor();
    };
    EXPECT_EQ(posixOf(move("a", request).error), ETXTBSY);
    EXPECT_EQ(TestDrive::get(drive.at("a")), staysOpen ? "Words" : "Vords");
    EXPECT_FALSE(std::filesystem::exists(there("a")));
  }
  // Another file that has the name by then is not the one that was asked for.
  FileRequest request = kPlain;
  request.file.emplace();
  ASSERT_EQ(readFileKey(AT_FDCWD, drive.at("a"), *request.file), 0);
  request.leaves = [&](const std::string&) {
    drive.write("other", "other");
    std::filesystem::rename(drive.at("other"), drive.at("a"));
  };
  EXPECT_EQ(posixOf(move("a", request).error), ESTALE);
  EXPECT_EQ(TestDrive::get(drive.at("a")), "other");
  EXPECT_FALSE(std::filesystem::exists(there("a")));
}

}  // namespace
}  // namespace skein::vald
