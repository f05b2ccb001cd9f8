// What the framework does to files over a connection: what crosses for each of the
// extension's operations, whose request it is, and that every caller is answered once.
#include <fstream>

#include "linux/framework/LocalBundles.h"
#include "linux/framework/LocalFramework.h"
#include "linux/framework/RequestOrigin.h"
#include "linux/framework/RequestProgress.h"
#include "platform/fileprovider/NSFileProviderError.h"
#include "platform/foundation/NSFileCoordinatorReadingOptions.h"
#include "tests/protocol/ProtocolTest.h"
#include "vellum/VLEntitlements.h"

namespace skein {
namespace {

NSURLPtr at(const std::string& path) { return NSURL::fileURLWithPath(path); }

// What an item that is not present is known by: its logical URL, marked as the extension's
// operations mark it.
NSURLPtr physicalAt(const std::string& path) {
  NSURLPtr url = at(path);
  url->attachPhysicalProperty();
  return url;
}

class FrameworkFiles : public ProtocolTest {
 protected:
  FrameworkFiles() {
    DaemonClient::Options options;
    options.socketPath = socketPath;
    framework = std::make_unique<LocalFramework>(clientLoop, executor, center, log, options);
    daemon->setContainers(
        {{VLUbiquitousDefaultContainerID, at("/s"), "Drive", std::nullopt},
         {VLUbiquitousDocumentsContainerID, at("/s/Documents"), "Documents", std::nullopt},
         {"org.example.App", at("/c/App"), "App", std::nullopt},
         {"org.example.Without", nullptr, "Without", std::nullopt}});
  }
  ~FrameworkFiles() override { framework.reset(); }

  FakeFiles& fake() { return daemon->fakeFiles; }
  std::string asked() { return fake().asked.take().value_or("nothing"); }
  VLFileOperations& operations() { return framework->fileOperations(); }
  VLFileManager& manager() { return framework->fileManager(); }
  FakeFiles::Transfer begun() {
    auto transfer = fake().transfers.take();
    EXPECT_TRUE(transfer) << "vald was not asked";
    return transfer ? std::move(*transfer) : FakeFiles::Transfer();
  }

  NSNotificationCenter center;
  std::unique_ptr<LocalFramework> framework;
};

TEST_F(FrameworkFiles, ItemsCrossByTheirLogicalURLsWhetherPhysicalOrNot) {
  fake().url = at("/s/new");
  std::vector<std::string> crossed;
  const auto perform = [&](auto start) {
    Outcome<NSURLPtr, NSErrorPtr> outcome;
    start(outcome.reply());
    EXPECT_EQ(std::get<0>(outcome.value())->path(), "/s/new");
    crossed.push_back(asked());
  };
  const RequestOriginScope scope("me");
  const NSURLPtr item = physicalAt("/s/gone.txt");
  perform([&](auto done) { operations().fp_renameWithNewName(item, "b", std::move(done)); });
  perform([&](auto done) {
    operations().fp_reparentUnderFolder_withNewName(item, at("/s/d"), "b", std::move(done));
  });
  perform([&](auto done) {
    operations().fp_reparentUnderFolder_allowBouncing(item, at("/s/d"), true, std::move(done));
  });
  perform([&](auto done) { operations().fp_createSubFolder(at("/s"), "d", std::move(done)); });
  EXPECT_EQ(crossed, (std::vector<std::string>{
                         "rename /s/gone.txt b me", "move /s/gone.txt /s/d b plain me",
                         "move /s/gone.txt /s/d nil bounce me", "createFolder /s d me"}));

  Outcome<NSErrorPtr> removed;
  operations().fp_deleteWithCompletionHandler(item, removed.reply());
  EXPECT_FALSE(std::get<0>(removed.value()));
  EXPECT_EQ(asked(), "remove /s/gone.txt me");

  bool ran = false;
  operations().fp_coordinatedDeleteWithHandler(item, [&](const NSURLPtr& url, const NSErrorPtr&) {
    EXPECT_EQ(url->path(), "/s/new");
    EXPECT_TRUE(url->isPhysical()) << "what was marked stays marked";
    ran = true;
  });
  EXPECT_TRUE(ran) << "before the call returns";
  EXPECT_EQ(asked(), "coordinateDeletion /s/gone.txt");
  NSURLPtr trashed;
  EXPECT_TRUE(manager().vl_trashItemAtURL(item, &trashed, nullptr));
  EXPECT_EQ(trashed->path(), "/s/new");
  EXPECT_EQ(asked(), "trash /s/gone.txt me");
  EXPECT_EQ(manager().vl_putBackURLForTrashedItemAtURL(item, nullptr)->path(), "/s/new");
  EXPECT_EQ(asked(), "putBackURL /s/gone.txt");

  EXPECT_TRUE(operations().vl_setTagNames(item, {"red"}, nullptr));
  EXPECT_EQ(asked(), "setTagNames /s/gone.txt red");
  manager().vl_setLastOpenDate(NSDate(std::chrono::nanoseconds(4)), at("/s/gone.txt"));
  EXPECT_EQ(asked(), "setLastOpenDate /s/gone.txt 4");
  manager().vl_setFavoriteRank(std::nullopt, item);
  EXPECT_EQ(asked(), "setFavoriteRank /s/gone.txt nil");
  EXPECT_TRUE(manager().evictUbiquitousItemAtURL(item, nullptr));
  EXPECT_EQ(asked(), "evict /s/gone.txt");
  fake().number = 8;
  EXPECT_EQ(operations().vl_capabilityToMoveToURL(item, at("/s/d/gone.txt"), nullptr), 8U);
  EXPECT_EQ(asked(), "capabilityToMove /s/gone.txt /s/d/gone.txt");
}

TEST_F(FrameworkFiles, RefusalsReachTheCallerAsTheyAre) {
  fake().error = NSError::errorWithDomain(NSCocoaErrorDomain, NSFileWriteFileExistsError,
                                          {{NSURLErrorKey, at("/s/there")}});
  Outcome<NSURLPtr, NSErrorPtr> renamed;
  operations().fp_renameWithNewName(at("/s/a"), "there", renamed.reply());
  EXPECT_EQ(fp_collidingURL(std::get<1>(renamed.value()))->path(), "/s/there");
  const auto refused = [&](auto call) {
    NSErrorPtr error;
    call(&error);
    return error && error->code() == NSFileWriteFileExistsError;
  };
  EXPECT_TRUE(refused([&](NSErrorOut error) {
    NSURLPtr trashed = at("/untouched");
    EXPECT_FALSE(manager().vl_trashItemAtURL(at("/s/a"), &trashed, error));
    EXPECT_EQ(trashed->path(), "/untouched");
  }));
  EXPECT_TRUE(refused(
      [&](NSErrorOut error) { EXPECT_FALSE(operations().vl_setTagNames(at("/s/a"), {}, error)); }));
  EXPECT_TRUE(refused([&](NSErrorOut error) {
    EXPECT_FALSE(manager().evictUbiquitousItemAtURL(at("/s/a"), error));
  }));
  EXPECT_TRUE(refused([&](NSErrorOut error) {
    EXPECT_EQ(operations().vl_capabilityToMoveToURL(at("/s/a"), at("/s/b"), error), 0U);
  }));
  manager().vl_setFavoriteRank(1, at("/s/a"));
  EXPECT_NE(log.lines.take().value().find("can't set the favourite rank of"), std::string::npos);
}

TEST_F(FrameworkFiles, NilIsAnsweredWithoutVald) {
  NSErrorPtr error;
  EXPECT_FALSE(operations().vl_setTagNames(nullptr, {"red"}, &error));
  EXPECT_FALSE(error) << "deliberately without one";
  manager().vl_setLastOpenDate(std::nullopt, nullptr);
  manager().vl_setFavoriteRank(std::nullopt, nullptr);
  EXPECT_FALSE(operations().vl_physicalURL(nullptr));
  EXPECT_FALSE(operations().vl_isPromiseURL(nullptr));
  EXPECT_FALSE(operations().vl_vellumContainer(nullptr));
  EXPECT_FALSE(operations().checkResourceIsReachable(nullptr, &error));
  EXPECT_TRUE(error);
  EXPECT_EQ(fake().asked.count(), 0U);
}

TEST_F(FrameworkFiles, MarkersAndReachability) {
  fake().url = at(folder + "/.a.skein");
  fake().flag = true;
  const NSURLPtr marker = operations().vl_physicalURL(at(folder + "/a"));
  EXPECT_EQ(marker->path(), folder + "/.a.skein");
  EXPECT_TRUE(marker->isPhysical());
  EXPECT_TRUE(operations().vl_isPromiseURL(marker));
  fake().flag = false;
  EXPECT_FALSE(operations().vl_isPromiseURL(at(folder + "/a")));

  const auto reachable = [&](const NSURLPtr& url) {
    return operations().checkResourceIsReachable(url, nullptr);
  };
  EXPECT_FALSE(reachable(physicalAt(folder + "/a")));
  std::ofstream(folder + "/.a.skein") << "x";
  EXPECT_FALSE(reachable(at(folder + "/a")));
  EXPECT_TRUE(reachable(physicalAt(folder + "/a"))) << "by its marker";
  EXPECT_TRUE(reachable(at(folder)));
}

TEST_F(FrameworkFiles, AnItemIsInTheInnermostContainer) {
  const auto container = [&](const char* path) {
    const auto found = operations().vl_vellumContainer(at(path));
    return found ? found->containerID() : "nil";
  };
  EXPECT_EQ(container("/s/.Trash-0/files/a"), VLUbiquitousDefaultContainerID);
  EXPECT_EQ(container("/s/Documents/a"), VLUbiquitousDocumentsContainerID);
  EXPECT_EQ(container("/s/Documents2"), VLUbiquitousDefaultContainerID);
  EXPECT_EQ(container("/c/App/a/b"), "org.example.App");
  EXPECT_EQ(container("/c/Ap"), "nil");
}

TEST_F(FrameworkFiles, ACompletionHasTheOriginOfItsCall) {
  Outcome<std::string> origins;
  {
    const RequestOriginScope outer("outer");
    {
      const RequestOriginScope inner("inner");
      operations().fp_deleteWithCompletionHandler(
          at("/s/a"), [reply = origins.reply(), this](const NSErrorPtr&) mutable {
            // The retry that a completion sends is the same person's request.
            operations().fp_deleteWithCompletionHandler(at("/s/.a.skein"), [](NSErrorPtr) {});
            reply(RequestOriginScope::current());
          });
    }
    EXPECT_EQ(RequestOriginScope::current(), "outer");
  }
  EXPECT_EQ(RequestOriginScope::current(), "");
  EXPECT_EQ(std::get<0>(origins.value()), "inner");
  EXPECT_EQ(asked(), "remove /s/a inner");
  EXPECT_EQ(asked(), "remove /s/.a.skein inner");
}

TEST_F(FrameworkFiles, ADeletionAndItsRetryAreCancelledWithTheirRequest) {
  fake().holdsRemovals = true;
  Outcome<NSErrorPtr> ended;
  const auto progress = std::make_shared<RequestProgress>();
  {
    const RequestProgressScope scope(progress);
    operations().fp_deleteWithCompletionHandler(
        at("/s/a"), [reply = ended.reply(), this](const NSErrorPtr&) mutable {
          operations().fp_deleteWithCompletionHandler(at("/s/.a.skein"), std::move(reply));
        });
  }
  begun().reply(nullptr, NSError::errorWithDomain(NSCocoaErrorDomain, NSFileNoSuchFileError));
  FakeFiles::Transfer retry = begun();
  progress->cancel();
  fake().cancellations.take();
  EXPECT_TRUE(retry.progress->isCancelled());
  retry.reply(nullptr, NSError::errorWithDomain(NSCocoaErrorDomain, NSUserCancelledError));
  EXPECT_EQ(std::get<0>(ended.value())->code(), NSUserCancelledError);
}

TEST_F(FrameworkFiles, WithoutAConnectionEachCallerIsAnsweredOnce) {
  fake().url = at("/s/new");
  Outcome<NSURLPtr, NSErrorPtr> imported;
  const auto progress = std::make_shared<RequestProgress>();
  {
    const RequestProgressScope scope(progress);
    operations().fp_importUnderFolder(at("/from"), at("/s"), imported.reply());
  }
  FakeFiles::Transfer transfer = begun();
  transfer.progress->setTotalUnitCount(10);
  transfer.progress->setCompletedUnitCount(4);
  EXPECT_TRUE(becomesTrue([&] { return progress->completed() == 4; }));
  server.reset();
  unreachable(std::get<1>(imported.value()));
  transfer.reply(at("/s/new"), nullptr);

  NSErrorPtr error;
  manager().evictUbiquitousItemAtURL(at("/s/a"), &error);
  unreachable(error);
  EXPECT_FALSE(operations().vl_physicalURL(at("/s/a")));
  EXPECT_FALSE(operations().vl_isPromiseURL(at("/s/a")));
  operations().fp_coordinatedDeleteWithHandler(at("/s/a"),
                                               [&](const NSURLPtr& url, const NSErrorPtr& failure) {
                                                 EXPECT_FALSE(url);
                                                 unreachable(failure);
                                               });
  EXPECT_EQ(imported.replies->count(), 0U);
}

// --- Downloads.

class Providing : public FrameworkFiles {
 protected:
  std::shared_ptr<VLFileProvidingOperation> operationFor(std::uint64_t options = 0) {
    auto operation = framework->operations().fileProvidingOperation(at("/s/a"), options);
    operation->setFileProvidingCompletion(provided.reply());
    return operation;
  }
  std::int64_t code() {
    const NSErrorPtr error = std::get<0>(provided.value());
    return error ? error->code() : 0;
  }
  static NSErrorPtr userCancelled() {
    return NSError::errorWithDomain(NSCocoaErrorDomain, NSUserCancelledError);
  }

  Outcome<NSErrorPtr> provided;
};

TEST_F(Providing, AsksValdForWhatTheOptionsWant) {
  operationFor()->start();
  begun().reply(nullptr, nullptr);
  EXPECT_EQ(code(), 0);
  EXPECT_EQ(asked(), "download /s/a any");
  operationFor(NSFileCoordinatorReadingAlwaysFetches)->start();
  begun().reply(nullptr, NSError::errorWithDomain(NSCocoaErrorDomain, NSFileNoSuchFileError));
  EXPECT_EQ(code(), NSFileNoSuchFileError);
  EXPECT_EQ(asked(), "download /s/a current");
  const auto wanting = operationFor();
  wanting->setWantsCurrentVersion(true);
  wanting->start();
  begun().reply(nullptr, nullptr);
  EXPECT_EQ(code(), 0);
  EXPECT_EQ(asked(), "download /s/a current");
}

TEST_F(Providing, CancelledBeforeDuringOrAfterItReportsOnce) {
  const auto before = operationFor();
  before->cancel();
  EXPECT_EQ(provided.replies->count(), 0U) << "only when it is started";
  before->start();
  EXPECT_EQ(code(), NSUserCancelledError);
  EXPECT_EQ(fake().asked.count(), 0U);

  const auto during = operationFor();
  during->start();
  FakeFiles::Transfer transfer = begun();
  during->cancel();
  during->cancel();
  ASSERT_TRUE(fake().cancellations.waitForCount(1));
  transfer.reply(nullptr, userCancelled());
  EXPECT_EQ(code(), NSUserCancelledError);
  during->cancel();

  // Both at once, many times: whoever wins, one answer comes.
  for (int round = 0; round < 50; ++round) {
    const auto operation = operationFor();
    executor->post([operation] { operation->cancel(); });
    operation->start();
    // Answered at once, or asked of vald and then cancelled there.
    ASSERT_TRUE(
        becomesTrue([&] { return provided.replies->count() > 0 || fake().transfers.count() > 0; }));
    if (fake().transfers.count() > 0) begun().reply(nullptr, userCancelled());
    EXPECT_EQ(code(), NSUserCancelledError);
    EXPECT_EQ(provided.replies->count(), 0U);
  }
}

TEST_F(Providing, TheRequestsProgressFollowsAndCancels) {
  const auto progress = std::make_shared<RequestProgress>();
  std::shared_ptr<VLFileProvidingOperation> operation;
  {
    const RequestProgressScope scope(progress);
    operation = operationFor();
  }
  operation->start();
  FakeFiles::Transfer transfer = begun();
  transfer.progress->setCompletedUnitCount(7);
  EXPECT_TRUE(becomesTrue([&] { return progress->completed() == 7; }));
  progress->cancel();
  ASSERT_TRUE(fake().cancellations.waitForCount(1));
  transfer.reply(nullptr, userCancelled());
  EXPECT_EQ(code(), NSUserCancelledError);
}

// --- Apps.

TEST_F(FrameworkFiles, AppsAreDesktopEntriesAndTheirKeysEntitlements) {
  std::filesystem::create_directories(folder + "/apps/org");
  const auto write = [&](const char* name, const char* text) {
    std::ofstream(folder + "/apps/" + name) << "[Desktop Entry]\nType=Application\n" << text;
  };
  write("org.notes.desktop",
        "Name=Notes\nX-Skein-Containers=two;one;\nX-Skein-Services=SkeinDocuments\n");
  write("org/sub.desktop", "Name=Sub\nX-Skein-Application-Identifier=org.other\n");
  write("hidden.desktop", "Name=Hidden\nHidden=true\n");
  LocalBundles bundles({folder + "/none", folder + "/apps"});
  const std::set<std::string> keys = {VLApplicationIdentifierEntitlement,
                                      VLSkeinServicesEntitlement,
                                      VLSkeinContainerIdentifiersEntitlement};
  const auto notes = bundles.bundleProxyForIdentifier("org.notes");
  ASSERT_TRUE(notes);
  EXPECT_EQ(
      notes->entitlementValuesForKeys(keys),
      (LSBundleProxy::EntitlementValues{{VLApplicationIdentifierEntitlement, {"org.notes"}},
                                        {VLSkeinServicesEntitlement, {VLSkeinServiceDocuments}},
                                        {VLSkeinContainerIdentifiersEntitlement, {"two", "one"}}}));
  EXPECT_TRUE(notes->entitlementValuesForKeys({VLUbiquityContainerIdentifiersEntitlement}).empty());
  EXPECT_EQ(
      bundles.bundleProxyForIdentifier("org-sub")->entitlementValuesForKeys(keys),
      (LSBundleProxy::EntitlementValues{{VLApplicationIdentifierEntitlement, {"org.other"}}}));
  for (const char* none : {"hidden", "org.notes.desktop", "../apps/org.notes", ""}) {
    EXPECT_FALSE(bundles.bundleProxyForIdentifier(none)) << none;
  }
}

}  // namespace
}  // namespace skein
