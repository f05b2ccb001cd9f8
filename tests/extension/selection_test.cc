// Which enumerator a container gets.
#include <gtest/gtest.h>

#include "enumeration/EnumeratorSelection.h"
#include "enumeration/VLDirectoriesEnumerator.h"
#include "enumeration/VLFileEnumerator.h"
#include "enumeration/VLWorkingSetEnumerator.h"
#include "extension/ItemIdentity.h"
#include "tests/support/Observers.h"
#include "tests/support/TestEnvironment.h"

namespace skein {
namespace {

constexpr char kWorkingSet[] = "NSFileProviderWorkingSetContainerItemIdentifier";
constexpr char kDirectories[] = "NSFileProviderAllDirectoriesContainerItemIdentifier";
constexpr char kRoot[] = "NSFileProviderRootContainerItemIdentifier";

struct Selection : testing::Test {
  std::shared_ptr<NSFileProviderEnumerator> select(const std::string& identifier,
                                                   NSErrorOut error = nullptr) {
    return enumeratorForContainerItemIdentifier(identifier, error, identity, env.environment);
  }
  // Which folder a listing by this enumerator asks the daemon for.
  std::string folderAskedFor(const std::shared_ptr<NSFileProviderEnumerator>& enumerator) {
    const auto observer = std::make_shared<RecordingObserver>(env.transcript);
    enumerator->enumerateItemsForObserver(observer, std::nullopt);
    env.executor->runAll();
    env.framework.daemon.senders.next()->reply(env.framework.daemon.makeSender(), nullptr);
    const Lines lines = env.runCalls();
    enumerator->invalidate();
    env.executor->runAll();
    const auto watch = std::find_if(lines.begin(), lines.end(), [](const std::string& line) {
      return line.find(" watch ") != std::string::npos;
    });
    watched = watch != lines.end() ? watch->substr(watch->find(" watch ") + 7) : "nothing";
    return lines.back();
  }

  TestEnvironment env;
  ItemIdentity identity{env.environment};
  std::string watched;  // by the last enumerator that listed
};

TEST_F(Selection, NobodyLoggedInGetsNone) {
  env.framework.accounts.account = nullptr;
  for (const char* identifier : {kWorkingSet, kDirectories, kRoot, "d0000000000000001"}) {
    NSErrorPtr error;
    EXPECT_FALSE(select(identifier, &error));
    EXPECT_EQ(brief(error), "NSFileProviderErrorDomain -1000 under VLVellumErrorDomain 2");
    const Lines lines = env.run();
    EXPECT_EQ(lines.size(), 3u) << "the section, the log-in test's own line, and no more";
  }
}

TEST_F(Selection, TheReservedContainersComeBeforeAnyLookup) {
  const auto workingSet = select(kWorkingSet);
  EXPECT_TRUE(std::dynamic_pointer_cast<VLWorkingSetEnumerator>(workingSet));
  EXPECT_TRUE(std::dynamic_pointer_cast<NSFileProviderChangeEnumerating>(workingSet));
  EXPECT_EQ(env.run(),
            (Lines{"[DEBUG] ┏1 enumerator for " + std::string(kWorkingSet), "[DEBUG] ┗1 "}));
  const auto directories = select(kDirectories);
  EXPECT_TRUE(std::dynamic_pointer_cast<VLDirectoriesEnumerator>(directories));
  EXPECT_FALSE(std::dynamic_pointer_cast<NSFileProviderChangeEnumerating>(directories));
  EXPECT_EQ(env.runCalls(), Lines{});
}

TEST_F(Selection, FoldersGetTheirsByURL) {
  const auto folder = VLFileObjectID::folderOrAliasWithRawID(7);
  const auto file = VLFileObjectID::documentWithRawID(8);
  env.framework.documents.urls = {{folder, storeURL("/folder")}, {file, storeURL("/alias")}};
  // An alias: its own identifier is asked for, its target is watched.
  env.framework.documents.references["/store/alias"] = storeURL("/target");
  EXPECT_EQ(folderAskedFor(select(kRoot)), "daemon: items in (null) order 0 offset 0 limit 200");
  EXPECT_EQ(folderAskedFor(select(folder.asString())),
            "daemon: items in i0000000000000007 order 0 offset 0 limit 200");
  EXPECT_EQ(watched, "file:///store/folder 19") << "its children alone";
  EXPECT_EQ(folderAskedFor(select(file.asString())),
            "daemon: items in d0000000000000008 order 0 offset 0 limit 200");
  EXPECT_EQ(watched, "file:///store/target 19");
}

TEST_F(Selection, WithoutAURLThereIsNoSuchItem) {
  NSErrorPtr error;
  EXPECT_FALSE(select("nothing", &error));
  EXPECT_EQ(brief(error), "NSFileProviderErrorDomain -1005");
  EXPECT_FALSE(select("nothing"));
  const Lines lines = env.run();
  const std::string head =
      "[ERROR] -[VLFileProviderExtension enumeratorForContainerItemIdentifier:error:]: ";
  const std::string tail = " error: NSFileProviderErrorDomain -1005";
  EXPECT_EQ(std::count(lines.begin(), lines.end(), head + "(passed to caller)" + tail), 1);
  EXPECT_EQ(std::count(lines.begin(), lines.end(), head + "(ignored by caller)" + tail), 1);
}

// A lookup that answers a URL for everything, to reach what a real store never shows.
struct AnyURL final : VLItemLookup {
  NSURLPtr URLForItemWithPersistentIdentifier(const std::string&) override { return storeURL(); }
  NSURLPtr _URLForItemWithPersistentIdentifier(const std::string&, bool, bool) override {
    return storeURL();
  }
  std::optional<std::string> persistentIdentifierForItemAtURL(const NSURLPtr&) override {
    return std::nullopt;
  }
  bool _isLoggedInOrError(NSErrorOut) override { return true; }
  NSFileProviderItemPtr itemForIdentifier(const std::string&, NSErrorOut) override {
    return nullptr;
  }
  NSFileProviderItemPtr _propertiesForItemAtURL(const NSURLPtr&, NSErrorOut) override {
    return nullptr;
  }
  NSFileProviderItemPtr _propertiesForNewItemAtURL(const NSURLPtr&, NSErrorOut) override {
    return nullptr;
  }
};

TEST_F(Selection, TheURLDecidesAlsoForAnIdentifierThatDoesNotParse) {
  AnyURL lookup;
  EXPECT_EQ(folderAskedFor(
                enumeratorForContainerItemIdentifier("unparsed", nullptr, lookup, env.environment)),
            "daemon: items in (null) order 0 offset 0 limit 200");
}

}  // namespace
}  // namespace skein
