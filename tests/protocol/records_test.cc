// The cloud's records, across the socket.
#include <gtest/gtest.h>

#include "platform/cloudkit/CKError.h"
#include "tests/protocol/ProtocolTest.h"

namespace skein {
namespace {

class Records : public ProtocolTest {
 protected:
  FakeRecords& records() { return daemon->fakeRecords; }

  std::shared_ptr<NSProgress> fetch(DaemonClient& from, std::vector<std::string> names) {
    RecordQuery query;
    query.zone = zone;
    query.recordNames = std::move(names);
    query.desiredKeys = {"k1", "k2"};
    query.qualityOfService = 17;
    query.configuration = {0, false};
    query.group = "g";
    return from.remoteObjectProxyWithErrorHandler(fetched.errorHandler())
        ->records()
        .fetchRecords(std::move(query), fetched.reply());
  }
  FakeRecords::Fetch begun() {
    auto begun = records().fetches.take();
    EXPECT_TRUE(begun) << "vald was not asked";
    return begun ? std::move(*begun) : FakeRecords::Fetch();
  }

  const CKRecordZoneID zone{"z \xff", "ada"};
  Outcome<std::vector<FetchedRecord>, NSErrorPtr> fetched;
};

TEST_F(Records, IdentifiersOfSeveralZonesCross) {
  const auto document = VLFileObjectID::documentWithRawID;
  records().recordIDs = {{document(1), {"a", zone}},
                         {document(2), {"b", {"documents", CKCurrentUserDefaultName}}},
                         {document(3), {"c", zone}}};
  using RecordIDs = std::optional<VLContentRecordIDs>;
  const auto resolve = [&](std::size_t count) {
    return ask<RecordIDs, NSErrorPtr>(*client, [&](LocalDaemon& proxy, auto reply) {
      proxy.resolveFileObjectIDsToContentRecordIDs({count, document(7)}, std::move(reply));
    });
  };
  EXPECT_EQ(resolve(3), std::tuple(records().recordIDs, NSErrorPtr()));
  EXPECT_EQ(records().resolutions.take(), std::vector(3, document(7)));
  records().recordIDs.emplace();
  EXPECT_EQ(std::get<0>(resolve(1)), VLContentRecordIDs());
  records().recordIDs.reset();
  records().error = NSError::errorWithDomain(CKErrorDomain, CKErrorNetworkUnavailable);
  const auto [none, error] = resolve(1);
  EXPECT_FALSE(none);
  EXPECT_EQ(error->code(), CKErrorNetworkUnavailable);
  // As many as one call may name, and one more.
  EXPECT_EQ(std::get<1>(resolve(LocalRecords::kMostRecords))->code(), CKErrorNetworkUnavailable);
  EXPECT_EQ(std::get<1>(resolve(LocalRecords::kMostRecords + 1))->code(),
            VLVellumErrorInvalidParameter);
}

TEST_F(Records, AQueryAndItsRecordsCrossAsTheyAre) {
  fetch(*client, {"a", "b"});
  auto [query, reply] = begun();
  EXPECT_EQ(query.zone, zone);
  EXPECT_EQ(query.recordNames, (std::vector<std::string>{"a", "b"}));
  EXPECT_EQ(query.desiredKeys, (std::vector<std::string>{"k1", "k2"}));
  EXPECT_EQ(query.qualityOfService, 17);
  EXPECT_EQ(query.configuration.discretionaryNetworkBehavior, 0);
  EXPECT_FALSE(query.configuration.automaticallyRetryNetworkFailures);
  EXPECT_EQ(query.group, "g");

  const CKRecordID a{"a", zone};
  const auto asset = [](NSURLPtr url) {
    return std::make_shared<const CKAsset>(CKAsset{std::move(url)});
  };
  reply({{a,
          std::make_shared<CKRecord>(a,
                                     std::map<std::string, CKRecord::Value>{
                                         {"asset", asset(NSURL::fileURLWithPath("/t/\xfe"))},
                                         {"missing", asset(nullptr)},
                                         {"number", std::int64_t{-5}},
                                         {"text", std::string("x\0y", 3)}}),
          nullptr},
         {{"b", zone}, nullptr, NSError::errorWithDomain(CKErrorDomain, CKErrorUnknownItem)}},
        nullptr);
  const auto [records, error] = fetched.value();
  EXPECT_FALSE(error);
  const auto& got = records;
  ASSERT_EQ(got.size(), 2U);
  EXPECT_EQ(got[0].recordID, a);
  const auto assetURL = [&got](const char* key) {
    return std::get<std::shared_ptr<const CKAsset>>(*got[0].record->objectForKey(key))->fileURL;
  };
  EXPECT_EQ(assetURL("asset")->path(), "/t/\xfe");
  EXPECT_FALSE(assetURL("missing"));
  EXPECT_EQ(std::get<std::int64_t>(*got[0].record->objectForKey("number")), -5);
  EXPECT_EQ(std::get<std::string>(*got[0].record->objectForKey("text")), std::string("x\0y", 3));
  EXPECT_FALSE(got[1].record);
  EXPECT_EQ(got[1].error->code(), CKErrorUnknownItem);
}

TEST_F(Records, CancellingAndGoingAwayReachTheFetch) {
  const auto progress = fetch(*client, {"a"});
  auto first = begun();
  progress->cancel();
  ASSERT_TRUE(records().cancellations.waitForCount(1));
  first.reply({}, NSError::errorWithDomain(CKErrorDomain, CKErrorOperationCancelled));
  EXPECT_EQ(std::get<1>(fetched.value())->code(), CKErrorOperationCancelled);
  // Too late.
  progress->cancel();

  // At once, maybe before it was sent.
  fetch(*client, {"a"})->cancel();
  auto second = begun();
  ASSERT_TRUE(records().cancellations.waitForCount(2));
  second.reply({}, nullptr);
  fetched.value();

  fetch(*client, {"a"});
  auto third = begun();
  client.reset();
  ASSERT_TRUE(records().cancellations.waitForCount(3));
  ASSERT_TRUE(fetched.errors->waitForCount(1));
  unreachable(*fetched.errors->take());
  third.reply({}, nullptr);
  EXPECT_EQ(fetched.replies->count(), 0U);
}

}  // namespace
}  // namespace skein
