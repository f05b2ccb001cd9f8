// What was read of a folder before the disk changed, and arrives after.
#include "linux/vald/scan/Reconciler.h"

#include <fcntl.h>

#include "linux/vald/index/IndexFile.h"
#include "tests/vald/StoreFixture.h"

namespace skein::vald {
namespace {

using namespace std::chrono_literals;

// An index and its reconciler over the fixture's folder, without the store's threads.
class OldSnapshots : public StoreFixture {
 protected:
  void SetUp() override {
    StoreFixture::SetUp();
    makeFolder("a");
    makeFolder("b");
    write("a/doc");
    write("a/saved");
    NSErrorPtr error;
    database = openIndexFile(options.databasePath, log, &error);
    ASSERT_NE(database, nullptr);
    ASSERT_TRUE(buildSecondaryIndexes(*database));
    rig = std::make_unique<Rig>(*database);
    int code = 0;
    const auto drive = findRoot(root, code);
    ASSERT_TRUE(drive);
    FolderRow row;
    row.key = drive->key;
    rig->folders.add(std::move(row));
    rig->folders.setRoot(kDriveFolder, {*drive, std::nullopt, false});
    accept(kDriveFolder, read(""), false);
    a = rig->index.rowsNamed(kDriveFolder, "a").at(0).folder;
    b = rig->index.rowsNamed(kDriveFolder, "b").at(0).folder;
    accept(a, read("a"), false);
    accept(b, read("b"), false);
  }
  void TearDown() override {
    rig.reset();
    database.reset();
    StoreFixture::TearDown();
  }

  FolderSnapshot read(const std::string& folder) {
    const FileDescriptor handle(::open(at(folder).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    return readFolder(handle.get(), Detail::Quick);
  }
  bool accept(FolderKey folder, const FolderSnapshot& snapshot, bool isOld) {
    const bool isGathered = rig->reconciler.addFolder(folder, snapshot, isOld);
    rig->reconciler.decide(false);
    return isGathered;
  }
  // As the watcher tells of names.
  void look(const std::vector<std::pair<FolderKey, std::string>>& names) {
    for (const auto& [folder, name] : names) {
      FileState state;
      const bool isThere = rig->disk.at(folder, name, state) == Look::Seen;
      rig->reconciler.addName(folder, name, isThere ? std::optional(state) : std::nullopt);
    }
    rig->reconciler.decide(false);
  }
  std::vector<std::string> namesIn(FolderKey folder) {
    std::vector<std::string> names;
    for (const ItemRow& row : rig->index.childrenOf(folder)) names.push_back(row.name);
    return names;
  }
  ItemRow row(FolderKey folder, const std::string& name) {
    return rig->index.rowsNamed(folder, name).at(0);
  }

  struct Rig {
    explicit Rig(SqliteDatabase& database) : index(database) {}
    IndexWriter index;
    FolderTable folders;
    Disk disk{folders};
    Journal journal{index, folders};
    Details details{index, disk};
    Reconciler reconciler{index, journal, folders, disk, details, 2000ms, [] { return 1; }};
  };
  std::unique_ptr<SqliteDatabase> database;
  std::unique_ptr<Rig> rig;
  FolderKey a = kNoFolder;
  FolderKey b = kNoFolder;
};

TEST_F(OldSnapshots, BringNothingBackThatMovedOrWasSavedSince) {
  const VLFileObjectID doc = row(a, "doc").id;
  const FolderSnapshot old = read("a");
  rename("a/doc", "b/doc");
  write("a/fresh");
  rename("a/fresh", "a/saved");
  write("a/new");
  look({{a, "doc"}, {b, "doc"}, {a, "saved"}, {a, "new"}});
  const ItemRow saved = row(a, "saved");

  EXPECT_TRUE(accept(a, old, true));
  EXPECT_EQ(namesIn(a), (std::vector<std::string>{"new", "saved"}));
  EXPECT_EQ(namesIn(b), std::vector<std::string>{"doc"});
  EXPECT_EQ(row(b, "doc").id, doc);
  EXPECT_TRUE(row(a, "saved").state.key.names(saved.state.key));
  EXPECT_EQ(row(a, "saved").rank, saved.rank);
}

TEST_F(OldSnapshots, TellWhatIsStillSo) {
  remove("a/doc");
  write("a/new");
  EXPECT_TRUE(accept(a, read("a"), true));
  EXPECT_EQ(namesIn(a), (std::vector<std::string>{"new", "saved"}));
}

// Two old documents change places twice: what is decided after the first and was seen before the
// second must not take one's file for the other's save.
TEST_F(OldSnapshots, OfNamesThatWentOnGiveNoFileToAnotherDocument) {
  const ItemRow doc = row(a, "doc");
  const ItemRow saved = row(a, "saved");
  exchange("a/doc", "a/saved");
  FileState state;
  ASSERT_EQ(rig->disk.at(a, "doc", state), Look::Seen);
  rig->reconciler.addName(a, "doc", state);
  exchange("a/doc", "a/saved");
  rig->reconciler.decide(false);
  EXPECT_EQ(row(a, "doc").id, doc.id);
  EXPECT_TRUE(row(a, "doc").state.key.names(doc.state.key));
  EXPECT_EQ(row(a, "saved").id, saved.id);
  EXPECT_TRUE(row(a, "saved").state.key.names(saved.state.key));
}

// Until its parent's change is seen nothing is known of what is in it.
TEST_F(OldSnapshots, OfAFolderThatIsOnItsWayAreLeftForLater) {
  write("a/new");
  const FolderSnapshot old = read("a");
  rename("a", "b/a");
  EXPECT_FALSE(accept(a, old, true));
  EXPECT_EQ(namesIn(a), (std::vector<std::string>{"doc", "saved"}));
}

}  // namespace
}  // namespace skein::vald
