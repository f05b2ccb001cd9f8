// Other tools and we read each other's trash: on a volume of its own, since only at the
// top of a volume do they look for one. Skipped where there is no root or no such tool.
#include <cstdlib>

#include "tests/vald_files/FilesFixture.h"

namespace skein::vald {
namespace {

const FileRequest kRequest{"a test", {}, {}};
constexpr char kOdd[] = "sub/50% \xC3\xA4 #1.txt";

bool has(const std::string& program) {
  return std::system(("command -v " + program + " >/dev/null 2>&1").c_str()) == 0;
}

class TrashInterop : public ::testing::Test {
 protected:
  void SetUp() override {
    const std::string image = drive.outside + "/volume";
    if (::geteuid() != 0) GTEST_SKIP() << "mounting a volume needs root";
    if (!has("mkfs.ext4")) GTEST_SKIP() << "mkfs.ext4 is missing";
    const std::string make = "truncate -s 16M " + image + " && mkfs.ext4 -q " + image +
                             " && mount -o loop " + image + " " + drive.store;
    if (std::system((make + " >/dev/null 2>&1").c_str()) != 0) {
      GTEST_SKIP() << "no volume can be mounted here";
    }
    mounted = true;
    drive.open();
    drive.write(kOdd, "contents");
  }
  void TearDown() override {
    drive.operations.reset();
    if (mounted) {
      EXPECT_EQ(std::system(("umount -l " + drive.store).c_str()), 0);
    }
  }
  // 0 when the command does. With settings of its own, so that nobody's trash is touched.
  int run(const std::string& command) const {
    const std::string own =
        "XDG_DATA_HOME=" + drive.top + " XDG_RUNTIME_DIR=" + drive.outside + " LC_ALL=C.UTF-8";
    return std::system((own + " " + command).c_str());
  }
  std::string trashed() const {
    for (const auto& entry : std::filesystem::recursive_directory_iterator(drive.store)) {
      if (entry.path().parent_path().filename() == "files") return entry.path();
    }
    return {};
  }
  bool trashIsEmpty() const {
    return trashed().empty() &&
           std::filesystem::is_empty(drive.at(trashFolderName(::geteuid())) + "/info");
  }

  TestDrive drive;
  bool mounted = false;
};

TEST_F(TrashInterop, WePutBackWhatGioTrashed) {
  if (!has("gio")) GTEST_SKIP() << "gio is missing: install libglib2.0-bin";
  ASSERT_EQ(run("gio trash '" + drive.at(kOdd) + "'"), 0);
  ASSERT_FALSE(drive.exists(kOdd));
  EXPECT_EQ(drive.operations->putBackPath(trashed()).path, drive.at(kOdd));
  EXPECT_EQ(drive.operations->move(trashed(), drive.at("sub"), {}, true, kRequest).path,
            drive.at(kOdd));
  EXPECT_TRUE(trashIsEmpty());
}

TEST_F(TrashInterop, GioListsAndRestoresWhatWeTrashed) {
  if (!has("gio") || !has("dbus-run-session") || !std::filesystem::exists("/usr/libexec/gvfsd")) {
    GTEST_SKIP() << "gio's own trash folder is missing: install gvfs and dbus";
  }
  // Plain letters: gvfs 1.50 restores what it trashed itself under "\\xc3..." too.
  const std::string name = drive.at("sub/50% #1.txt");
  TestDrive::put(name, "contents");
  ASSERT_EQ(drive.operations->trash(name, kRequest).error, nullptr);
  TestDrive::put(drive.outside + "/restore",
                 "gio trash --list | cut -f2 > " + drive.outside +
                     "/listed\n"
                     "gio trash --restore \"$(gio trash --list | cut -f1)\"\n");
  ASSERT_EQ(run("timeout 60 dbus-run-session -- sh " + drive.outside + "/restore "), 0);
  EXPECT_EQ(TestDrive::get(drive.outside + "/listed"), name + "\n");
  EXPECT_EQ(TestDrive::get(name), "contents");
  EXPECT_TRUE(trashIsEmpty());
}

TEST_F(TrashInterop, TrashCliAndWeReadEachOther) {
  if (!has("trash-put") || !has("trash-restore")) GTEST_SKIP() << "trash-cli is missing";
  ASSERT_EQ(run("trash-put '" + drive.at(kOdd) + "'"), 0);
  EXPECT_EQ(drive.operations->move(trashed(), drive.at("sub"), {}, true, kRequest).path,
            drive.at(kOdd));
  EXPECT_TRUE(trashIsEmpty());

  const std::string ours = drive.operations->trash(drive.at(kOdd), kRequest).path;
  ASSERT_EQ(run("sh -c 'echo 0 | trash-restore " + drive.store + "'"), 0);
  EXPECT_EQ(TestDrive::get(drive.at(kOdd)), "contents") << ours;
  EXPECT_TRUE(trashIsEmpty());
}

}  // namespace
}  // namespace skein::vald
