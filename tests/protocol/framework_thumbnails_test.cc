// What the framework offers for thumbnails: records as a database hands them out, icons,
// what can be drawn here, settings, and where many documents are.
#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <filesystem>
#include <fstream>

#include "linux/desktop/InstalledThumbnailers.h"
#include "linux/framework/DocumentURLScope.h"
#include "linux/framework/LocalCloudKit.h"
#include "linux/framework/LocalContainer.h"
#include "linux/framework/LocalDefaults.h"
#include "platform/cloudkit/CKError.h"
#include "tests/protocol/ProtocolTest.h"

namespace skein {
namespace {

class CloudKit : public ProtocolTest {
 protected:
  std::shared_ptr<CKFetchRecordsOperation> operation(CKDatabase& database,
                                                     const CKRecordZoneID& zone,
                                                     std::size_t records) {
    auto operation = database.fetchRecordsOperation();
    for (std::size_t at = 0; at < records; ++at) {
      operation->recordIDs.push_back({std::to_string(at), zone});
    }
    operation->perRecordCompletionBlock = [this](const std::shared_ptr<const CKRecord>&,
                                                 const CKRecordID& id, const NSErrorPtr&) {
      if (onRecord) onRecord();
      came.add(id.recordName);
    };
    operation->fetchRecordsCompletionBlock = [this](NSErrorPtr error) {
      ended.add(std::move(error));
    };
    return operation;
  }
  // vald answers the fetch with a record for each name.
  void answer(const NSErrorPtr& error = nullptr) {
    auto fetch = daemon->fakeRecords.fetches.take();
    ASSERT_TRUE(fetch);
    std::vector<FetchedRecord> records;
    for (const std::string& name : fetch->query.recordNames) {
      const CKRecordID id{name, fetch->query.zone};
      records.push_back(
          {id, std::make_shared<CKRecord>(id, std::map<std::string, CKRecord::Value>()), nullptr});
    }
    fetch->reply(error ? std::vector<FetchedRecord>() : records, error);
  }
  // The operation's end, after which nothing comes; "-" when there was none.
  std::string end() {
    const auto error = ended.take();
    if (!error) return "-";
    return *error ? (*error)->domain() + " " + std::to_string((*error)->code()) : "done";
  }

  LocalCloudKit cloud{DaemonAccess{clientLoop, executor, client}};
  const std::shared_ptr<CKContainer> container = cloud.containerWithIdentifier("any");
  const CKRecordZoneID own{"documents", CKCurrentUserDefaultName};
  const CKRecordZoneID others{"trip", "ada"};
  std::function<void()> onRecord;
  Inbox<std::string> came;
  Inbox<NSErrorPtr> ended;
};

TEST_F(CloudKit, AnOperationIsOneRequestWhoseRecordsAllComeBeforeItsEnd) {
  auto fetch = operation(container->privateCloudDatabase(), own, 100);
  fetch->group = std::make_shared<CKOperationGroup>("g");
  container->privateCloudDatabase().addOperation(fetch);
  answer();
  EXPECT_EQ(end(), "done");
  EXPECT_EQ(came.count(), 100U);
  EXPECT_EQ(daemon->fakeRecords.fetches.count(), 0U);
  // The blocks are let go of: they hold whoever made them.
  EXPECT_FALSE(fetch->perRecordCompletionBlock);
  fetch->cancel();
  EXPECT_EQ(ended.count(), 0U);

  container->sharedCloudDatabase().addOperation(
      operation(container->sharedCloudDatabase(), others, 1));
  answer(NSError::errorWithDomain(CKErrorDomain, CKErrorNetworkUnavailable));
  EXPECT_EQ(end(), "CKErrorDomain 3");
}

TEST_F(CloudKit, ZonesOfTheOtherDatabaseAndSeveralZonesAreRefused) {
  container->privateCloudDatabase().addOperation(
      operation(container->privateCloudDatabase(), others, 1));
  EXPECT_EQ(end(), "VLVellumErrorDomain 15");
  auto mixed = operation(container->sharedCloudDatabase(), others, 1);
  mixed->recordIDs.push_back({"x", {"other", "ada"}});
  container->sharedCloudDatabase().addOperation(mixed);
  EXPECT_EQ(end(), "VLVellumErrorDomain 15");
  EXPECT_EQ(daemon->fakeRecords.fetches.count(), 0U);
}

TEST_F(CloudKit, CancellingEndsItOnceBetweenTwoRecords) {
  // While vald is asked.
  auto waiting = operation(container->privateCloudDatabase(), own, 3);
  container->privateCloudDatabase().addOperation(waiting);
  auto fetch = daemon->fakeRecords.fetches.take();
  ASSERT_TRUE(fetch);
  waiting->cancel();
  ASSERT_TRUE(daemon->fakeRecords.cancellations.waitForCount(1));
  fetch->reply({}, NSError::errorWithDomain(CKErrorDomain, CKErrorOperationCancelled));
  EXPECT_EQ(end(), "CKErrorDomain 20");
  EXPECT_EQ(came.count(), 0U);

  // While records are handed out.
  auto running = operation(container->privateCloudDatabase(), own, 1000);
  std::atomic<int> seen{0};
  onRecord = [&] {
    if (++seen == 500) running->cancel();
  };
  container->privateCloudDatabase().addOperation(running);
  answer();
  EXPECT_EQ(end(), "CKErrorDomain 20");
  const std::size_t count = came.count();
  EXPECT_GE(count, 500U);
  EXPECT_LT(count, 510U);
  EXPECT_EQ(ended.count(), 0U);
}

TEST_F(CloudKit, ALostConnectionEndsIt) {
  auto fetch = operation(container->privateCloudDatabase(), own, 3);
  container->privateCloudDatabase().addOperation(fetch);
  auto asked = daemon->fakeRecords.fetches.take();
  server->dropConnections();
  EXPECT_EQ(end(), "VLVellumErrorDomain 30");
  asked->reply({}, nullptr);
}

TEST_F(CloudKit, ManyDocumentsAreFoundAtOnceAndOnThisThreadAlone) {
  daemon->urls = {nullptr, NSURL::fileURLWithPath("/s/a")};
  const auto id = VLFileObjectID::documentWithRawID;
  const auto proxies = [this](auto handler) {
    return client->remoteObjectProxyWithErrorHandler(std::move(handler));
  };
  {
    const DocumentURLScope scope(proxies, *executor, {id(1), id(2)});
    EXPECT_EQ(DocumentURLScope::find(id(2))->path(), "/s/a");
    EXPECT_FALSE(DocumentURLScope::find(id(1)));
    EXPECT_FALSE(DocumentURLScope::find(id(3)));
    EXPECT_EQ(daemon->asked.take(), "2 urls");
  }
  EXPECT_FALSE(DocumentURLScope::find(id(2)));
  // A vald that is gone: nothing is known, and nothing hangs.
  server.reset();
  const DocumentURLScope scope(proxies, *executor, {id(1), id(2)});
  EXPECT_FALSE(DocumentURLScope::find(id(1)));
}

struct Desktop : testing::Test {
  Desktop() {
    std::string name = testing::TempDir() + "skein-desktop-XXXXXX";
    folder = mkdtemp(name.data());
  }
  ~Desktop() override { std::filesystem::remove_all(folder); }
  void write(const std::string& path, const std::string& contents) const {
    std::filesystem::create_directories((folder / path).parent_path());
    std::ofstream(folder / path) << contents;
  }
  std::string image(const VLContainer& container, double side) const {
    isAppIcon = true;
    const auto data = container.bestFittingImageDataForSize({side, side}, isAppIcon);
    return data ? std::string(data->view()) : "nil";
  }

  std::filesystem::path folder;
  mutable bool isAppIcon = false;
};

TEST_F(Desktop, AnIconComesFromTheFolderForItsSizeOrTheNearest) {
  write("a/cool/index.theme",
        "[Icon Theme]\nName=Cool\nInherits=plain,hicolor\nDirectories=16/apps,48/apps,big\n"
        "ScaledDirectories=48@2/apps\n"
        "[16/apps]\nSize=16\nType=Fixed\n[48/apps]\nSize=48\n"
        "[big]\nSize=64\nType=Scalable\nMinSize=64\nMaxSize=256\n"
        "[48@2/apps]\nSize=48\nScale=2\n");
  write("a/plain/index.theme", "[Icon Theme]\nDirectories=32\nInherits=cool\n[32]\nSize=32\n");
  for (const char* icon : {"a/cool/16/apps/app.png", "b/cool/48/apps/app.png", "a/cool/big/app.svg",
                           "a/cool/48@2/apps/dense.png", "a/plain/32/other.png",
                           "b/hicolor/48x48/apps/base.png", "b/loose.svg", "outside.png"}) {
    write(icon, icon);
  }
  const auto theme = IconTheme::load("cool", {folder / "a", folder / "b"});
  const auto find = [&](const std::string& name, int side) {
    const auto path = theme->pathOfIcon(name, side);
    return path ? std::filesystem::path(*path).lexically_relative(folder).string() : "nil";
  };
  EXPECT_EQ(find("app", 16), "a/cool/16/apps/app.png");
  EXPECT_EQ(find("app", 20), "a/cool/16/apps/app.png");
  EXPECT_EQ(find("app", 46), "b/cool/48/apps/app.png");  // within the threshold of 2
  EXPECT_EQ(find("app", 55), "b/cool/48/apps/app.png");
  EXPECT_EQ(find("app", 120), "a/cool/big/app.svg");
  EXPECT_EQ(find("app", 512), "a/cool/big/app.svg");
  EXPECT_EQ(find("dense", 48), "nil");
  EXPECT_EQ(find("other", 120), "a/plain/32/other.png");
  EXPECT_EQ(find("base", 120), "b/hicolor/48x48/apps/base.png");
  EXPECT_EQ(find("loose", 120), "b/loose.svg");
  EXPECT_EQ(find((folder / "outside.png").string(), 16), "outside.png");
  for (const std::string& none : {std::string(), std::string("../outside"), std::string("missing"),
                                  (folder / "a/cool/index.theme").string()}) {
    EXPECT_EQ(find(none, 48), "nil") << none;
  }
}

TEST_F(Desktop, AContainerHasItsAppsIconOrAGenericOne) {
  write("icons/hicolor/48x48/apps/app.png", "the app's");
  write("icons/hicolor/48x48/apps/folder-documents.png", "the folder's");
  write("huge.png", std::string(5 << 20, 'x'));
  const auto icons = IconTheme::load("hicolor", {folder / "icons"});
  const auto container = [&](const std::string& id, std::optional<std::string> icon) {
    VLContainer::Properties properties{id, nullptr, id, std::move(icon)};
    properties.isIconUndecorated = true;
    return LocalContainer(std::move(properties), icons);
  };
  EXPECT_EQ(image(container("app", "app"), 48), "the app's");
  EXPECT_TRUE(isAppIcon);
  EXPECT_EQ(image(container(VLUbiquitousDocumentsContainerID, std::nullopt), 48), "the folder's");
  EXPECT_FALSE(isAppIcon);
  for (const std::string& icon : {std::string("gone"), (folder / "huge.png").string()}) {
    EXPECT_NE(image(container("app", icon), 48).find("<svg"), std::string::npos) << icon;
    EXPECT_FALSE(isAppIcon);
  }
}

TEST_F(Desktop, WhatInstalledThumbnailersDrawCanBeDrawn) {
  write("a/one.thumbnailer",
        "[Thumbnailer Entry]\nTryExec=/bin/sh\nExec=sh\nMimeType=image/x-one;text/plain;\n");
  write("a/none.thumbnailer",
        "[Thumbnailer Entry]\nTryExec=/nowhere/at-all\nMimeType=image/x-none;\n");
  write("b/one.thumbnailer", "[Thumbnailer Entry]\nTryExec=/bin/sh\nMimeType=image/x-hidden;\n");
  InstalledThumbnailers thumbnailers({folder / "a", folder / "b", folder / "missing"});
  const auto can = [&](const std::optional<std::string>& type) {
    return thumbnailers.canMostRecentClientsGenerateThumbnailsForUTI(type);
  };
  EXPECT_TRUE(can("image/x-one"));
  EXPECT_TRUE(can("text/x-csrc"));  // is a text/plain, says the shared database of types
  EXPECT_FALSE(can("image/x-none"));
  EXPECT_FALSE(can("image/x-hidden"));
  EXPECT_FALSE(can("video/mp4"));
  EXPECT_FALSE(can(std::nullopt));
  write("b/new.thumbnailer", "[Thumbnailer Entry]\nMimeType=video/mp4;\n");
  EXPECT_TRUE(can("video/mp4"));
}

TEST_F(Desktop, TheLargestFileForAThumbnailIsASetting) {
  LocalDefaults defaults(folder / "settings.ini");
  EXPECT_EQ(defaults.minFileSizeForThumbnailTransfer(), 1 << 20);
  write("settings.ini", "[Thumbnails]\nminFileSizeForThumbnailTransfer=-1\n");
  EXPECT_EQ(defaults.minFileSizeForThumbnailTransfer(), -1);
  write("settings.ini", "[Thumbnails]\nminFileSizeForThumbnailTransfer=much\n");
  EXPECT_EQ(defaults.minFileSizeForThumbnailTransfer(), 1 << 20);
}

}  // namespace
}  // namespace skein
