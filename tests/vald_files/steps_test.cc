// In which order what reaches the disk: a step, or a wait, that is left out loses documents
// only when the power fails, which no other test sees.
#include <functional>
#include <regex>

#include "tests/vald_cloud/DiskWaits.h"
#include "tests/vald_files/FilesFixture.h"

namespace skein::vald {
namespace {

using Steps = std::vector<std::string>;

const FileRequest kPlain{"a test", {}, {}};

// Every step, and of what: for a sync the path, with the roots' folders and the state's by their
// names; numbers that are drawn as "N". "commit" is a wait that the journal asked for. How contents
// are copied is the file systems' matter, so it is one "write".
Steps stepsOf(TestDrive& drive, const std::function<FileResult()>& operation) {
  Steps steps;
  std::uint64_t expected = diskWaits();
  const auto noteCommits = [&] {
    if (diskWaits() != expected) steps.emplace_back("commit");
    expected = diskWaits();
  };
  const auto worded = [&](std::string text) {
    for (const std::string* folder : {&drive.store, &drive.state, &drive.container}) {
      const std::size_t at = text.find(*folder);
      const std::string name = folder == &drive.store   ? "store"
                               : folder == &drive.state ? "state"
                                                        : "container";
      if (at != std::string::npos) text.replace(at, folder->size(), name);
    }
    text = std::regex_replace(text, std::regex("\\.Trash-[0-9]+"), ".Trash");
    return std::regex_replace(text, std::regex("(import|removed)-[0-9a-f]{16}"), "$1-N");
  };
  drive.files.before = [&](FileStep step, std::string_view name) {
    noteCommits();
    std::string text(fileStepName(step == FileStep::Clone ? FileStep::Write : step));
    if (step == FileStep::Sync) {
      ++expected;  // it follows now
      text += ' ' + std::filesystem::read_symlink(name).string();
    } else if (!name.empty()) {
      text += ' ' + std::string(name);
    }
    text = worded(text);
    if (steps.empty() || text != "write" || steps.back() != "write") steps.push_back(text);
  };
  const FileResult result = operation();
  EXPECT_EQ(wordsOf(result.error), "");
  noteCommits();
  drive.files.before = nullptr;
  return steps;
}

TEST(Steps, OfEveryOperationAreAllThereAndInOrder) {
  using Operation = std::function<FileResult(TestDrive&, FileOperations&)>;
  const std::string import = ".skein-import-N";
  const std::string removed = ".skein-removed-N";
  const struct {
    std::string name;
    Operation run;
    Steps steps;
  } operations[] = {
      {"rename",
       [](TestDrive& drive, FileOperations& files) {
         return files.rename(drive.at("a"), "b", kPlain);
       },
       {"journal begin rename", "rename a", "sync store", "journal end"}},
      {"move",
       [](TestDrive& drive, FileOperations& files) {
         return files.move(drive.at("a"), drive.at("folder"), {}, false, kPlain);
       },
       {"journal begin move", "rename a", "sync store/folder", "sync store", "journal end"}},
      {"move between volumes",
       [](TestDrive& drive, FileOperations& files) {
         return files.move(drive.at("a"), drive.container, {}, false, kPlain);
       },
       {"journal begin move", "commit", "create file " + import, "write",
        "set attribute user.xdg.tags", "set mode", "set times", "sync container/" + import,
        "rename a", "sync store", "rename " + import, "sync container", "unlink " + removed,
        "journal end"}},
      {"trash",
       [](TestDrive& drive, FileOperations& files) { return files.trash(drive.at("a"), kPlain); },
       {"make folder .Trash", "make folder files", "make folder info", "journal begin trash",
        "commit", "create file a.trashinfo", "write", "sync store/.Trash/info/a.trashinfo",
        "sync store/.Trash/info", "rename a", "sync store/.Trash/files", "sync store",
        "journal end"}},
      {"put back",
       [](TestDrive& drive, FileOperations& files) {
         const std::string trash = trashFolderName(::geteuid());
         return files.move(drive.at(trash + "/files/gone"), drive.store, {}, false, kPlain);
       },
       {"journal begin put back", "commit", "rename gone", "sync store", "sync store/.Trash/files",
        "unlink gone.trashinfo", "sync store/.Trash/info", "journal end"}},
      {"remove",
       [](TestDrive& drive, FileOperations& files) { return files.remove(drive.at("a"), kPlain); },
       {"journal begin remove", "commit", "rename a", "sync store", "sync state/staging",
        "journal mark", "commit", "unlink " + removed, "journal end"}},
      {"remove a tree",
       [](TestDrive& drive, FileOperations& files) {
         return files.remove(drive.at("folder"), kPlain);
       },
       {"journal begin remove", "commit", "rename folder", "sync store", "sync state/staging",
        "journal mark", "commit", "unlink b", "remove folder " + removed, "journal end"}},
      {"import",
       [](TestDrive& drive, FileOperations& files) {
         return files.importDocument(drive.outside + "/tree", drive.store, {}, kPlain);
       },
       {"journal begin import", "commit", "make folder " + import, "create file one", "write",
        "set mode", "set times", "set mode", "set times", "sync state/staging/" + import + "/one",
        "sync state/staging/" + import, "rename " + import, "sync store", "journal end"}},
      {"create folder",
       [](TestDrive& drive, FileOperations& files) {
         return files.createFolder(drive.store, "new", kPlain);
       },
       {"journal begin create folder", "make folder new", "sync store", "journal end"}},
      {"make alias",
       [](TestDrive& drive, FileOperations& files) {
         return files.makeAlias(drive.store, "alias", "/target", kPlain);
       },
       {"journal begin make alias", "make link alias", "sync store", "journal end"}},
  };
  for (const auto& [name, run, expected] : operations) {
    SCOPED_TRACE(name);
    if (name == "move between volumes" && TestDrive::otherVolume().empty()) continue;
    TestDrive drive;
    FileOperations& files = drive.open();
    drive.write("a", "words");
    drive.write("folder/b", "more");
    drive.write("gone", "first");
    TestDrive::put(drive.outside + "/tree/one", "one");
    drive.tag("a", {"red"});
    ASSERT_EQ(wordsOf(files.trash(drive.at("gone"), kPlain).error), "");
    EXPECT_EQ(stepsOf(drive, [&, &perform = run] { return perform(drive, files); }), expected);
  }
}

}  // namespace
}  // namespace skein::vald
