// Batches: what is answered here, what is asked of the cloud, and how it ends.
#include <gtest/gtest.h>

#include <algorithm>

#include "tests/thumbnails/ThumbnailFixture.h"

namespace skein {
namespace {

const std::string kOne = documentID(1);
const std::string kTwo = documentID(2);

struct ThumbnailBatches : ThumbnailFixture {
  // A batch of one zone under way.
  std::shared_ptr<ScriptedFetch> fetchInOneZone(std::initializer_list<std::uint64_t> numbers) {
    answerWithRecords(inOneZone(numbers));
    std::vector<std::string> identifiers;
    for (const std::uint64_t number : numbers) identifiers.push_back(documentID(number));
    progress = fetch(identifiers);
    take();
    return framework.cloud.privateDatabase.next();
  }
  void addItem(std::uint64_t number, const std::string& type) {
    VLQueryItem::Properties properties;
    properties.fileObjectID = VLFileObjectID::documentWithRawID(number);
    properties.typeIdentifier = type;
    framework.queryItems.items["/store/" + std::to_string(number)] =
        std::make_shared<VLQueryItem>(std::move(properties));
  }
  std::shared_ptr<NSProgress> progress;
};

TEST_F(ThumbnailBatches, WhatNeedsNoCloudIsAnsweredAtOnce) {
  fetch({});
  EXPECT_EQ(take(),
            (Lines{"[DEBUG] ┏1 starting fetch thumbnail for ()",
                   "[DEBUG] no thumbnail left to fetch", "completed: no error", "[DEBUG] ┗1 "}));
  const std::string folder = "i0000000000000007";
  const std::string root = NSFileProviderRootContainerItemIdentifier;
  EXPECT_EQ(fetch({folder, folder, root})->totalUnitCount(), 0);
  EXPECT_EQ(takeCalls(),
            (Lines{"thumbnail of " + folder + ": no data, no type, no error",
                   "thumbnail of " + folder + ": no data, no type, no error", "containers: table",
                   "thumbnail of " + root + ": no data, no type, NSFileProviderErrorDomain -1005",
                   "completed: no error"}));
  host.fetchThumbnailsForItemIdentifiersWithType({folder, "unknown"}, {}, nullptr, nullptr);
  EXPECT_EQ(takeCalls(), Lines{});
}

TEST_F(ThumbnailBatches, WithoutRecordIDsTheBatchEndsWithTheDaemonsError) {
  answerWithRecords(std::nullopt, NSError::errorWithDomain(NSCocoaErrorDomain, 4355));
  fetch({kOne, "i0000000000000007", kTwo});
  Lines lines = take();
  std::erase_if(lines, [](const std::string& line) { return line.starts_with("[DEBUG] ┗"); });
  ASSERT_EQ(lines.size(), 5u);
  EXPECT_EQ(lines[1], "thumbnail of i0000000000000007: no data, no type, no error");
  EXPECT_EQ(lines[2], "daemon: content records of (" + kOne + ", " + kTwo + ")");
  EXPECT_TRUE(
      lines[3].starts_with("[ERROR] can't get the record ids for (" + kOne + ", " + kTwo + "): "));
  EXPECT_EQ(lines[4], "completed: NSFileProviderErrorDomain -1004 under NSCocoaErrorDomain 4355");

  // Neither records nor an error; a connection that fails.
  answerWithRecords(std::nullopt);
  fetch({kOne});
  EXPECT_EQ(takeCalls().back(), "completed: no error");
  framework.daemon.contentRecords.handTo([&](const auto& call) { call->fail(cloudError); });
  fetch({kOne});
  EXPECT_EQ(takeCalls().back(), "completed: CKErrorDomain 3");
  // Records of nothing are records.
  answerWithRecords(VLContentRecordIDs());
  fetch({kOne});
  EXPECT_EQ(takeCalls().back(), "completed: no error");
}

TEST_F(ThumbnailBatches, OneOperationPerZoneInTheDatabaseOfItsOwner) {
  VLContentRecordIDs records = inOneZone({1, 3});
  records.emplace(VLFileObjectID::documentWithRawID(2), recordID(2, others));
  answerWithRecords(records);
  fetch({kOne, kTwo, documentID(3)});
  const std::string scheduling = "[DEBUG] scheduling operation <CKFetchRecordsOperation: ";
  const std::string settings =
      "cloud: quality 17, discretionary 0, no retries, group DownloadThumbnailsUserInitiated";
  // The lookups have taken 3 to 7.
  EXPECT_EQ(
      take(),
      (Lines{"[DEBUG] ┏1 starting fetch thumbnail for (" + kOne + ", " + kTwo + ", " +
                 documentID(3) + ")",
             "[DEBUG] ┗3 ", "[DEBUG] ┗5 ", "[DEBUG] ┗7 ",
             "daemon: content records of (" + kOne + ", " + kTwo + ", " + documentID(3) + ")",
             "[DEBUG] ┣9 fetching the thumbnails for: {" + kOne +
                 " = <CKRecordID: 1 in documents:__defaultOwner__>; " + kTwo +
                 " = <CKRecordID: 2 in documents:ada>; " + documentID(3) +
                 " = <CKRecordID: 3 in documents:__defaultOwner__>}",
             "cloud: container com.tessel.skein.documents",
             scheduling + "2 records> for zone: <CKRecordZoneID: documents:__defaultOwner__>",
             "cloud: private fetches 1 3, keys (thumbnail1024x1024, size)", settings,
             scheduling + "1 records> for zone: <CKRecordZoneID: documents:ada>",
             "cloud: shared fetches 2, keys (thumbnail1024x1024, size)", settings, "[DEBUG] ┗1 "}));

  const auto mine = framework.cloud.privateDatabase.next();
  mine->record("1", thumbnail("picture"));
  EXPECT_EQ(take(),
            (Lines{"[DEBUG] ┳9 received a thumbnail callback for <CKRecordID: 1 in "
                   "documents:__defaultOwner__>",
                   "[DEBUG] received a thumbnail of 7 bytes for " + kOne,
                   "thumbnail of " + kOne + ": \"picture\", no type, no error", "[DEBUG] ┗9 "}));
  mine->finish();
  EXPECT_EQ(take(), (Lines{"[DEBUG] ┳9 completed fetching thumbnail batch for <CKRecordZoneID: "
                           "documents:__defaultOwner__>",
                           "[DEBUG] ┗9 "}));
  // The end comes on the extension's queue, not on the cloud's thread.
  framework.cloud.sharedDatabase.next()->finish();
  EXPECT_EQ(env.transcript.take().size(), 2u);
  EXPECT_EQ(take(), (Lines{"[DEBUG] ┳9 completed fetching thumbnail batch", "completed: no error",
                           "[DEBUG] ┗9 "}));
}

TEST_F(ThumbnailBatches, ARecordWithoutAPicture) {
  const auto operation = fetchInOneZone({1, 2, 3});
  operation->record("1", size(0));
  EXPECT_EQ(take()[1], "[DEBUG] empty record for " + kOne);
  operation->record("1", {});
  EXPECT_EQ(take()[1], "[DEBUG] empty record for " + kOne);
  operation->fail("2", NSError::errorWithDomain(NSCocoaErrorDomain, 14));
  const Lines failed = take();
  EXPECT_TRUE(failed[1].starts_with("[ERROR] error when fetching thumbnail for " + kTwo + ": "));
  EXPECT_EQ(failed[2], "thumbnail of " + kTwo +
                           ": no data, no type, NSFileProviderErrorDomain -1005 under "
                           "NSCocoaErrorDomain 14");
  // An asset that was not fetched, or whose file is gone.
  for (const NSURLPtr& url : {NSURLPtr(), NSURL::fileURLWithPath("/nowhere/asset")}) {
    operation->record(
        "3", {{kVLRecordKeyThumbnail1024x1024, std::make_shared<const CKAsset>(CKAsset{url})}});
    EXPECT_EQ(take()[1], "[DEBUG] empty record for " + documentID(3));
  }
  // A record that was not asked for is told of as well.
  operation->perRecordCompletionBlock(nullptr, recordID(7, own), nullptr);
  const Lines stray = take();
  EXPECT_EQ(stray[1], "[DEBUG] empty record for (null)");
  EXPECT_EQ(stray[2], "thumbnail of : no data, no type, no error");
  operation->finish();
  EXPECT_EQ(takeCalls(), Lines{"completed: no error"});
}

TEST_F(ThumbnailBatches, ASmallFileThatCanBeRenderedHereIsDownloaded) {
  addItem(1, "text/plain");
  addItem(2, "video/mp4");
  framework.transfer.startError = cloudError;  // passes in silence
  const auto operation = fetchInOneZone({1, 2, 3});
  operation->record("1", size(100));
  Lines lines = take();
  std::erase_if(lines, [](const std::string& line) { return line.starts_with("[DEBUG] ┗"); });
  const std::string downloading =
      "[DEBUG] downloading file at file:///store/1 because quicklook can generate its thumbnail";
  EXPECT_EQ(lines, (Lines{lines.at(0), "[DEBUG] no thumbnail found for a non-empty file",
                          "renderable here: text/plain", downloading,
                          "download of (file:///store/1) with 4",
                          "thumbnail of " + kOne + ": no data, no type, no error"}));

  operation->record("1", size(101));  // too large
  EXPECT_EQ(takeCalls(), Lines{"thumbnail of " + kOne + ": no data, no type, no error"});
  operation->record("2", size(1));  // not rendered here
  EXPECT_EQ(takeCalls(), (Lines{"renderable here: video/mp4",
                                "thumbnail of " + kTwo + ": no data, no type, no error"}));
  operation->record("3", size(1));  // no such item any more
  EXPECT_EQ(takeCalls()[0], "renderable here: (null)");
  // Sizes have a sign.
  framework.transfer.largestFile = -1;
  operation->record("1", size(1));
  EXPECT_EQ(takeCalls().size(), 1u);
  operation->record("1", size(-5));
  EXPECT_EQ(takeCalls()[0], "renderable here: text/plain");
  operation->finish();
}

TEST_F(ThumbnailBatches, TheLastZoneErrorEndsTheBatchAndTheLineNamesTheWholeOfIt) {
  VLContentRecordIDs records = inOneZone({1});
  records.emplace(VLFileObjectID::documentWithRawID(2), recordID(2, others));
  answerWithRecords(records);
  fetch({kOne, kTwo, "i0000000000000007"});
  framework.cloud.sharedDatabase.next()->finish(cloudError);
  framework.cloud.privateDatabase.next()->finish(NSError::errorWithDomain(NSCocoaErrorDomain, 14));
  const Lines lines = take();
  const std::string errorLine = "[ERROR] error while fetching thumbnail batch for (" + kOne + ", " +
                                kTwo + ", i0000000000000007): ";
  EXPECT_EQ(std::count_if(lines.begin(), lines.end(),
                          [&](const std::string& line) { return line.starts_with(errorLine); }),
            2);
  EXPECT_EQ(lines[lines.size() - 2],
            "completed: NSFileProviderErrorDomain -1005 under NSCocoaErrorDomain 14");
}

TEST_F(ThumbnailBatches, CancellingReachesEveryOperationAndTheEndComesOnce) {
  VLContentRecordIDs records = inOneZone({1});
  records.emplace(VLFileObjectID::documentWithRawID(2), recordID(2, others));
  answerWithRecords(records);
  const auto cancelled = NSError::errorWithDomain("CKErrorDomain", 20);
  const auto running = fetch({kOne, kTwo});
  take();
  running->cancel();
  running->cancel();
  EXPECT_EQ(takeCalls(), (Lines{"cloud: cancel", "cloud: cancel"}));
  const auto mine = framework.cloud.privateDatabase.next();
  mine->fail("1", cancelled);
  mine->finish(cancelled);
  EXPECT_EQ(takeCalls(), Lines{"thumbnail of " + kOne + ": no data, no type, CKErrorDomain 20"});
  framework.cloud.sharedDatabase.next()->finish(cancelled);
  EXPECT_EQ(takeCalls(), Lines{"completed: CKErrorDomain 20"});
}

TEST_F(ThumbnailBatches, ABatchKeepsTheExtensionUntilItsEndAndNoLonger) {
  answerWithRecords(inOneZone({1, 2}));
  const auto running =
      host.fetchThumbnailsForItemIdentifiersWithType({kOne, kTwo}, {64, 64}, nullptr, completion());
  const std::weak_ptr<VLFileProviderExtension> weak = extension;
  extension.reset();
  auto operation = framework.cloud.privateDatabase.next();
  operation->record("1", thumbnail("nobody asked to see it"));
  take();
  EXPECT_FALSE(weak.expired());
  operation->finish();
  operation.reset();
  EXPECT_EQ(takeCalls(), Lines{"completed: no error"});
  // Not even by the progress, which a caller may keep.
  EXPECT_TRUE(weak.expired());
  running->cancel();
}

}  // namespace
}  // namespace skein
