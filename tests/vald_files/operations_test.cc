// What each operation does, refuses, and remembers.
#include <sched.h>
#include <sys/mount.h>
#include <sys/wait.h>
#include <sys/xattr.h>

#include <functional>

#include "linux/vald/files/AccessList.h"
#include "linux/vald/files/TrashInfo.h"
#include "linux/vald/files/TreeRemoval.h"
#include "tests/vald_files/FilesFixture.h"

namespace skein::vald {
namespace {

const FileRequest kRequest{"a test", "d0000000000000001", {}};

TEST(Names, RefuseWhatCannotBeAndNumberWithinTheLimit) {
  for (const std::string& name :
       {std::string(), std::string("."), std::string(".."), std::string("a/b"),
        std::string("a\0b", 3), std::string(256, 'x'), std::string(".skein-import-1"),
        std::string(".skein-removed-1"), std::string(".n.skein-part"), std::string(".n.skein-new"),
        std::string(".n.skein-old"), std::string(".Trash-1000")}) {
    const NSErrorPtr refusal = refusalOfName(name, false);
    EXPECT_EQ(codeOf(refusal), NSFileWriteInvalidFileNameError) << printable(name);
    EXPECT_FALSE(wordsOf(refusal).empty());
  }
  EXPECT_EQ(refusalOfName(std::string(255, 'x'), true), nullptr);
  EXPECT_EQ(refusalOfName("...", true), nullptr);
  for (const char* name : {".n.skein", ".skein-old", "n.skein-old", ".Trash-1000x", ".Trash-"}) {
    EXPECT_EQ(refusalOfName(name, true), nullptr) << name;
  }
  EXPECT_EQ(refusalOfName(".Trash", false), nullptr);
  EXPECT_NE(refusalOfName(".Trash", true), nullptr);
  EXPECT_EQ(refusalOfName(".Trash-mine", true), nullptr);

  EXPECT_EQ(numberedName("a.txt", 1, ' '), "a.txt");
  EXPECT_EQ(numberedName("a.tar.gz", 2, ' '), "a 2.tar.gz");
  EXPECT_EQ(numberedName(".profile", 3, '.'), ".profile.3");
  const std::string umlauts = numberedName(std::string(250, 'x') + "äöü.txt", 12, ' ');
  EXPECT_LE(umlauts.size(), kLongestName);
  EXPECT_EQ(printable(umlauts), umlauts) << "cut within a character";
}

TEST(Operations, CreateRenameMoveAndSayWhatIsInTheWay) {
  TestDrive drive;
  FileOperations& files = drive.open();
  drive.write("a.txt", "a");
  EXPECT_EQ(files.createFolder(drive.store, "folder", kRequest).path, drive.at("folder"));
  EXPECT_EQ(codeOf(files.createFolder(drive.store, "folder", kRequest).error), 516);
  EXPECT_EQ(urlOf(files.createFolder(drive.store, "folder", kRequest).error), drive.at("folder"));
  EXPECT_EQ(codeOf(files.createFolder(drive.at("none"), "x", kRequest).error), 4);
  EXPECT_EQ(codeOf(files.createFolder(drive.outside, "x", kRequest).error), 513);

  EXPECT_EQ(files.rename(drive.at("a.txt"), "A.txt", kRequest).path, drive.at("A.txt"));
  EXPECT_EQ(files.rename(drive.at("A.txt"), "A.txt", kRequest).path, drive.at("A.txt"));
  EXPECT_EQ(codeOf(files.rename(drive.at("a.txt"), "b", kRequest).error), 4);
  EXPECT_EQ(codeOf(files.rename(drive.at("A.txt"), "a/b", kRequest).error), 514);
  EXPECT_EQ(codeOf(files.rename(drive.at("A.txt"), ".Trash-7", kRequest).error), 514);
  NSErrorPtr taken = files.rename(drive.at("A.txt"), "folder", kRequest).error;
  EXPECT_EQ(codeOf(taken), 516);
  EXPECT_EQ(urlOf(taken), drive.at("folder"));
  // Two links of one file are two items: none silently swallows the other.
  std::filesystem::create_hard_link(drive.at("A.txt"), drive.at("link.txt"));
  EXPECT_EQ(codeOf(files.rename(drive.at("A.txt"), "link.txt", kRequest).error), 516);

  drive.write("folder/A.txt", "other");
  EXPECT_EQ(codeOf(files.move(drive.at("A.txt"), drive.at("folder"), {}, false, kRequest).error),
            516);
  EXPECT_EQ(files.move(drive.at("A.txt"), drive.at("folder"), {}, true, kRequest).path,
            drive.at("folder/A 2.txt"));
  EXPECT_EQ(files.move(drive.at("link.txt"), drive.at("folder"), "c", false, kRequest).path,
            drive.at("folder/c"));
  EXPECT_EQ(TestDrive::get(drive.at("folder/A.txt")), "other");
  EXPECT_EQ(TestDrive::get(drive.at("folder/A 2.txt")), "a");
}

TEST(Operations, TheMoveRuleRefusesWhatMoveRefuses) {
  TestDrive drive;
  FileOperations& files = drive.open();
  drive.write("outer/inner/a", "a");
  drive.write("b", "b");
  const std::string trashed = files.trash(drive.at("b"), kRequest).path;
  const std::string trash = drive.at(trashFolderName(::geteuid()));
  constexpr std::uint64_t kSignificant = 0x15f9;
  const auto mask = [&](const std::string& path, const std::string& to) {
    NSErrorPtr error;
    const std::uint64_t bits = files.capabilityToMove(path, to, &error);
    EXPECT_EQ(bits == 0, error != nullptr) << to;
    EXPECT_EQ(bits & ~kSignificant, 0u);
    return bits;
  };
  EXPECT_EQ(mask(drive.at("outer/inner"), drive.at("outer/x")), kMayRename);
  EXPECT_EQ(mask(drive.at("outer/inner"), drive.at("inner")), kMayMoveToAnotherFolder);
  EXPECT_EQ(mask(trashed, drive.at("outer/b")), kMayMoveOutOfTrash);

  const struct {
    std::string path, folder, name;
  } refused[] = {
      {drive.at("outer"), drive.at("outer"), "outer"},
      {drive.at("outer"), drive.at("outer/inner"), "outer"},
      {drive.store, drive.at("outer"), "store"},
      {drive.at("outer"), drive.outside, "outer"},
      {drive.at("outer"), trash + "/files", "outer"},
      {drive.at("outer"), drive.store, ".Trash-1"},
      {trash, drive.at("outer"), ".Trash"},
      {trash + "/info", drive.at("outer"), "info"},
  };
  const auto before = drive.snapshot();
  for (const auto& move : refused) {
    EXPECT_EQ(mask(move.path, move.folder + '/' + move.name), 0u) << move.path;
    const FileResult result = files.move(move.path, move.folder, move.name, true, kRequest);
    EXPECT_NE(result.error, nullptr) << move.path << " -> " << move.folder;
  }
  EXPECT_EQ(drive.snapshot(), before);
  EXPECT_EQ(codeOf(files.rename(trashed, "x", kRequest).error), 513);
  EXPECT_EQ(codeOf(files.trash(trashed, kRequest).error), 513);
  EXPECT_EQ(codeOf(files.remove(drive.store, kRequest).error), 513);
}

TEST(Operations, NeverFollowALinkOutOfTheStore) {
  TestDrive drive;
  FileOperations& files = drive.open();
  TestDrive::put(drive.outside + "/secret", "s");
  std::filesystem::create_directory_symlink(drive.outside, drive.at("out"));
  EXPECT_NE(files.remove(drive.at("out/secret"), kRequest).error, nullptr);
  EXPECT_NE(files.createFolder(drive.at("out"), "x", kRequest).error, nullptr);
  EXPECT_NE(files.rename(drive.at("x/../../outside/secret"), "x", kRequest).error, nullptr);
  EXPECT_NE(files.setTags(drive.at("out/secret"), {"t"}).error, nullptr);
  EXPECT_EQ(files.remove(drive.at("out"), kRequest).error, nullptr);
  EXPECT_EQ(TestDrive::get(drive.outside + "/secret"), "s");
}

TEST(Operations, AnAppsFolderThatWasMadeAnewIsTheOneThatIsChangedAndTheDrivesIsNot) {
  TestDrive drive;
  FileOperations& operations = drive.open();
  const std::string app = drive.top + "/app";
  std::filesystem::create_directory(app);
  ASSERT_EQ(operations.setRoots({drive.store, app}), nullptr);
  const auto placed = [&](const std::string& folder) {
    StorePlace place;
    EXPECT_EQ(operations.roots().locate(folder + "/name", place), nullptr);
    struct stat there {};
    struct stat held {};
    EXPECT_EQ(::stat(folder.c_str(), &there), 0);
    EXPECT_EQ(place.folder.status(held), 0);
    return there.st_ino == held.st_ino;
  };
  for (const std::string& folder : {app, drive.store}) {
    EXPECT_TRUE(placed(folder));
    std::filesystem::rename(folder, folder + "-away");
    std::filesystem::create_directory(folder);
    EXPECT_EQ(placed(folder), folder == app);
  }
}

TEST(Import, KeepsATreeAsItIsWithProgressAndCancelsWithoutATrace) {
  TestDrive drive;
  FileOperations& files = drive.open();
  const std::string tree = drive.outside + "/tree";
  for (int number = 0; number < 200; ++number) {
    TestDrive::put(tree + "/sub/file" + std::to_string(number), std::string(4096, 'x'));
  }
  TestDrive::put(tree + "/empty", "");
  TestDrive::put(tree + "/sparse", "begin");
  std::filesystem::resize_file(tree + "/sparse", 8 << 20);
  std::ofstream(tree + "/sparse", std::ios::app) << "end";
  std::filesystem::create_symlink("nowhere", tree + "/link");
  ASSERT_EQ(::chmod((tree + "/empty").c_str(), 04751), 0);
  ASSERT_EQ(::chmod((tree + "/sub").c_str(), 0500), 0);
  const timespec times[2] = {{1000, 1}, {2000, 2}};
  ASSERT_EQ(::utimensat(AT_FDCWD, (tree + "/empty").c_str(), times, 0), 0);
  DirectoryHandle outside;
  ASSERT_EQ(DirectoryHandle::openRoot(tree, outside), 0);
  ASSERT_EQ(writeTags(drive.files, outside, "empty", "empty", {"red"}, nullptr).storage,
            TagStorage::Kept);

  FileRequest request = kRequest;
  std::uint64_t calls = 0;
  request.progress = [&](const FileProgress& progress) {
    ++calls;
    return progress.doneItems < 100;
  };
  EXPECT_EQ(codeOf(files.importDocument(tree, drive.store, {}, request).error), 3072);
  EXPECT_TRUE(drive.snapshot(true).empty());
  EXPECT_TRUE(std::filesystem::is_empty(drive.state + "/staging"));

  FileProgress last;
  request.progress = [&](const FileProgress& progress) {
    last = progress;
    return true;
  };
  EXPECT_EQ(files.importDocument(tree + "/", drive.store, "new", request).path, drive.at("new"));
  EXPECT_EQ(last.doneItems, last.totalItems);
  EXPECT_EQ(last.totalItems, 205u);
  struct stat status {};
  ASSERT_EQ(::stat(drive.at("new/empty").c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777, 0751u) << "set-user-id does not come along";
  EXPECT_EQ(status.st_mtim.tv_sec, 2000);
  EXPECT_EQ(files.tags(drive.at("new/empty")).names, std::vector<std::string>{"red"});
  EXPECT_EQ(TestDrive::get(drive.at("new/sparse")), TestDrive::get(tree + "/sparse"));
  ASSERT_EQ(::stat(drive.at("new/sparse").c_str(), &status), 0);
  EXPECT_LT(status.st_blocks * 512, 1 << 20) << "a hole was filled";
  ASSERT_EQ(::stat(drive.at("new/sub").c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 0777, 0700u);
  EXPECT_EQ(std::filesystem::read_symlink(drive.at("new/link")), "nowhere");

  EXPECT_EQ(urlOf(files.importDocument(tree, drive.store, "new", kRequest).error), drive.at("new"));
  EXPECT_EQ(codeOf(files.importDocument(drive.at("new"), drive.at("new/sub"), {}, kRequest).error),
            513);
  ASSERT_EQ(::mkfifo((tree + "/pipe").c_str(), 0600), 0);
  EXPECT_NE(wordsOf(files.importDocument(tree, drive.store, "two", kRequest).error).find("pipe"),
            std::string::npos);
  EXPECT_FALSE(drive.exists("two"));
  EXPECT_EQ(codeOf(files.importDocument(drive.outside + "/no", drive.store, {}, kRequest).error),
            4);
}

TEST(Trash, NumbersClashesAndPutsBackUnderTheOldName) {
  TestDrive drive;
  FileOperations& files = drive.open();
  const std::string odd = "50% \xC3\xA4\n\xFF.txt";
  const std::string longName = std::string(250, 'l') + ".txt";
  for (const std::string& name : {odd, longName}) {
    std::vector<std::string> trashed;
    for (int number = 0; number < 3; ++number) {
      drive.write("sub/" + name, std::to_string(number));
      trashed.push_back(files.trash(drive.at("sub/" + name), kRequest).path);
      ASSERT_FALSE(trashed.back().empty());
      EXPECT_EQ(files.putBackPath(trashed.back()).path, drive.at("sub/" + name));
    }
    EXPECT_FALSE(drive.exists("sub/" + name));
    EXPECT_EQ(files.move(trashed[1], drive.at("sub"), {}, true, kRequest).path,
              drive.at("sub/" + name));
    EXPECT_EQ(TestDrive::get(drive.at("sub/" + name)), "1");
    const std::string bounced = files.move(trashed[2], drive.at("sub"), {}, true, kRequest).path;
    EXPECT_EQ(bounced, drive.at("sub/" + numberedName(name, 2, ' ')));
    EXPECT_EQ(codeOf(files.putBackPath(trashed[2]).error), 4);
    EXPECT_EQ(files.remove(trashed[0], kRequest).error, nullptr);
  }
  const std::string trash = drive.at(trashFolderName(::geteuid()));
  EXPECT_TRUE(std::filesystem::is_empty(trash + "/info"));
  struct stat status {};
  ASSERT_EQ(::stat(trash.c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777, 0700u);

  // What lies in a trashed folder knows its place too.
  drive.write("folder/deep/x", "x");
  const std::string folder = files.trash(drive.at("folder"), kRequest).path;
  EXPECT_EQ(files.putBackPath(folder + "/deep/x").path, drive.at("folder/deep/x"));
  EXPECT_EQ(files.move(folder + "/deep/x", drive.store, {}, false, kRequest).path, drive.at("x"));
  EXPECT_EQ(files.putBackPath(folder).path, drive.at("folder"));
}

TEST(Trash, BelievesNoInfoThatLeadsOut) {
  TestDrive drive;
  FileOperations& files = drive.open();
  drive.write("a", "a");
  const std::string trashed = files.trash(drive.at("a"), kRequest).path;
  const std::string info = drive.at(trashFolderName(::geteuid())) + "/info/a.trashinfo";
  const auto origin = [&](const std::string& path) {
    TestDrive::put(info, "[Trash Info]\nPath=" + path + "\nDeletionDate=2026-01-01T00:00:00\n");
    return files.putBackPath(trashed).path;
  };
  EXPECT_EQ(origin("sub/b%20c"), drive.at("sub/b c"));
  EXPECT_EQ(origin(percentEncoded(drive.at("b"))), drive.at("b"));
  EXPECT_EQ(origin("../outside/b"), "");
  EXPECT_EQ(origin("/etc/passwd"), "");
  EXPECT_EQ(origin("b%00c"), "");
  EXPECT_EQ(origin(std::string("b\0c", 3)), "");
  EXPECT_EQ(origin("b%2"), "");
  EXPECT_EQ(parseTrashInfo("Path=a\n"), std::nullopt);
}

TEST(Import, RefusesWhatIsBeingWritten) {
  TestDrive drive;
  FileOperations& files = drive.open();
  const std::string source = drive.outside + "/saved";
  TestDrive::put(source, std::string(40 << 20, 's'));
  const auto import = [&](const FileRequest& request) {
    const NSErrorPtr error = files.importDocument(source, drive.store, {}, request).error;
    EXPECT_TRUE(std::filesystem::is_empty(drive.state + "/staging"));
    EXPECT_EQ(drive.exists("saved"), !error);
    return error;
  };
  FileDescriptor writer(::open(source.c_str(), O_WRONLY | O_CLOEXEC));
  EXPECT_EQ(posixOf(import(kRequest)), ETXTBSY);
  writer.reset();

  // Somebody opens it to write, which waits for us; without waiting, that is refused.
  FileRequest request = kRequest;
  bool isFirst = true;
  request.progress = [&](const FileProgress& state) {
    if (state.doneBytes > 0 && std::exchange(isFirst, false)) {
      EXPECT_LT(::open(source.c_str(), O_WRONLY | O_NONBLOCK | O_CLOEXEC), 0);
    }
    return true;
  };
  const NSErrorPtr disturbed = import(request);
  // A copy by reference is whole before anybody can come.
  if (disturbed) {
    EXPECT_EQ(posixOf(disturbed), ETXTBSY);
    EXPECT_EQ(import(kRequest), nullptr);
  }
}

// An access list: "system.posix_acl_access" of what a named user, and not the group, may read.
std::string readableByAnother() {
  const std::pair<char, char> entries[] = {{1, 6}, {2, 4}, {4, 0}, {16, 4}, {32, 0}};
  std::string list("\2\0\0\0", 4);
  for (const auto& [tag, permissions] : entries) {
    list += {tag, 0, permissions, 0};
    list += tag == 2 ? std::string("\x39\x30\0\0", 4) : std::string("\xff\xff\xff\xff");
  }
  return list;
}

TEST(Import, KeepsAccessListsOrGivesNoMoreThanTheyDo) {
  TestDrive drive;
  FileOperations& files = drive.open();
  const std::string source = drive.outside + "/private";
  const char* const name = "system.posix_acl_access";
  const std::string list = readableByAnother();
  TestDrive::put(source, "private");
  if (::setxattr(source.c_str(), name, list.data(), list.size(), 0) != 0) {
    GTEST_SKIP() << "this file system has no access lists";
  }
  ASSERT_EQ(files.importDocument(source, drive.store, {}, kRequest).error, nullptr);
  char kept[256];
  const ssize_t size = ::getxattr(drive.at("private").c_str(), name, kept, sizeof kept);
  ASSERT_EQ(size, static_cast<ssize_t>(list.size()));
  EXPECT_EQ(std::string(kept, list.size()), list);

  // The lists of a drive that has none: the group's bits are the group's, not the mask.
  AccessList known(list);
  EXPECT_EQ(known.groupPermissions(), 0u);
  std::string wide = list;
  wide[4 + 2 * 8 + 2] = 7;
  AccessList limited(wide);
  EXPECT_EQ(limited.groupPermissions(), 4u);
  limited.limitGroup(2);
  EXPECT_EQ(limited.groupPermissions(), 0u);
  EXPECT_TRUE(AccessList("no list").isEmpty());
  // A step before the mode is set fails as on a file system without lists.
  std::filesystem::remove(drive.at("private"));
  bool isMet = false;
  for (std::uint64_t step = 1; !isMet && step < 50; ++step) {
    drive.files.failAt(step, ENOTSUP);
    if (files.importDocument(source, drive.store, {}, kRequest).error) continue;
    struct stat status {};
    ASSERT_EQ(::stat(drive.at("private").c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 0077,
              ::getxattr(drive.at("private").c_str(), name, nullptr, 0) < 0 ? 0u : 040u);
    isMet = ::getxattr(drive.at("private").c_str(), name, nullptr, 0) < 0;
    std::filesystem::remove(drive.at("private"));
  }
  EXPECT_TRUE(isMet);
}

TEST(Import, KeepsMoreAttributesThanFitInAPage) {
  TestDrive drive;
  FileOperations& files = drive.open();
  const std::string source = drive.outside + "/many";
  TestDrive::put(source, "x");
  unsigned made = 0;
  const auto name = [](unsigned number) {
    return "user." + std::string(200, 'n') + std::to_string(number);
  };
  while (made < 30 && ::setxattr(source.c_str(), name(made).c_str(), "v", 1, 0) == 0) ++made;
  if (made < 30) GTEST_SKIP() << "this file system keeps " << made << " of them";
  ASSERT_EQ(files.importDocument(source, drive.store, {}, kRequest).error, nullptr);
  for (unsigned number = 0; number < made; ++number) {
    EXPECT_EQ(::getxattr(drive.at("many").c_str(), name(number).c_str(), nullptr, 0), 1) << number;
  }
}

// What a removal is asked with, and what it left to delete.
struct Removal {
  FileRequest request = {"me", {}, {}};
  Task deletion;

  Removal() {
    request.deleteLater = [this](Task task) { deletion = std::move(task); };
  }
};

TEST(Removal, IsTakenBackUntilItIsAnswered) {
  TestDrive drive;
  FileOperations& files = drive.open();
  drive.write("folder/sub/deep", "deep");
  drive.write("letter", "dear");
  const auto before = drive.snapshot(true);
  const auto isWhole = [&] {
    EXPECT_TRUE(std::filesystem::is_empty(drive.state + "/staging"));
    EXPECT_TRUE(files.journal().openEntries(nullptr).empty());
    return drive.snapshot(true) == before;
  };
  for (const char* name : {"folder", "letter"}) {
    Removal early;
    early.request.progress = [](const FileProgress&) { return false; };
    early.request.removed = [] {
      ADD_FAILURE() << "it was begun";
      return true;
    };
    if (name == std::string("folder")) {
      EXPECT_EQ(codeOf(files.remove(drive.at(name), early.request).error), NSUserCancelledError);
      EXPECT_TRUE(isWhole());
    }
    Removal late;
    late.request.removed = [&] {
      EXPECT_FALSE(drive.exists(name));
      return false;
    };
    const FileResult result = files.remove(drive.at(name), late.request);
    EXPECT_EQ(codeOf(result.error), NSUserCancelledError);
    EXPECT_EQ(result.path, "");
    EXPECT_FALSE(late.deletion);
    EXPECT_TRUE(isWhole());
    EXPECT_EQ(files.journal().historyOfPath(drive.at(name), 1, nullptr).at(0).state,
              OperationState::Undone);
  }

  // Another program takes the name meanwhile.
  Removal taken;
  taken.request.removed = [&] {
    drive.write("folder", "other");
    return false;
  };
  const FileResult result = files.remove(drive.at("folder"), taken.request);
  EXPECT_EQ(codeOf(result.error), NSUserCancelledError);
  EXPECT_EQ(result.path, drive.at("folder 2"));
  EXPECT_EQ(TestDrive::get(drive.at("folder")), "other");
  EXPECT_EQ(TestDrive::get(drive.at("folder 2/sub/deep")), "deep");
}

TEST(Removal, DeletesATreeAfterTheAnswerOrAtTheNextStart) {
  for (const bool isRun : {true, false}) {
    TestDrive drive;
    FileOperations& files = drive.open();
    drive.write("folder/sub/deep", "deep");
    Removal removal;
    EXPECT_EQ(files.remove(drive.at("folder"), removal.request).error, nullptr);
    EXPECT_FALSE(drive.exists("folder"));
    EXPECT_FALSE(std::filesystem::is_empty(drive.state + "/staging"));
    ASSERT_TRUE(removal.deletion);
    // The name is free at once.
    EXPECT_EQ(files.createFolder(drive.store, "folder", kRequest).error, nullptr);
    if (isRun) removal.deletion();
    removal.deletion = nullptr;
    EXPECT_EQ(files.journal().openEntries(nullptr).empty(), isRun);
    if (!isRun) drive.open();
    EXPECT_TRUE(std::filesystem::is_empty(drive.state + "/staging"));
    EXPECT_TRUE(drive.operations->journal().openEntries(nullptr).empty());
    EXPECT_TRUE(drive.exists("folder"));
  }
}

TEST(Removal, ThatIsCancelledIsWholeAtAnyFailure) {
  bool met = true;
  for (std::uint64_t step = 1; met; ++step) {
    ASSERT_LT(step, 50u);
    TestDrive drive;
    FileOperations& files = drive.open();
    drive.write("folder/sub/deep", "deep");
    const auto before = drive.snapshot(true);
    Removal removal;
    removal.request.removed = [] { return false; };
    drive.files.failAt(step, EIO);
    const NSErrorPtr error = files.remove(drive.at("folder"), removal.request).error;
    met = drive.files.met();
    // What cannot be put back is removed, and said to be.
    EXPECT_EQ(drive.snapshot(true) == before, error != nullptr) << step;
    EXPECT_EQ(removal.deletion.operator bool(), error == nullptr) << step;
    drive.files.failAt(0, 0);
    drive.open();
    EXPECT_EQ(drive.exists("folder"), error != nullptr) << step;
  }
}

TEST(Removal, AndRefusingAnImportWorkHoweverDeepATreeIs) {
  TestDrive drive;
  FileOperations& files = drive.open();
  drive.makeFolder("deep");
  for (const std::string& top : {drive.at("deep"), drive.outside}) {
    DirectoryHandle folder;
    ASSERT_EQ(DirectoryHandle::openRoot(top, folder), 0);
    for (int level = 0; level < 5000; ++level) {
      ASSERT_EQ(::mkdirat(folder.get(), "d", 0700), 0);
      DirectoryHandle below;
      ASSERT_EQ(folder.openFolder("d", below), 0);
      folder = std::move(below);
    }
    ASSERT_EQ(::mkdirat(folder.get(), "last", 0700), 0);
  }
  const NSErrorPtr refusal =
      files.importDocument(drive.outside + "/d", drive.store, {}, kRequest).error;
  EXPECT_NE(wordsOf(refusal).find("more than 1000 folders deep"), std::string::npos)
      << wordsOf(refusal);
  EXPECT_FALSE(drive.exists("d"));
  EXPECT_EQ(files.remove(drive.at("deep"), kRequest).error, nullptr);
  EXPECT_FALSE(drive.exists("deep"));
  EXPECT_TRUE(std::filesystem::is_empty(drive.state + "/staging"));
  DirectoryHandle outside;
  ASSERT_EQ(DirectoryHandle::openRoot(drive.outside, outside), 0);
  EXPECT_EQ(removeTree(drive.files, outside, "d"), 0);
}

// On a small volume of this process's own; false where none may be mounted.
bool onASmallVolume(const std::function<void(TestDrive&)>& body) {
  const std::string mount = ::testing::TempDir() + "/skein-full-" + std::to_string(::getpid());
  std::filesystem::create_directory(mount);
  const pid_t child = ::fork();
  if (child == 0) {
    if (::unshare(CLONE_NEWNS) != 0 ||
        ::mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0 ||
        ::mount("none", mount.c_str(), "tmpfs", 0, "size=8m") != 0) {
      ::_exit(77);
    }
    ::setenv("TEST_TMPDIR", mount.c_str(), 1);
    {
      TestDrive drive(mount);
      body(drive);
    }
    ::_exit(::testing::Test::HasFailure() ? 1 : 0);
  }
  int status = 0;
  EXPECT_EQ(::waitpid(child, &status, 0), child);
  std::filesystem::remove(mount);
  EXPECT_TRUE(WIFEXITED(status));
  EXPECT_NE(WEXITSTATUS(status), 1);
  return WEXITSTATUS(status) != 77;
}

TEST(Removal, ThatWasCutOffBeforeItsAnswerIsTakenBack) {
  TestDrive drive;
  const auto removeAndEndIn = [&](const std::function<void(FileRequest&)>& endIn) {
    drive.operations.reset();  // a database must not be open across a fork
    const pid_t child = ::fork();
    if (child == 0) {
      FileRequest request = kRequest;
      endIn(request);
      drive.open().remove(drive.at("folder/tree"), request);
      ::_exit(1);
    }
    int status = 0;
    EXPECT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_EQ(WEXITSTATUS(status), 0);
  };
  const auto whileTheStoreLooks = [](FileRequest& request) {
    request.removed = []() -> bool { ::_exit(0); };
  };
  drive.write("folder/tree/a", "a");
  removeAndEndIn(whileTheStoreLooks);
  EXPECT_FALSE(drive.exists("folder/tree"));
  EXPECT_EQ(drive.open().recovered().front().state, OperationState::Undone);
  EXPECT_TRUE(drive.exists("folder/tree/a"));

  // Its name, or its folder, may have gone meanwhile.
  removeAndEndIn(whileTheStoreLooks);
  drive.write("folder/tree", "another");
  EXPECT_EQ(drive.open().recovered().front().destination, drive.at("folder/tree 2"));
  EXPECT_TRUE(drive.exists("folder/tree 2/a"));
  std::filesystem::rename(drive.at("folder/tree 2"), drive.at("kept"));
  std::filesystem::remove(drive.at("folder/tree"));
  std::filesystem::rename(drive.at("kept"), drive.at("folder/tree"));
  removeAndEndIn(whileTheStoreLooks);
  std::filesystem::remove(drive.at("folder"));
  drive.open();
  EXPECT_TRUE(drive.exists("tree/a"));

  // What was answered is not taken back.
  drive.write("folder/tree/a", "a");
  removeAndEndIn([](FileRequest& request) { request.deleteLater = [](Task) { ::_exit(0); }; });
  EXPECT_EQ(drive.open().recovered().front().state, OperationState::Done);
  EXPECT_FALSE(drive.exists("folder/tree"));
  EXPECT_TRUE(std::filesystem::is_empty(drive.state + "/staging"));
}

TEST(Removal, WorksOnAFullDisk) {
  const bool isMounted = onASmallVolume([](TestDrive& drive) {
    FileOperations& files = drive.open();
    drive.write("folder/a", std::string(100'000, 'a'));
    drive.write("letter", "words");
    // Until nothing fits any more, and the journal has used what it had at hand.
    std::ofstream fill(drive.at("fill"), std::ios::binary);
    while (fill << std::string(4096, 'f') << std::flush) {
    }
    fill.close();
    NSErrorPtr full;
    for (int i = 0; i < 10'000 && !full; ++i) {
      full = files.createFolder(drive.store, "folder-" + std::to_string(i), kRequest).error;
    }
    EXPECT_EQ(codeOf(full), NSFileWriteOutOfSpaceError);
    // The trash is made for it, and its note.
    const FileResult trashed = files.trash(drive.at("letter"), kRequest);
    EXPECT_EQ(trashed.error, nullptr) << wordsOf(trashed.error);
    EXPECT_FALSE(drive.exists("letter"));
    const FileResult removed = files.remove(drive.at("folder"), kRequest);
    EXPECT_EQ(removed.error, nullptr) << wordsOf(removed.error);
    EXPECT_FALSE(drive.exists("folder"));
    EXPECT_EQ(files.remove(drive.at("fill"), kRequest).error, nullptr);
    EXPECT_EQ(files.createFolder(drive.store, "folder", kRequest).error, nullptr);
    struct stat reserve {};
    EXPECT_EQ(::stat((drive.state + "/operations.db-reserve").c_str(), &reserve), 0);
    EXPECT_GT(reserve.st_blocks, 0);
  });
  if (!isMounted) GTEST_SKIP() << "no small volume may be mounted here";
}

TEST(Provenance, TellsWhoseRequestRemovedAPathAndIsBounded) {
  TestDrive drive;
  FileOperations& files = drive.open();
  drive.write("folder/sub/a", "a");
  drive.write("b", "b");
  ASSERT_EQ(files.rename(drive.at("folder"), "renamed", {"one", {}, {}}).error, nullptr);
  ASSERT_EQ(files.remove(drive.at("renamed"), {"two", "i01", {}}).error, nullptr);
  drive.files.failAt(2, EACCES);
  ASSERT_EQ(codeOf(files.remove(drive.at("b"), {"three", {}, {}}).error), 513);
  drive.files.failAt(0, 0);

  auto history = files.journal().historyOfPath(drive.at("renamed/sub/a"), 10, nullptr);
  ASSERT_EQ(history.size(), 2u);
  EXPECT_EQ(history[0].kind, OperationKind::Remove);
  EXPECT_EQ(history[0].origin, "two");
  EXPECT_EQ(history[0].state, OperationState::Done);
  EXPECT_EQ(history[1].destination, drive.at("renamed"));
  EXPECT_EQ(files.journal().historyOfPath(drive.at("folder/sub/a"), 10, nullptr).size(), 1u);
  EXPECT_EQ(files.journal().historyOfDocument("i01", 10, nullptr).size(), 1u);
  history = files.journal().historyOfPath(drive.at("b"), 10, nullptr);
  ASSERT_EQ(history.size(), 1u);
  EXPECT_EQ(history[0].state, OperationState::Undone);

  // A path that no file system has, and that somebody may ask about all the same.
  std::string deep = drive.at("renamed");
  for (int depth = 0; depth < 40'000; ++depth) deep += "/d";
  EXPECT_EQ(files.journal().historyOfPath(deep, 10, nullptr).size(), 2u);
  EXPECT_EQ(files.journal().historyOfPath(deep, 1, nullptr)[0].origin, "two");

  NSErrorPtr error;
  auto journal = OperationJournal::open(drive.state + "/small.db", 100, drive.files, &error);
  ASSERT_TRUE(journal) << wordsOf(error);
  OperationEntry entry;
  entry.path = "/kept/open";
  ASSERT_EQ(journal->begin(entry), nullptr);
  for (int number = 0; number < 600; ++number) {
    entry.path = "/x";
    ASSERT_EQ(journal->begin(entry), nullptr);
    journal->end(entry.id, OperationState::Done);
  }
  const std::size_t kept = journal->historyOfPath("/x", 1000, &error).size();
  EXPECT_GE(kept, 100u);
  EXPECT_LE(kept, 100u + 256u);
  EXPECT_EQ(journal->openEntries(&error).size(), 1u);
}

// Does something just before the next renaming, as another program may.
class BusyLayer final : public FileLayer {
 public:
  std::function<void()> beforeRename;

 protected:
  int beforeStep(FileStep step, std::string_view) override {
    if (const auto now =
            step == FileStep::Rename ? std::exchange(beforeRename, nullptr) : nullptr) {
      now();
    }
    return 0;
  }
};

TEST(Operations, LeaveAnotherFileAloneThatTookTheName) {
  using Operation =
      std::function<NSErrorPtr(FileOperations&, const TestDrive&, const FileRequest&)>;
  const std::vector<Operation> operations = {
      [](auto& files, auto& drive, auto& request) {
        return files.remove(drive.at("a"), request).error;
      },
      [](auto& files, auto& drive, auto& request) {
        return files.trash(drive.at("a"), request).error;
      },
      [](auto& files, auto& drive, auto& request) {
        return files.rename(drive.at("a"), "z", request).error;
      },
      [](auto& files, auto& drive, auto& request) {
        return files.move(drive.at("a"), drive.at("folder"), std::nullopt, true, request).error;
      },
      [](auto& files, auto& drive, auto& request) {
        return files.setTags(drive.at("a"), {"red"}, nullptr, request.file).error;
      }};
  enum class Swap { Before, InTheLastMoment, AndTheNameIsTakenAgain };
  for (std::size_t i = 0; i < operations.size(); ++i) {
    for (const Swap when : {Swap::Before, Swap::InTheLastMoment, Swap::AndTheNameIsTakenAgain}) {
      if (i == 4 && when != Swap::Before) continue;  // it goes by an open file
      TestDrive drive;
      BusyLayer layer;
      FileOperationsOptions options;
      options.roots = {drive.store};
      options.stateDirectory = drive.state;
      const auto files = FileOperations::open(options, layer, drive.log, nullptr);
      ASSERT_NE(files, nullptr);
      drive.write("a", "meant");
      drive.write("c", "other");
      drive.makeFolder("folder");
      FileRequest request{"a test", {}, {}};
      ASSERT_EQ(readFileKey(AT_FDCWD, drive.at("a"), request.file.emplace()), 0);
      const auto swap = [&] {
        std::filesystem::rename(drive.at("a"), drive.at("b"));
        std::filesystem::rename(drive.at("c"), drive.at("a"));
        if (when == Swap::AndTheNameIsTakenAgain) {
          layer.beforeRename = [&] { drive.write("a", "third"); };
        }
      };
      if (when == Swap::Before) {
        swap();
      } else {
        layer.beforeRename = swap;
      }
      const NSErrorPtr error = operations[i](*files, drive, request);
      EXPECT_EQ(codeOf(error), NSFileNoSuchFileError);
      EXPECT_EQ(posixOf(error), ESTALE);
      const bool isThird = when == Swap::AndTheNameIsTakenAgain;
      EXPECT_EQ(TestDrive::get(drive.at("b")), "meant");
      EXPECT_EQ(TestDrive::get(drive.at(isThird ? "a 2" : "a")), "other");
      if (isThird) {
        EXPECT_EQ(TestDrive::get(drive.at("a")), "third");
      }
      std::size_t all = 0;
      for (const auto& entry : std::filesystem::recursive_directory_iterator(drive.store)) {
        all += entry.is_directory() ? 0 : 1;
      }
      EXPECT_EQ(all, isThird ? 3u : 2u) << i;
      EXPECT_TRUE(files->tags(drive.at("a")).names.empty());
    }
  }
}

}  // namespace
}  // namespace skein::vald
