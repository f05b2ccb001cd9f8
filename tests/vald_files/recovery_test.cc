// What a start finds: operations that were cut off while others went on, ends that the disk
// refused, databases that are damaged; and what belongs to somebody else stays theirs.
#include <sqlite3.h>

#include <cerrno>

#include "linux/vald/files/DatabaseFile.h"
#include "linux/vald/files/OwnFolders.h"
#include "tests/vald_files/FilesFixture.h"

namespace skein::vald {
namespace {

const FileRequest kRequest{"a test", {}, {}};

TEST(Recovery, LeavesAloneWhatBecameOfOthersMeanwhile) {
  TestDrive drive;
  FileOperations& files = drive.open();
  drive.write("gone", "gone");
  const std::string trash = drive.at(trashFolderName(::geteuid()));
  ASSERT_EQ(files.trash(drive.at("gone"), kRequest).error, nullptr);
  drive.write("a", "a");
  drive.write("b", "b");
  const auto cutOff = [&](OperationKind kind, const std::string& destination,
                          const std::string& aside) {
    OperationEntry entry;
    entry.kind = kind;
    entry.path = drive.at("a");
    entry.destination = destination;
    entry.aside = aside;
    EXPECT_EQ(drive.operations->journal().begin(entry), nullptr);
  };
  // Another tool trashed something of the name that was reserved.
  const std::string info = trash + "/info/a.trashinfo";
  TestDrive::put(info, "[Trash Info]\nPath=other/a\n");
  cutOff(OperationKind::Trash, trash + "/files/a", {});
  cutOff(OperationKind::Rename, drive.at("b"), {});
  // What is no name of staging is nobody's to delete.
  cutOff(OperationKind::Import, drive.at("c"), drive.at("b"));
  const auto before = drive.snapshot(true);
  const auto& recovered = drive.open().recovered();
  EXPECT_EQ(drive.snapshot(true), before);
  EXPECT_TRUE(std::filesystem::exists(info));
  ASSERT_GE(recovered.size(), 2u);
  EXPECT_EQ(recovered[0].state, OperationState::Undone);
  EXPECT_EQ(recovered[1].state, OperationState::Undone);
}

TEST(Journal, WritesEndsThatTheDiskRefusedLaterAndKnowsItsVersion) {
  TestDrive drive;
  FileOperations& files = drive.open();
  const auto createWithoutEnd = [&](const std::string& name) {
    drive.files.failAt(4, EIO);  // begin, make, sync, end
    EXPECT_EQ(drive.operations->createFolder(drive.store, name, kRequest).error, nullptr);
    EXPECT_TRUE(drive.files.met());
    drive.files.failAt(0, 0);
  };
  createWithoutEnd("one");
  EXPECT_TRUE(files.journal().openEntries(nullptr).empty());
  createWithoutEnd("two");
  EXPECT_TRUE(drive.open().recovered().empty()) << "the end was not written when it was closed";
  // A folder's own making is told of it, and not of what is in it.
  EXPECT_EQ(drive.operations->journal().historyOfPath(drive.at("one"), 9, nullptr).size(), 1u);
  EXPECT_EQ(drive.operations->journal().historyOfPath(drive.at("one/x"), 9, nullptr).size(), 0u);

  drive.operations.reset();
  const std::string path = drive.state + "/operations.db";
  sqlite3* database = nullptr;
  ASSERT_EQ(sqlite3_open(path.c_str(), &database), SQLITE_OK);
  EXPECT_EQ(sqlite3_exec(database, "PRAGMA user_version = 99", nullptr, nullptr, nullptr),
            SQLITE_OK);
  sqlite3_close(database);
  NSErrorPtr error;
  EXPECT_FALSE(OperationJournal::open(path, 100, drive.files, &error));
  EXPECT_NE(wordsOf(error).find("newer version"), std::string::npos) << wordsOf(error);
}

TEST(Databases, AreClosedToOthersAndSetAsideWhenDamaged) {
  const TestDrive drive;
  QuietLog log;
  const std::string path = drive.state + "/some.db";
  TestDrive::put(path, std::string(5000, 'x'));
  ASSERT_EQ(::chmod(path.c_str(), 0644), 0);
  makeDatabasePrivate(path);
  struct stat status {};
  ASSERT_EQ(::stat(path.c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 0777, 0600u);

  for (int number = 0; number < 5; ++number) {
    TestDrive::put(path + ".damaged-" + std::to_string(number), "old");
  }
  EXPECT_TRUE(setAsideWhenDamaged(path, log));
  EXPECT_FALSE(std::filesystem::exists(path));
  EXPECT_EQ(notesOfDatabasesSetAside(drive.state).size(), 3u);
  EXPECT_FALSE(setAsideWhenDamaged(path, log)) << "there is none";
}

TEST(Operations, LeaveWhatIsThisSystemsOrAnotherUsersWhereItIs) {
  TestDrive drive;
  FileOperations& files = drive.open();
  drive.makeFolder("home/state");
  setOwnFolders({drive.at("home/state")});
  EXPECT_EQ(codeOf(files.remove(drive.at("home"), kRequest).error), NSFileWriteNoPermissionError);
  EXPECT_EQ(codeOf(files.trash(drive.at("home/state"), kRequest).error),
            NSFileWriteNoPermissionError);
  EXPECT_TRUE(drive.exists("home/state"));
  setOwnFolders({});

  // A hint is written for the file that was meant.
  drive.write("a", "a");
  drive.write("b", "b");
  FileKey key;
  ASSERT_EQ(readFileKey(AT_FDCWD, drive.at("b"), key), 0);
  EXPECT_FALSE(files.writeHint(drive.at("a"), 7, key));
  EXPECT_TRUE(files.writeHint(drive.at("b"), 7, key));

  if (::geteuid() != 0) return;
  const std::string trash = drive.at(trashFolderName(::geteuid()));
  std::filesystem::create_directory(trash);
  ASSERT_EQ(::chown(trash.c_str(), 12345, 12345), 0);
  EXPECT_EQ(codeOf(files.trash(drive.at("a"), kRequest).error), NSFileWriteNoPermissionError);
  EXPECT_TRUE(drive.exists("a"));
}

TEST(FileLayer, MakesNewFilesOnlyAndTellsWhenNotAllIsWritten) {
  const TestDrive drive;
  FileLayer layer;
  DirectoryHandle folder;
  ASSERT_EQ(DirectoryHandle::openRoot(drive.store, folder), 0);
  FileDescriptor file;
  EXPECT_EQ(layer.createFile(folder.get(), "a", 0600, file), 0);
  EXPECT_EQ(layer.createFile(folder.get(), "a", 0600, file), EEXIST);
  int ends[2];
  ASSERT_EQ(::pipe2(ends, O_NONBLOCK | O_CLOEXEC), 0);
  const FileDescriptor out(ends[0]);
  const FileDescriptor in(ends[1]);
  EXPECT_EQ(layer.write(in.get(), std::string(1 << 20, 'x')), EAGAIN);
}

}  // namespace
}  // namespace skein::vald
