// The cloud's two halves: contents by hash, and the records that refer to them.
#include <fcntl.h>
#include <unistd.h>

#include <fstream>

#include "tests/vald_cloud/CloudRig.h"

namespace skein::vald {
namespace {

class Unhindered final : public StreamObserver {
 public:
  NSErrorPtr didPass(std::uint64_t) override { return nullptr; }
};

class ContentsTest : public testing::Test {
 protected:
  std::size_t objects() const {
    std::size_t count = 0;
    for (const auto& entry :
         std::filesystem::recursive_directory_iterator(rig.top / "cloud/objects")) {
      count += entry.is_regular_file() ? 1 : 0;
    }
    return count;
  }
  bool incomingIsEmpty() const { return std::filesystem::is_empty(rig.top / "cloud/incoming"); }
  void upload(std::uint64_t number, const std::string& path) {
    ASSERT_TRUE(std::holds_alternative<UploadDone>(rig.upload(documentNumber(number), path)));
  }
  CloudContents::Garbage collect() { return rig.collect(std::chrono::nanoseconds(0), 0)->freed; }

  TemporaryFolder folder;
  CloudRig rig{folder.path()};
  Unhindered unhindered;
};

TEST_F(ContentsTest, EqualContentsAreKeptOnceAndGoWithTheirLastRecord) {
  const std::string large(700'000, 'x');  // several pieces
  upload(1, rig.write("a", large));
  upload(2, rig.write("b", large));
  upload(3, rig.write("c", ""));
  EXPECT_EQ(objects(), 2u);
  EXPECT_TRUE(incomingIsEmpty());
  EXPECT_EQ(rig.records->usedBytes(), 2 * large.size());
  const auto hash = (*rig.records->record(documentNumber(1)))->contents.hash;
  EXPECT_EQ(*rig.records->references(hash), 2u);
  EXPECT_EQ((*rig.records->record(documentNumber(3)))->contents.hash.asString(),
            "e3b0c44298fc1c149afbf4c8996fb92427ae41e4649b934ca495991b7852b855");

  ASSERT_EQ(brief(rig.records->remove(documentNumber(1))), "none");
  EXPECT_EQ(collect().files, 0u);
  auto hold = rig.contents->hold({hash, large.size()});
  ASSERT_TRUE(hold);
  ASSERT_EQ(brief(rig.records->remove(documentNumber(2))), "none");
  EXPECT_EQ(collect().files, 0u);  // a record for them may come yet
  hold.reset();
  const auto garbage = collect();
  EXPECT_EQ(garbage.files, 1u);
  EXPECT_EQ(garbage.bytes, large.size());
  EXPECT_EQ(objects(), 1u);
  EXPECT_EQ(brief(rig.contents->read(hash).error()), "NSCocoaErrorDomain 4");
  EXPECT_EQ(rig.records->usedBytes(), 0u);
}

TEST_F(ContentsTest, WhatTheDiskRefusesWhileContentsAreCopiedIsTold) {
  // The sync at the end would not hear of it again.
  class Unwritable final : public FileLayer {
    int beforeStep(FileStep step, std::string_view) override {
      return step == FileStep::Sync ? EIO : 0;
    }
  } files;
  const std::string path = folder.path() / "large";
  std::ofstream(path, std::ios::binary) << std::string(9 << 20, 'x');
  const FileDescriptor from(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
  const FileDescriptor to(::open((path + " copy").c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600));
  EXPECT_TRUE(copyContents(rig.files, from.get(), to.get(), "large", unhindered));
  const auto refused = copyContents(files, from.get(), to.get(), "large", unhindered);
  ASSERT_FALSE(refused);
  EXPECT_NE(refused.error()->localizedDescription().find("large"), std::string::npos);
}

TEST_F(ContentsTest, SpoiledContentsAreFoundAndLeftoversGoAtTheOpening) {
  upload(1, rig.write("a", "words"));
  const auto hash = (*rig.records->record(documentNumber(1)))->contents.hash;
  EXPECT_EQ(brief(rig.contents->verify(hash, unhindered)), "none");
  const auto object = rig.top / "cloud/objects" / hash.asString().substr(0, 2) / hash.asString();
  std::filesystem::permissions(object, std::filesystem::perms::owner_all);
  std::ofstream(object) << "wordz";
  EXPECT_EQ(brief(rig.contents->verify(hash, unhindered)), "NSCocoaErrorDomain 259");

  std::ofstream(rig.top / "cloud/incoming/17") << "half";
  rig.contents.reset();
  const auto cloud = rig.top / "cloud";
  std::filesystem::permissions(cloud, std::filesystem::perms::all);
  ASSERT_TRUE(CloudContents::open(cloud.string(), rig.files));
  EXPECT_TRUE(incomingIsEmpty());
  EXPECT_EQ(std::filesystem::status(cloud).permissions(), std::filesystem::perms::owner_all);
  // A key of somebody else's, who could forge markers with it.
  if (geteuid() != 0) return;
  ASSERT_EQ(chown((cloud / "key").c_str(), 12345, 12345), 0);
  EXPECT_FALSE(CloudContents::open(cloud.string(), rig.files));
}

TEST_F(ContentsTest, ARecordKeepsItsPlaceAndCountsItsRevisions) {
  const std::string path = rig.write("a", "one");
  const VLFileObjectID document = documentNumber(0xffffffffffffffff);
  ASSERT_TRUE(std::holds_alternative<UploadDone>(rig.upload(document, path)));
  const auto first = **rig.records->record(document);
  EXPECT_EQ(rig.records->documentsWithoutThumbnail(std::nullopt, 9)->size(), 1u);
  EXPECT_EQ(rig.records->documentsWithoutThumbnail(document, 9)->size(), 0u);
  ASSERT_EQ(brief(rig.records->setThumbnail(document, first.contents.hash, "/thumbnails/1")),
            "none");
  EXPECT_EQ(first.revision, 1);
  EXPECT_EQ(first.recordID(),
            (CKRecordID{"dffffffffffffffff", {kDocumentsZone, CKCurrentUserDefaultName}}));
  EXPECT_TRUE(first.created);

  setTags(path, "red");  // the file differs, its contents do not
  ASSERT_TRUE(std::holds_alternative<UploadDone>(rig.upload(document, path)));
  EXPECT_EQ((*rig.records->record(document))->revision, 1);
  EXPECT_EQ((*rig.records->record(document))->thumbnail, "/thumbnails/1");
  rig.write("a", "two");
  ASSERT_TRUE(std::holds_alternative<UploadDone>(rig.upload(document, path)));
  // One of the first revision that comes late.
  ASSERT_EQ(brief(rig.records->setThumbnail(document, first.contents.hash, "/thumbnails/1")),
            "none");

  // All of it is there for the next process.
  rig.records.reset();  // one connection at a time
  rig.records = std::move(*CloudRecords::open((rig.top / "cloud/records").string()));
  const auto second = **rig.records->record(document);
  EXPECT_EQ(second.revision, 2);
  EXPECT_FALSE(second.thumbnail);
  EXPECT_EQ(rig.records->usedBytes(), 3u);
  EXPECT_EQ(rig.records->recordsInZone(first.zone)->size(), 1u);
  EXPECT_EQ(rig.records->recordsInZone({kDocumentsZone, "somebody"})->size(), 0u);
  EXPECT_EQ(rig.records->records({documentNumber(5), document})->size(), 1u);
  EXPECT_FALSE(*rig.records->stamp(documentNumber(5)));
}

TEST_F(ContentsTest, WhatFailsHalfWayIsNotRecorded) {
  const auto database = CloudDatabase::open(folder.path() / "half", {"CREATE TABLE one(x)"});
  ASSERT_TRUE(database);
  const auto insert = [&](const char* after) {
    return (*database)->transact([&] {
      EXPECT_EQ(brief((*database)->execute("INSERT INTO one VALUES(1)")), "none");
      return (*database)->execute(after);
    });
  };
  EXPECT_NE(insert("nonsense"), nullptr);
  EXPECT_EQ(brief(insert("SELECT 1")), "none");
  const auto count = (*database)->prepare("SELECT COUNT(*) FROM one");
  ASSERT_TRUE(count->step());
  EXPECT_EQ(count->integer(0), 1);
}

TEST_F(ContentsTest, RecordsOfANewerProgramAreRefused) {
  const std::string path = (folder.path() / "newer").string();
  ASSERT_TRUE(CloudDatabase::open(path, {"CREATE TABLE one(x)", "CREATE TABLE two(x)"}));
  const auto older = CloudDatabase::open(path, {"CREATE TABLE one(x)"});
  ASSERT_FALSE(older);
  EXPECT_NE(older.error()->localizedDescription().find("newer version"), std::string::npos);
}

}  // namespace
}  // namespace skein::vald
