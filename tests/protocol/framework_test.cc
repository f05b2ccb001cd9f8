// The framework's roles over a connection: what is asked once, kept current, and told.
#include "linux/framework/LocalFramework.h"

#include <sys/stat.h>
#include <unistd.h>

#include <fstream>

#include "tests/protocol/ProtocolTest.h"

namespace skein {
namespace {

class Observer {
 public:
  void accountChanged() { account.add(1); }
  void containersChanged() { containers.add(1); }
  Inbox<int> account;
  Inbox<int> containers;
};

class Framework : public ProtocolTest {
 protected:
  Framework() {
    DaemonClient::Options options;
    options.socketPath = socketPath;
    framework = std::make_unique<LocalFramework>(clientLoop, executor, center, log, options);
    center.addObserver(observer, &Observer::accountChanged, VLAccountTokenDidChangeNotification);
    center.addObserver(observer, &Observer::containersChanged,
                       VLContainerListDidChangeNotification);
    daemon->setAccount(LocalAccount{"ann", "id"});
    daemon->setContainers(table("/s"));
  }
  ~Framework() override { framework.reset(); }

  static std::vector<VLContainer::Properties> table(const std::string& root) {
    const auto url = [&](const char* below) { return NSURL::fileURLWithPath(root + below); };
    return {{VLUbiquitousDefaultContainerID, url(""), "Drive", std::nullopt},
            {VLUbiquitousDocumentsContainerID, url("/Documents"), "Documents", std::nullopt},
            {"org.example.App", url(".containers/App"), "App", "icon"},
            {"org.example.Without", nullptr, "Without", std::nullopt}};
  }
  std::string accountName() {
    const auto account = framework->accounts().currentCachedLoggedInAccountWithError(nullptr);
    return account ? account->name() : "nil";
  }

  NSNotificationCenter center;
  std::shared_ptr<Observer> observer = std::make_shared<Observer>();
  std::unique_ptr<LocalFramework> framework;
};

TEST_F(Framework, AccountIsAskedOnceAndKeptCurrent) {
  framework->accounts().startAccountTokenChangeObserverIfNeeded();
  EXPECT_EQ(accountName(), "ann");
  const auto events = *daemon->subscribers.take();
  // The daemon's own state changes first: the subscription's first question may come late.
  daemon->setAccount(std::nullopt);
  events.lock()->accountDidChange(std::nullopt);
  ASSERT_TRUE(observer->account.waitForCount(1));
  EXPECT_EQ(accountName(), "nil") << "the new state stands before it is told";
  daemon->setAccount(LocalAccount{"bob", std::nullopt});
  events.lock()->accountDidChange(LocalAccount{"bob", std::nullopt});
  ASSERT_TRUE(observer->account.waitForCount(2));
  EXPECT_EQ(accountName(), "bob");
  EXPECT_EQ(observer->containers.count(), 0U);
}

TEST_F(Framework, WhatChangedWhileThereWasNoConnectionIsToldAfterwards) {
  framework->accounts().startAccountTokenChangeObserverIfNeeded();
  EXPECT_EQ(accountName(), "ann");
  EXPECT_EQ(framework->containers().allContainers().size(), 4U);
  server.reset();
  daemon->setAccount(LocalAccount{"eve", "id"});
  daemon->setContainers({});
  EXPECT_EQ(accountName(), "ann") << "as last heard of";
  startServer();
  // Whatever is asked next connects, subscribes again and compares.
  while (observer->account.count() == 0 || observer->containers.count() == 0) {
    framework->documents().vl_documentURLFromFileObjectID(VLFileObjectID::documentWithRawID(1),
                                                          nullptr);
  }
  EXPECT_EQ(accountName(), "eve");
  EXPECT_TRUE(framework->containers().allContainers().empty());
  EXPECT_EQ(observer->account.count(), 1U);
  EXPECT_EQ(observer->containers.count(), 1U);
}

TEST_F(Framework, UnreachableDaemonIsAnErrorAndNoTable) {
  server.reset();
  NSErrorPtr error;
  EXPECT_EQ(framework->accounts().currentCachedLoggedInAccountWithError(&error), nullptr);
  unreachable(error);
  framework->containers().allContainers();
  EXPECT_TRUE(framework->containers().allContainersByContainerID().empty());
  EXPECT_FALSE(framework->documents().vl_isInSyncedLocation(NSURL::fileURLWithPath("/s/a")));
  // Those who were told "no containers" hear that there are some.
  startServer();
  EXPECT_EQ(accountName(), "ann");
  EXPECT_TRUE(observer->containers.waitForCount(1));
}

TEST_F(Framework, ContainerListIsFetchedBeforeItIsTold) {
  EXPECT_EQ(framework->containers().allContainers().size(), 4U);
  const auto events = *daemon->subscribers.take();
  daemon->setContainers(table("/t"));
  events.lock()->containerListDidChange();
  ASSERT_TRUE(observer->containers.waitForCount(1));
  const auto now = framework->containers().allContainersByContainerID();
  EXPECT_EQ(now.at(VLUbiquitousDefaultContainerID)->documentsURL()->path(), "/t");
  EXPECT_EQ(now.at("org.example.Without")->documentsURL(), nullptr);
}

TEST_F(Framework, SyncedLocationIsByPath) {
  auto& documents = framework->documents();
  const auto inside = [&](const char* path) {
    return documents.vl_isInSyncedLocation(NSURL::fileURLWithPath(path));
  };
  for (const char* path : {"/s", "/s/a", "/s/.Trash-0/files/a", "/s/..a/b", "/s.containers/App"}) {
    EXPECT_TRUE(inside(path)) << path;
  }
  for (const char* path : {"/", "/sa", "/s/../etc", "/s/./a", "/s.containers"}) {
    EXPECT_FALSE(inside(path)) << path;
  }
  EXPECT_FALSE(documents.vl_isInSyncedLocation(nullptr));
  const auto container = [&](const char* path) {
    return documents.vl_containerIDIfIsDocumentsContainerURL(NSURL::fileURLWithPath(path));
  };
  EXPECT_EQ(container("/s"), std::nullopt) << "the drive's root is a folder like any other";
  EXPECT_EQ(container("/s/Documents"), VLUbiquitousDocumentsContainerID);
  EXPECT_EQ(container("/s.containers/App"), "org.example.App");
  EXPECT_EQ(container("/s/a"), std::nullopt);
  EXPECT_EQ(documents.vl_containerIDIfIsDocumentsContainerURL(nullptr), std::nullopt);
}

TEST_F(Framework, ReferencesAreSymbolicLinks) {
  auto& documents = framework->documents();
  std::ofstream(folder + "/target") << "x";
  ASSERT_EQ(symlink("target", (folder + "/link").c_str()), 0);
  ASSERT_EQ(symlink("nowhere", (folder + "/dangling").c_str()), 0);
  const auto url = [&](const char* name) { return NSURL::fileURLWithPath(folder + name); };
  EXPECT_FALSE(documents.vl_isExternalDocumentReference(url("/target")));
  EXPECT_FALSE(documents.vl_isExternalDocumentReference(url("/missing")));
  EXPECT_FALSE(documents.vl_isExternalDocumentReference(nullptr));
  EXPECT_TRUE(documents.vl_isExternalDocumentReference(url("/dangling")));
  NSErrorPtr error;
  EXPECT_EQ(
      documents.vl_URLByResolvingExternalDocumentReferenceWithError(url("/link"), &error)->path(),
      folder + "/target");
  EXPECT_EQ(error, nullptr);
  EXPECT_EQ(documents.vl_URLByResolvingExternalDocumentReferenceWithError(url("/dangling"), &error),
            nullptr);
  EXPECT_EQ(error->domain(), NSCocoaErrorDomain);
  EXPECT_EQ(error->code(), NSFileNoSuchFileError);
}

TEST_F(Framework, LookupsAskValdAndLeaveTheSlotAloneOnSuccess) {
  NSErrorPtr slot = NSError::errorWithDomain("before", 1);
  const NSErrorPtr before = slot;
  daemon->url = NSURL::fileURLWithPath("/s/a");
  EXPECT_EQ(framework->documents()
                .vl_documentURLFromFileObjectID(VLFileObjectID::documentWithRawID(1), &slot)
                ->path(),
            "/s/a");
  VLQueryItem::Properties properties;
  properties.itemIdentifier = NSFileProviderRootContainerItemIdentifier;
  daemon->item = std::make_shared<const VLQueryItem>(properties);
  auto& items = framework->queryItems();
  EXPECT_EQ(items.askDaemonQueryItemForURL(daemon->url, true, &slot)->itemIdentifier(),
            NSFileProviderRootContainerItemIdentifier);
  const auto containers = framework->containers().allContainersByContainerID();
  EXPECT_NE(items.containerItemForContainer(containers.at("org.example.App"), false), nullptr);
  EXPECT_EQ(items.containerItemForContainer(containers.at("org.example.Without"), false), nullptr);
  EXPECT_EQ(items.containerItemForContainer(nullptr, true), nullptr);
  EXPECT_EQ(slot, before);
  daemon->item = nullptr;
  daemon->error = NSError::errorWithDomain(NSCocoaErrorDomain, NSFileNoSuchFileError);
  EXPECT_EQ(items.askDaemonQueryItemForURL(daemon->url, false, &slot), nullptr);
  EXPECT_EQ(slot->code(), NSFileNoSuchFileError);
}

}  // namespace
}  // namespace skein
