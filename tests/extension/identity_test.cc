// Identifiers to URLs and back, the items of both, and the log-in test.
#include <gtest/gtest.h>

#include <atomic>
#include <future>

#include "extension/ItemIdentity.h"
#include "platform/fileprovider/NSFileProviderError.h"
#include "tests/support/CountingPool.h"
#include "tests/support/Observers.h"
#include "tests/support/TestEnvironment.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

constexpr char kRootIdentifier[] = "NSFileProviderRootContainerItemIdentifier";

struct Identity : testing::Test {
  Identity() { framework.documents.urls[VLFileObjectID::documentWithRawID(1)] = storeURL("/a"); }

  TestEnvironment env;
  ScriptedFramework& framework = env.framework;
  ItemIdentity identity{env.environment};
  const std::string one = documentID(1);
  const NSErrorPtr cocoa14 = NSError::errorWithDomain(NSCocoaErrorDomain, 14);
};

TEST_F(Identity, TheRootsURLIsFoundOnceAndIgnoresLogInFlagsAndLocation) {
  framework.accounts.account = nullptr;
  framework.containers.table.clear();
  framework.containers.add(VLUbiquitousDefaultContainerID, NSURL::fileURLWithPath("/elsewhere"));
  framework.documents.references["/elsewhere"] = storeURL("/target");
  const NSURLPtr root = identity._URLForItemWithPersistentIdentifier(kRootIdentifier, true, true);
  ASSERT_TRUE(root);
  EXPECT_EQ(root->path(), "/elsewhere");
  EXPECT_FALSE(root->isPhysical());
  EXPECT_EQ(env.run(),
            (Lines{"[DEBUG] ┏1 asked url for " + std::string(kRootIdentifier), "containers: table",
                   "[DEBUG] returning file:///elsewhere", "[DEBUG] ┗1 "}));
  framework.containers.table.clear();
  EXPECT_EQ(identity.URLForItemWithPersistentIdentifier(kRootIdentifier), root);

  NSErrorPtr error;
  EXPECT_FALSE(identity.itemForIdentifier(kRootIdentifier, &error));
  EXPECT_EQ(brief(error), "NSFileProviderErrorDomain -1000 under VLVellumErrorDomain 2");
}

TEST_F(Identity, ARootThatCouldNotBeAskedForIsAskedForAgainAndOneWithoutAFolderIsNot) {
  framework.containers.table.clear();
  EXPECT_FALSE(identity.URLForItemWithPersistentIdentifier(kRootIdentifier));
  framework.containers.add(VLUbiquitousDefaultContainerID, nullptr);
  EXPECT_FALSE(identity.URLForItemWithPersistentIdentifier(kRootIdentifier));
  framework.containers.add(VLUbiquitousDefaultContainerID, storeURL());
  EXPECT_FALSE(identity.URLForItemWithPersistentIdentifier(kRootIdentifier));
  EXPECT_EQ(env.runCalls(), (Lines{"containers: table", "containers: table"}));
}

// The table of containers, from a daemon whose answer needs a thread of the pool.
struct ContainersOverAPool final : VLContainers {
  explicit ContainersOverAPool(Executor& executor) : _executor(executor) {}
  VLContainersByID allContainersByContainerID() override {
    ++questions;
    const auto answered = std::make_shared<std::promise<void>>();
    _executor.post([answered] { answered->set_value(); });
    ScopedWait wait(_executor);
    if (answered->get_future().wait_for(std::chrono::seconds(20)) != std::future_status::ready) {
      return {};
    }
    return {{VLUbiquitousDefaultContainerID, std::make_shared<VLContainer>(VLContainer::Properties{
                                                 "default", storeURL(), "default", std::nullopt})}};
  }
  VLContainersByID allContainers() override { return {}; }

  std::atomic<int> questions{0};

 private:
  Executor& _executor;
};

TEST(RootURLUnderThreads, FirstLookupsOnAPoolOfOneAskOnceAndAllGetIt) {
  CountingPool pool(1);
  ContainersOverAPool containers(pool);
  RootURL rootURL;
  std::atomic<int> found{0};
  for (int i = 0; i < 64; ++i) {
    pool.post([&] {
      if (rootURL.get(containers, pool)) ++found;
    });
  }
  ASSERT_TRUE(pool.waitIdle());
  EXPECT_EQ(found, 64);
  EXPECT_EQ(containers.questions, 1);
}

TEST_F(Identity, AnIdentifiersURLIsLoggedBeforeItsLocationIsTested) {
  EXPECT_EQ(identity.URLForItemWithPersistentIdentifier(one)->path(), "/store/a");
  EXPECT_EQ(env.run(), (Lines{"[DEBUG] ┏1 asked url for " + one, "documents: url of " + one,
                              "[DEBUG] returning file:///store/a", "[DEBUG] ┗1 "}));

  framework.documents.urls[VLFileObjectID::documentWithRawID(1)] =
      NSURL::fileURLWithPath("/elsewhere");
  EXPECT_FALSE(identity._URLForItemWithPersistentIdentifier(one, false, true));
  EXPECT_EQ(env.run(), (Lines{"[DEBUG] ┏3 asked url for " + one, "documents: url of " + one,
                              "[DEBUG] returning file:///elsewhere", "[DEBUG] ┗3 "}));

  framework.documents.error = cocoa14;
  EXPECT_FALSE(identity.URLForItemWithPersistentIdentifier(documentID(2)));
  EXPECT_EQ(env.run()[2], "[ERROR] returning nil, there was an error: NSCocoaErrorDomain 14");
  // What does not parse is not asked for; the reserved identifiers do not parse.
  for (const char* unparsed : {"d1", "", NSFileProviderWorkingSetContainerItemIdentifier}) {
    EXPECT_FALSE(identity.URLForItemWithPersistentIdentifier(unparsed));
    EXPECT_EQ(env.run()[1], "[ERROR] returning nil, there was an error: (null)");
  }
}

TEST_F(Identity, ReferencesAreResolvedAndThePhysicalPropertyAttachedWhenAsked) {
  framework.documents.references["/store/a"] = storeURL("/target");
  const NSURLPtr target = identity._URLForItemWithPersistentIdentifier(one, true, true);
  EXPECT_EQ(target->path(), "/store/target");
  EXPECT_TRUE(target->isPhysical());
  EXPECT_EQ(env.run(),
            (Lines{"[DEBUG] ┏1 asked url for " + one, "documents: url of " + one,
                   "[DEBUG] we have a bookmark, returning its target",
                   "documents: resolve file:///store/a", "[DEBUG] returning file:///store/target",
                   "documents: physical file:///store/target", "[DEBUG] ┗1 "}));
  const NSURLPtr alias = identity._URLForItemWithPersistentIdentifier(one, false);
  EXPECT_EQ(alias->path(), "/store/a");
  EXPECT_FALSE(alias->isPhysical());

  framework.documents.references["/store/a"] = nullptr;
  framework.documents.error = cocoa14;
  env.run();
  EXPECT_FALSE(identity.URLForItemWithPersistentIdentifier(one));
  EXPECT_EQ(env.run()[4], "[ERROR] returning nil, there was an error: NSCocoaErrorDomain 14");
}

TEST_F(Identity, AURLsIdentifierGoesByTheErrorNotTheItem) {
  framework.queryItems.items["/store/a"] = makeItem(1);
  EXPECT_EQ(identity.persistentIdentifierForItemAtURL(storeURL("/a")), one);
  EXPECT_EQ(env.run(),
            (Lines{"[DEBUG] ┏1 asked identifier for file:///store/a",
                   "[DEBUG] ┏3 asked properties for file:///store/a", "items: ask file:///store/a",
                   "[DEBUG] returning <" + one + " \"doc\">", "[DEBUG] ┗3 ",
                   "[DEBUG] returning " + one, "[DEBUG] ┗1 "}));
  const auto account = std::exchange(framework.accounts.account, nullptr);
  EXPECT_EQ(identity.persistentIdentifierForItemAtURL(storeURL("/a")), one)
      << "who is logged in is not asked";
  framework.accounts.account = account;
  env.run();
  EXPECT_EQ(identity.persistentIdentifierForItemAtURL(storeURL("/none")), std::nullopt);
  EXPECT_EQ(env.run()[5], "[DEBUG] returning (null)");

  framework.queryItems.error = cocoa14;
  EXPECT_EQ(identity.persistentIdentifierForItemAtURL(storeURL("/a")), std::nullopt);
  EXPECT_EQ(env.run()[5],
            "[DEBUG] couldn't get item identifier at file:///store/a: NSFileProviderErrorDomain "
            "-1005 {NSCocoaErrorDomain 14}");
  EXPECT_EQ(identity.persistentIdentifierForItemAtURL(NSURL::fileURLWithPath("/x")), std::nullopt);
  EXPECT_EQ(identity.persistentIdentifierForItemAtURL(nullptr), std::nullopt);
  EXPECT_EQ(env.run(), Lines{});
}

TEST_F(Identity, AnAccountNeedsAnIdentifierForThisApp) {
  EXPECT_TRUE(identity._isLoggedInOrError(nullptr));
  EXPECT_EQ(env.run(), Lines{});

  framework.accounts.account = std::make_shared<VLAccount>("kim", std::nullopt);
  NSErrorPtr error;
  EXPECT_FALSE(identity._isLoggedInOrError(&error));
  EXPECT_EQ(brief(error), "NSFileProviderErrorDomain -1000 under VLVellumErrorDomain 2");
  EXPECT_EQ(error->userInfo().size(), 1u);
  EXPECT_FALSE(identity._isLoggedInOrError(nullptr));
  const std::string head = "[ERROR] -[VLFileProviderExtension _isLoggedInOrError:]: ";
  const std::string tail =
      " error: NSFileProviderErrorDomain -1000 {VLVellumErrorDomain 2 \"No "
      "account is logged in.\"}";
  EXPECT_EQ(env.run(),
            (Lines{head + "(passed to caller)" + tail, head + "(ignored by caller)" + tail}));

  // An error counts, also beside an account.
  framework.accounts.logIn();
  framework.accounts.error = NSError::errorWithDomain(NSCocoaErrorDomain, 4355);
  EXPECT_FALSE(identity._isLoggedInOrError(&error));
  EXPECT_EQ(brief(error), "NSFileProviderErrorDomain -1004 under NSCocoaErrorDomain 4355");
}

TEST_F(Identity, AnItemIsLookedUpAfterTheLogIn) {
  framework.accounts.account = nullptr;
  EXPECT_FALSE(identity.itemForIdentifier(one, nullptr));
  EXPECT_EQ(env.runCalls(), Lines{});

  framework.accounts.logIn();
  framework.queryItems.items["/store/a"] = makeItem(1);
  NSErrorPtr error;
  EXPECT_EQ(identity.itemForIdentifier(one, &error)->itemIdentifier(), one);
  EXPECT_EQ(error, nullptr);
  const std::string returning = "[DEBUG] returning <" + one + " \"doc\">";
  EXPECT_EQ(env.run(),
            (Lines{"[DEBUG] ┏3 asked properties for " + one, "[DEBUG] ┏5 asked url for " + one,
                   "documents: url of " + one, "[DEBUG] returning file:///store/a", "[DEBUG] ┗5 ",
                   "[DEBUG] ┏7 asked properties for file:///store/a", "items: ask file:///store/a",
                   returning, "[DEBUG] ┗7 ", returning, "[DEBUG] ┗3 "}));

  EXPECT_FALSE(identity.itemForIdentifier("nothing", &error));
  EXPECT_EQ(error->userInfo().at(NSFileProviderErrorNonExistentItemIdentifierKey),
            NSErrorValue(std::string("nothing")));
  const Lines lines = env.run();
  EXPECT_EQ(lines[lines.size() - 2],
            "[ERROR] -[VLFileProviderExtension itemForIdentifier:error:]: (passed to caller) "
            "error: NSFileProviderErrorDomain -1005");
}

TEST_F(Identity, PropertiesComeFromTheDaemonOrFromAnAppsContainer) {
  framework.containers.add("app", storeURL("/App"));
  framework.documents.containerIDs = {{"/store/App", "app"},
                                      {"/store/Gone", "gone"},
                                      {"/store/Documents", VLUbiquitousDocumentsContainerID},
                                      {"/store/Desktop", VLUbiquitousDesktopContainerID}};
  framework.queryItems.containerItems["app"] = makeItem(9);
  NSErrorPtr error;
  EXPECT_TRUE(identity._propertiesForNewItemAtURL(storeURL("/App"), &error));
  EXPECT_FALSE(identity._propertiesForItemAtURL(storeURL("/Gone"), &error));
  EXPECT_EQ(error, nullptr);
  identity._propertiesForItemAtURL(storeURL("/Documents"), &error);
  identity._propertiesForNewItemAtURL(storeURL("/Desktop"), nullptr);
  EXPECT_EQ(env.runCalls(),
            (Lines{"containers: table", "items: container app after a scan", "containers: table",
                   "items: container nil", "items: ask file:///store/Documents",
                   "items: ask file:///store/Desktop after a scan"}));
}

TEST_F(Identity, WhateverTheErrorSlotHoldsIsTranslatedAtTheEnd) {
  framework.queryItems.items["/store/a"] = makeItem(1);
  NSErrorPtr stale = NSError::errorWithDomain(VLVellumErrorDomain, 2);
  EXPECT_TRUE(identity._propertiesForItemAtURL(storeURL("/a"), &stale));
  EXPECT_EQ(brief(stale), "NSFileProviderErrorDomain -1000 under VLVellumErrorDomain 2");

  env.run();
  for (const NSURLPtr& foreign : {NSURL::fileURLWithPath("/storeroom"), NSURLPtr()}) {
    EXPECT_FALSE(identity._propertiesForItemAtURL(foreign, &stale));
    EXPECT_EQ(brief(stale), "NSFileProviderErrorDomain -1005");
    EXPECT_TRUE(stale->userInfo().empty());
  }
  EXPECT_EQ(env.run(), Lines{});
}

}  // namespace
}  // namespace skein
