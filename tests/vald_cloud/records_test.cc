// Records as clients fetch them: which there are, what they have, and how a fetch ends.
#include <gtest/gtest.h>

#include <fstream>
#include <map>
#include <optional>

#include "base/ThreadPool.h"
#include "linux/vald/FaultInjector.h"
#include "linux/vald/cloud/RecordFetches.h"
#include "platform/cloudkit/CKError.h"
#include "tests/vald_cloud/CloudRig.h"

namespace skein::vald {
namespace {

struct FetchingRecords : testing::Test {
  // A document of `size` bytes with a record; uploads leave it without a thumbnail.
  void add(std::uint64_t number, std::size_t size) {
    const std::string path = rig.write(std::to_string(number), std::string(size, 'x'));
    ASSERT_TRUE(std::holds_alternative<UploadDone>(rig.upload(documentNumber(number), path)));
  }
  struct Answer {
    Event came;
    std::vector<FetchedRecord> records;
    NSErrorPtr error;
  };
  std::pair<std::shared_ptr<Answer>, std::shared_ptr<NSProgress>> fetch(
      const CKRecordZoneID& zone, std::vector<std::string> names) {
    RecordQuery query;
    query.zone = zone;
    query.recordNames = std::move(names);
    query.desiredKeys = {kVLRecordKeyThumbnail1024x1024, kVLRecordKeySize};
    auto answer = std::make_shared<Answer>();
    auto progress =
        fetches.fetchRecords(query, [answer](std::vector<FetchedRecord> records, NSErrorPtr error) {
          answer->records = std::move(records);
          answer->error = std::move(error);
          answer->came.set();
        });
    return {std::move(answer), std::move(progress)};
  }
  std::shared_ptr<Answer> fetched(const CKRecordZoneID& zone, std::vector<std::string> names) {
    auto answer = fetch(zone, std::move(names)).first;
    EXPECT_TRUE(answer->came.wait());
    return answer;
  }
  void plan(const std::string& zone, FaultInjection::Action action) {
    ASSERT_EQ(brief(faults.plan({"fetchRecords " + zone, action, "D", 7, 5000, 1})), "none");
  }

  TemporaryFolder folder;
  CloudRig rig{folder.path()};
  FaultInjector faults{true};
  std::shared_ptr<Executor> executor = std::make_shared<ThreadPool>(1, "records");
  std::map<VLFileObjectID, CKRecordZoneID> attached;  // the zones that documents are in
  const RecordFetches::ZoneFinder zoneFinder =
      [this](VLFileObjectID document) -> std::optional<CKRecordZoneID> {
    const auto zone = attached.find(document);
    if (zone == attached.end()) return std::nullopt;
    return zone->second;
  };
  RecordFetches fetches{{executor, *rig.records, rig.conditions, rig.clock, faults,
                         [this] { return Outcome<RecordFetches::ZoneFinder>(zoneFinder); }}};
  const CKRecordZoneID own{kDocumentsZone, CKCurrentUserDefaultName};
  const CKRecordZoneID others{"trip", "ada"};
  const std::string one = documentNumber(1).asString();
  const std::string two = documentNumber(2).asString();
};

TEST_F(FetchingRecords, DocumentsHaveTheirRecordInTheirOwnersZone) {
  add(1, 5);
  add(2, 0);
  attached.emplace(documentNumber(2), others);
  std::optional<VLContentRecordIDs> recordIDs;
  Event came;
  fetches.resolveFileObjectIDsToContentRecordIDs(
      {documentNumber(1), documentNumber(2), documentNumber(3)},
      [&](std::optional<VLContentRecordIDs> got, const NSErrorPtr&) {
        recordIDs = std::move(got);
        came.set();
      });
  ASSERT_TRUE(came.wait());
  EXPECT_EQ(recordIDs, (VLContentRecordIDs{{documentNumber(1), {one, own}},
                                           {documentNumber(2), {two, others}}}));
}

TEST_F(FetchingRecords, OneEntryForEachNameWithTheKeysThatItHas) {
  add(1, 5);
  add(2, 3);
  attached.emplace(documentNumber(2), others);
  const auto hash = (*rig.records->record(documentNumber(1)))->contents.hash;
  rig.records->setThumbnail(documentNumber(1), hash, "/thumbnails/1");
  const auto answer = fetched(own, {two, one, "nonsense"});
  ASSERT_EQ(brief(answer->error), "none");
  ASSERT_EQ(answer->records.size(), 3U);
  // Known in its own zone alone.
  EXPECT_EQ(answer->records[0].recordID.recordName, two);
  EXPECT_EQ(brief(answer->records[0].error), "CKErrorDomain 11");
  const CKRecord& record = *answer->records[1].record;
  EXPECT_EQ(std::get<std::int64_t>(*record.objectForKey(kVLRecordKeySize)), 5);
  EXPECT_EQ(
      std::get<std::shared_ptr<const CKAsset>>(*record.objectForKey(kVLRecordKeyThumbnail1024x1024))
          ->fileURL->path(),
      "/thumbnails/1");
  EXPECT_EQ(brief(answer->records[2].error), "CKErrorDomain 11");

  const auto shared = fetched(others, {two});
  EXPECT_EQ(shared->records[0].record->objectForKey(kVLRecordKeyThumbnail1024x1024), nullptr);
  EXPECT_EQ(fetches.fetches(), 2U);
}

TEST_F(FetchingRecords, AZoneFailsOrIsLateByItself) {
  add(1, 5);
  plan("trip:ada", FaultInjection::Action::AnswerError);
  EXPECT_EQ(brief(fetched(own, {one})->error), "none");
  EXPECT_EQ(brief(fetched(others, {one})->error), "D 7");
  EXPECT_EQ(brief(fetched(others, {one})->error), "none");
  EXPECT_NE(
      faults.plan({"fetchRecords trip:ada", FaultInjection::Action::DropConnection, "", 0, 0, 1}),
      nullptr);

  // A zone that is late holds up no other one, also on one thread.
  plan("trip:ada", FaultInjection::Action::Delay);
  const auto [late, progress] = fetch(others, {one});
  ASSERT_TRUE(rig.clock.waitForTimer());
  EXPECT_EQ(brief(fetched(own, {one})->error), "none");
  rig.clock.advance(std::chrono::seconds(5));
  ASSERT_TRUE(late->came.wait());
  EXPECT_EQ(late->records.size(), 1U);

  rig.conditions.change([](auto& settings) { settings.offline = true; });
  EXPECT_EQ(brief(fetched(own, {one})->error), "NSCocoaErrorDomain 4355");
}

TEST_F(FetchingRecords, CancellingEndsTheWaitAtOnce) {
  plan("trip:ada", FaultInjection::Action::Delay);
  const auto [late, progress] = fetch(others, {one});
  ASSERT_TRUE(rig.clock.waitForTimer());
  progress->cancel();
  ASSERT_TRUE(late->came.wait());
  EXPECT_EQ(brief(late->error), "CKErrorDomain 20");
}

}  // namespace
}  // namespace skein::vald
