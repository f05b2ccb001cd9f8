// Every operation, ended or failed at every step it takes: the store is as before or as
// after, and what is answered says which.
#include <sys/wait.h>

#include <functional>

#include "tests/vald_files/FilesFixture.h"

namespace skein::vald {
namespace {

const FileRequest kRequest{"a test", {}, {}};

struct Operation {
  std::string name;
  std::function<FileResult(TestDrive&)> run;
};
std::string trashFiles(TestDrive& drive) {
  return drive.at(trashFolderName(::geteuid())) + "/files";
}

const std::vector<Operation> kOperations = {
    {"ImportFile",
     [](TestDrive& drive) {
       return drive.operations->importDocument(drive.outside + "/tree/one", drive.at("folder"), {},
                                               kRequest);
     }},
    {"ImportTree",
     [](TestDrive& drive) {
       return drive.operations->importDocument(drive.outside + "/tree", drive.at("folder"), {},
                                               kRequest);
     }},
    {"CreateFolder",
     [](TestDrive& drive) {
       return drive.operations->createFolder(drive.at("folder"), "new", kRequest);
     }},
    {"MakeAlias",
     [](TestDrive& drive) {
       return drive.operations->makeAlias(drive.at("folder"), "alias", "/some/document", kRequest);
     }},
    {"Rename",
     [](TestDrive& drive) {
       return drive.operations->rename(drive.at("a.txt"), "A.txt", kRequest);
     }},
    {"MoveTree",
     [](TestDrive& drive) {
       return drive.operations->move(drive.at("folder"), drive.at("other"), {}, false, kRequest);
     }},
    {"MoveBouncing",
     [](TestDrive& drive) {
       return drive.operations->move(drive.at("a.txt"), drive.at("other"), {}, true, kRequest);
     }},
    {"RemoveFile",
     [](TestDrive& drive) { return drive.operations->remove(drive.at("a.txt"), kRequest); }},
    {"RemoveTree",
     [](TestDrive& drive) { return drive.operations->remove(drive.at("folder"), kRequest); }},
    {"RemoveTrashed",
     [](TestDrive& drive) {
       return drive.operations->remove(trashFiles(drive) + "/gone", kRequest);
     }},
    {"TrashFile",
     [](TestDrive& drive) { return drive.operations->trash(drive.at("gone"), kRequest); }},
    {"TrashTree",
     [](TestDrive& drive) { return drive.operations->trash(drive.at("folder"), kRequest); }},
    {"PutBack",
     [](TestDrive& drive) {
       return drive.operations->move(trashFiles(drive) + "/gone", drive.store, {}, true, kRequest);
     }},
    {"AcrossFile",
     [](TestDrive& drive) {
       return drive.operations->move(drive.at("a.txt"), drive.container, "A.txt", false, kRequest);
     }},
    {"AcrossTree",
     [](TestDrive& drive) {
       return drive.operations->move(drive.at("folder"), drive.container, {}, true, kRequest);
     }},
    {"AcrossOutOfTrash",
     [](TestDrive& drive) {
       return drive.operations->move(trashFiles(drive) + "/gone", drive.container, {}, false,
                                     kRequest);
     }},
    {"SetTags",
     [](TestDrive& drive) {
       const TagResult result = drive.operations->setTags(drive.at("a.txt"), {"new", "set"});
       return FileResult{{}, result.error};
     }},
};

// Where things are staged, and what the file system can.
enum class Setting { Plain, StagedInStore, RenameReplaces };

// A store with something of each kind, and the same times in every run.
void furnish(TestDrive& drive, Setting setting) {
  if (setting == Setting::RenameReplaces) drive.files.renameReplaces();
  FileOperations& files = drive.open();
  drive.write("a.txt", "document");
  drive.write("other/a.txt", "taken");
  drive.write("folder/sub/deep", "deep");
  drive.write("folder/b", std::string(5000, 'b'));
  drive.write("gone", "first");
  TestDrive::put(drive.outside + "/tree/one", "one");
  TestDrive::put(drive.outside + "/tree/sub/two", std::string(10000, '2'));
  drive.tag("a.txt", {"red"});
  drive.tag("folder/sub/deep", {"blue", "green"});
  const timespec times[2] = {{1, 0}, {1'000'000, 42}};
  for (const std::string& top : {drive.store, drive.outside}) {
    for (const auto& entry : std::filesystem::recursive_directory_iterator(top)) {
      ASSERT_EQ(::utimensat(AT_FDCWD, entry.path().c_str(), times, 0), 0);
    }
  }
  ASSERT_EQ(files.trash(drive.at("gone"), kRequest).error, nullptr);
  drive.write("gone", "second");
  ASSERT_EQ(::utimensat(AT_FDCWD, drive.at("gone").c_str(), times, 0), 0);
}

class Matrix : public ::testing::TestWithParam<std::tuple<std::size_t, Setting>> {
 protected:
  void SetUp() override {
    if (setting() == Setting::StagedInStore) stateBase = TestDrive::otherVolume();
    const bool needsTwo =
        setting() == Setting::StagedInStore || operation().name.starts_with("Across");
    if (needsTwo && TestDrive::otherVolume().empty()) GTEST_SKIP() << "no second volume";
    TestDrive drive(stateBase);
    furnish(drive, setting());
    before = drive.snapshot(true);
    const FileResult result = operation().run(drive);
    ASSERT_EQ(result.error, nullptr) << wordsOf(result.error);
    after = drive.snapshot(true);
    ASSERT_NE(before, after);
  }
  static Setting setting() { return std::get<1>(GetParam()); }
  const Operation& operation() const { return kOperations[std::get<0>(GetParam())]; }

  // Runs `body` in a process of its own. True when it came to its end.
  static bool runs(const std::function<void()>& body) {
    const pid_t child = ::fork();
    if (child == 0) {
      body();
      ::_exit(0);
    }
    int status = 0;
    EXPECT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_TRUE(WIFEXITED(status)) << "ended by a signal";
    const int code = WEXITSTATUS(status);
    EXPECT_TRUE(code == 0 || code == FaultyFileLayer::kCrashStatus) << code;
    return code == 0;
  }

  // After a restart on a sound disk.
  bool isAfterRecovery(TestDrive& drive) {
    drive.files.failAt(0, 0);
    FileOperations& files = drive.open();
    EXPECT_TRUE(files.journal().openEntries(nullptr).empty());
    EXPECT_TRUE(std::filesystem::is_empty(drive.state + "/staging"));
    const auto now = drive.snapshot(true);
    EXPECT_TRUE(now == before || now == after) << "neither before nor after";
    return now == after;
  }

  std::string stateBase;
  std::map<std::string, std::string> before, after;
};

TEST_P(Matrix, ACrashAtAnyStepLeavesBeforeOrAfter) {
  std::uint64_t step = 1;
  bool wasAfter = false;
  for (bool finished = false; !finished; ++step) {
    SCOPED_TRACE("crash at step " + std::to_string(step));
    ASSERT_LT(step, 200u);
    TestDrive drive(stateBase);
    furnish(drive, setting());
    drive.operations.reset();  // a database must not be open across a fork
    finished = runs([&] {
      drive.open();
      drive.files.crashAt(step);
      operation().run(drive);
    });
    // The recovery itself crashes at each of its steps, then is let through.
    if (step % 3 == 0) {
      for (std::uint64_t again = 1; again < 200; ++again) {
        const bool recovered = runs([&] {
          drive.files.crashAt(again);
          drive.open();
        });
        if (recovered) break;
      }
    }
    const bool isAfter = isAfterRecovery(drive);
    EXPECT_GE(isAfter, wasAfter) << "what was done came undone at a later step";
    wasAfter = isAfter;
    EXPECT_TRUE(isAfter || !finished);
  }
  EXPECT_GE(step, operation().name == "SetTags" ? 3u : 4u) << "no step was crossed";
}

TEST_P(Matrix, AFailureAtAnyStepIsClearAndLeavesBeforeOrAfter) {
  const struct {
    int error;
    std::int64_t code;
  } faults[] = {{ENOSPC, 640}, {EACCES, 513}, {EIO, 512}};
  for (const auto& fault : faults) {
    for (const bool lasting : {false, true}) {
      bool met = true;
      for (std::uint64_t step = 1; met; ++step) {
        SCOPED_TRACE(std::string(::strerror(fault.error)) + (lasting ? " from" : " at") + " step " +
                     std::to_string(step));
        ASSERT_LT(step, 200u);
        TestDrive drive(stateBase);
        furnish(drive, setting());
        drive.files.failAt(step, fault.error, lasting);
        const FileResult result = operation().run(drive);
        met = drive.files.met();
        const auto now = drive.snapshot();
        if (result.error) {
          EXPECT_EQ(codeOf(result.error), fault.code);
          EXPECT_EQ(posixOf(result.error), fault.error);
          EXPECT_FALSE(wordsOf(result.error).empty());
          EXPECT_EQ(result.path, "");
        } else {
          EXPECT_EQ(now, after);
        }
        // A disk that goes on failing may keep an operation from taking back its change;
        // then the answer says so, and a restart sees to it.
        const bool perhaps =
            wordsOf(result.error).find("perhaps not for good") != std::string::npos;
        if (result.error && !lasting && operation().name != "SetTags") {
          EXPECT_EQ(now, before);
          EXPECT_FALSE(perhaps);
        }
        const bool isAfter = isAfterRecovery(drive);
        EXPECT_TRUE(isAfter || result.error);
      }
    }
  }
}

std::string nameOf(const ::testing::TestParamInfo<Matrix::ParamType>& info) {
  constexpr const char* kEndings[] = {"", "StagedInStore", "RenameReplaces"};
  const auto ending = static_cast<std::size_t>(std::get<1>(info.param));
  return kOperations[std::get<0>(info.param)].name + kEndings[ending];
}

INSTANTIATE_TEST_SUITE_P(Files, Matrix,
                         ::testing::Combine(::testing::Range(std::size_t{0}, kOperations.size()),
                                            ::testing::Values(Setting::Plain,
                                                              Setting::StagedInStore,
                                                              Setting::RenameReplaces)),
                         nameOf);

}  // namespace
}  // namespace skein::vald
