// What the daemon answers: listings, tokens, lookups, accounts, containers, faults.
#include <unistd.h>

#include <fstream>

#include "linux/vald/ApplicationsWatcher.h"
#include "linux/vald/ChangeToken.h"
#include "platform/fileprovider/NSFileProviderError.h"
#include "tests/vald/TestDaemon.h"
#include "vellum/VLErrors.h"

namespace skein::vald {
namespace {

struct Changes {
  NSFileProviderItems updated;
  std::vector<VLFileObjectID> deleted;
  std::optional<NSData> token;
  NSErrorPtr error;
};

class DaemonCalls : public testing::Test {
 protected:
  std::tuple<NSFileProviderItems, std::uint64_t, NSErrorPtr> list(
      std::optional<VLFileObjectID> folder, std::uint8_t order, std::uint64_t offset,
      std::uint64_t limit) {
    return d.call<NSFileProviderItems, std::uint64_t, NSErrorPtr>(
        [&](LocalDaemon& daemon, auto reply) {
          daemon.enumerateItemsInFolder(folder, order, offset, limit, std::move(reply));
        });
  }
  Changes changes(std::optional<NSData> token, std::uint64_t limit = 200) {
    auto [updated, deleted, next, error] =
        d.call<NSFileProviderItems, std::vector<VLFileObjectID>, std::optional<NSData>, NSErrorPtr>(
            [&](LocalDaemon& daemon, auto reply) {
              daemon.enumerateWorkingSetChangesFromChangeToken(token, limit, std::move(reply));
            });
    return {updated, deleted, next, error};
  }
  std::tuple<VLQueryItemPtr, NSErrorPtr> query(const std::string& path) {
    return d.call<VLQueryItemPtr, NSErrorPtr>([&](LocalDaemon& daemon, auto reply) {
      daemon.queryItemForURL(NSURL::fileURLWithPath(path), true, std::move(reply));
    });
  }
  NSErrorPtr logIn(LocalAccount account) {
    return std::get<0>(d.call<NSErrorPtr>(
        [&](LocalDaemon& daemon, auto reply) { daemon.logIn(account, std::move(reply)); }));
  }
  void logOut() {
    d.call<NSErrorPtr>([](LocalDaemon& daemon, auto reply) { daemon.logOut(std::move(reply)); });
  }
  std::optional<LocalAccount> account() {
    return std::get<0>(d.call<std::optional<LocalAccount>, NSErrorPtr>(
        [](LocalDaemon& daemon, auto reply) { daemon.account(std::move(reply)); }));
  }
  std::vector<VLContainer::Properties> containers() {
    return std::get<0>(d.call<std::vector<VLContainer::Properties>, NSErrorPtr>(
        [](LocalDaemon& daemon, auto reply) { daemon.containers(std::move(reply)); }));
  }
  void writeEntry(const std::string& name, const std::string& lines) {
    std::ofstream(d.applications.path + '/' + name) << "[Desktop Entry]\n" << lines;
  }

  TestDaemon d;
};

bool isLoggedOut(const NSErrorPtr& error) {
  return error && error->domain() == VLVellumErrorDomain && error->code() == 2;
}
bool isExpired(const NSErrorPtr& error) {
  return error && error->domain() == NSFileProviderErrorDomain && error->code() == -1002;
}

// Hears what subscribers are told.
class Events final : public LocalDaemonEvents {
 public:
  void accountDidChange(std::optional<LocalAccount> account) override {
    accounts.push_back(std::move(account));
  }
  void containerListDidChange() override { ++containerChanges; }
  std::vector<std::optional<LocalAccount>> accounts;
  int containerChanges = 0;
};

TEST_F(DaemonCalls, ListsInBoundedPagesAndRefusesWhatMakesNoSense) {
  for (int i = 0; i < 5; ++i) d.store->addFile("f" + std::to_string(i), d.store->root());
  auto [items, next, error] = list(std::nullopt, 0, 0, 2);
  EXPECT_EQ(items.size(), 2u);
  EXPECT_EQ(next, 2u);
  std::tie(items, next, error) = list(std::nullopt, 1, 4, 2);
  EXPECT_EQ(items.size(), 1u);
  EXPECT_EQ(next, 0u);
  list(std::nullopt, 0, 0, 1'000'000);
  EXPECT_EQ(d.store->lastLimit, 1000u);

  EXPECT_TRUE(std::get<2>(list(std::nullopt, 2, 0, 200)));
  EXPECT_TRUE(std::get<2>(list(std::nullopt, 0, 0, 0)));
  EXPECT_TRUE(std::get<2>(list(std::nullopt, 0, ~0ULL, 200)));
  EXPECT_TRUE(std::get<2>(list(VLFileObjectID::folderOrAliasWithRawID(99), 0, 0, 200)));
}

TEST_F(DaemonCalls, ChangesReplayFromAnyTokenUntilTheSameTokenComesBack) {
  const Changes empty = changes(std::nullopt);
  ASSERT_TRUE(empty.token);
  EXPECT_GT(empty.token->length(), 17u);
  EXPECT_EQ(changes(empty.token).token, empty.token);

  const auto a = d.store->addFile("a", d.store->root());
  const auto b = d.store->addFile("b", d.store->root());
  d.store->touch(a);
  d.store->remove(b);
  const Changes first = changes(empty.token, 1);
  ASSERT_EQ(first.updated.size(), 1u);
  EXPECT_EQ(first.updated[0]->itemIdentifier(), a.asString());
  EXPECT_NE(first.token, empty.token);
  const Changes second = changes(first.token, 1);
  EXPECT_EQ(second.deleted, std::vector<VLFileObjectID>{b});
  EXPECT_EQ(changes(second.token).token, second.token);
  const Changes whole = changes(std::nullopt);
  EXPECT_EQ(whole.updated.size(), 1u);
  EXPECT_EQ(whole.deleted.size(), 1u);
  EXPECT_EQ(whole.token, second.token);

  // The journal forgets: old tokens expire, the start of the history never does.
  d.store->forgetUpTo(4);
  EXPECT_TRUE(isExpired(changes(first.token).error));
  EXPECT_FALSE(changes(second.token).error);
  EXPECT_FALSE(changes(std::nullopt).error);
}

TEST_F(DaemonCalls, TokensOfAnotherJournalOrNoneOfOursAreExpired) {
  d.store->addFile("a", d.store->root());
  const NSData token = *changes(std::nullopt).token;
  for (std::size_t at = 0; at < token.length(); ++at) {
    std::vector<std::uint8_t> bytes(token.bytes(), token.bytes() + token.length());
    bytes[at] ^= 0x80;
    EXPECT_TRUE(isExpired(changes(NSData(bytes)).error)) << at;
    bytes.resize(at);
    EXPECT_TRUE(isExpired(changes(NSData(bytes)).error)) << at;
  }
  // An index that was put back from a copy has not come to this rank yet.
  EXPECT_TRUE(isExpired(changes(changeTokenFromRank(2, d.store->journal)).error));
  d.store->journal = "another";
  EXPECT_TRUE(isExpired(changes(token).error));
}

TEST_F(DaemonCalls, LookupsStayInsideTheDriveAndFollowNoLinks) {
  const auto folder = d.store->addFolder("folder", d.store->root());
  d.store->addFile("x", folder);
  std::filesystem::create_directory(d.drive.path + "/folder");
  std::filesystem::create_directory_symlink("folder", d.drive.path + "/link");
  d.store->addFile("x", d.store->addFolder("link", d.store->root()));

  EXPECT_TRUE(std::get<0>(query(d.drive.path)));
  EXPECT_TRUE(std::get<0>(query(d.drive.path + "/folder/x")));
  for (const std::string path : {"/folder/missing", "/link/x", "/folder/../folder/x", "//folder",
                                 "/./folder", "-beside/folder"}) {
    const auto [item, error] = query(d.drive.path + path);
    EXPECT_FALSE(item) << path;
    ASSERT_TRUE(error) << path;
    EXPECT_EQ(error->domain(), NSCocoaErrorDomain);
    EXPECT_EQ(error->code(), NSFileNoSuchFileError);
    EXPECT_FALSE(error->localizedDescription().empty());
  }
}

TEST_F(DaemonCalls, AnAccountSurvivesAReopeningAndChangesAreTold) {
  const auto first = account();
  ASSERT_TRUE(first);
  EXPECT_EQ(first->name, "somebody");
  EXPECT_TRUE(first->perAppAccountIdentifier);
  d.open();
  EXPECT_EQ(account(), first);

  auto events = std::make_shared<Events>();
  d.call<NSErrorPtr>(
      [&](LocalDaemon& daemon, auto reply) { daemon.subscribe(events, std::move(reply)); });
  const LocalAccount plain{"A. B\xC3\xA9", std::nullopt};
  EXPECT_FALSE(logIn(plain));
  EXPECT_FALSE(logIn(plain));  // nothing new to tell
  logOut();
  logOut();
  EXPECT_EQ(events->accounts, (std::vector<std::optional<LocalAccount>>{plain, std::nullopt}));
  d.open();
  EXPECT_EQ(account(), std::nullopt);
  logIn(plain);
  d.open();
  EXPECT_EQ(account(), plain);
  for (const std::string& name : {std::string(), std::string("a\nb"), std::string(256, 'a')}) {
    EXPECT_TRUE(logIn({name, "x"}));
    EXPECT_TRUE(logIn({"x", name}));
  }
  EXPECT_EQ(account(), plain);

  d.settings["account"] = "in\n";
  d.open();
  EXPECT_EQ(account(), std::nullopt);
  EXPECT_EQ(d.log.errors.size(), 1u);
}

TEST_F(DaemonCalls, LoggedOutEndsListingsAndLinksButNoLookups) {
  auto receiver = std::make_shared<Receiver>();
  const auto getSender = [&] {
    return d.call<std::shared_ptr<VLItemNotificationSender>, VLDaemon::Dictionary, NSErrorPtr>(
        [&](LocalDaemon& daemon, auto reply) {
          daemon.getItemUpdateSenderWithReceiver(receiver, std::move(reply));
        });
  };
  const auto sender = std::get<0>(getSender());
  NSErrorPtr broken;
  dynamic_cast<LinkBreaking&>(*sender).setLinkBrokenHandler([&](NSErrorPtr e) { broken = e; });
  logOut();
  EXPECT_TRUE(isLoggedOut(broken));
  EXPECT_TRUE(isLoggedOut(std::get<2>(getSender())));
  EXPECT_TRUE(isLoggedOut(std::get<2>(list(std::nullopt, 0, 0, 200))));
  EXPECT_TRUE(isLoggedOut(changes(std::nullopt).error));
  EXPECT_TRUE(isLoggedOut(
      std::get<1>(d.call<std::uint64_t, NSErrorPtr>([](LocalDaemon& daemon, auto reply) {
        daemon.currentNotifRankWithReply(std::move(reply));
      }))));
  EXPECT_TRUE(std::get<0>(query(d.drive.path)));

  logIn({"x", std::nullopt});  // whether that is enough is the client's to say
  EXPECT_FALSE(std::get<2>(list(std::nullopt, 0, 0, 200)));
}

TEST_F(DaemonCalls, ContainersComeFromTheDriveAndFromDesktopEntries) {
  writeEntry("b.desktop", "Name=Notes\nIcon=notes\nX-Skein-Containers=org.b;../up;.hid;org.c;\n");
  writeEntry("c.desktop", "Name=Later\nX-Skein-Containers=org.b;com.tessel.Skein.default\n");
  writeEntry("d.desktop", "Name=Gone\nHidden=true\nX-Skein-Containers=org.d\n");
  writeEntry("e.desktop", "Name=No more\nX-Skein-Containers");
  // Names that another one is given, and that no folder may have.
  writeEntry("f.desktop", "Name=Notes (org.c)\nX-Skein-Containers=org.a;\n");
  writeEntry("g.desktop", "Name=" + std::string(200, 'n') + "\nX-Skein-Containers=org.f;\n");
  std::filesystem::create_directory(d.drive.path + "/Documents");
  std::filesystem::create_directory_symlink("Documents", d.drive.path + "/Desktop");
  auto events = std::make_shared<Events>();
  d.call<NSErrorPtr>(
      [&](LocalDaemon& daemon, auto reply) { daemon.subscribe(events, std::move(reply)); });
  d.daemon->refreshContainers();
  d.daemon->refreshContainers();
  d.executor->runAll();
  d.daemon->refreshContainers();
  const auto found = containers();
  EXPECT_EQ(events->containerChanges, 1);

  ASSERT_EQ(found.size(), 7u);
  EXPECT_EQ(found[0].documentsURL->path(), d.drive.path);
  EXPECT_EQ(found[1].documentsURL->path(), d.drive.path + "/Documents");
  EXPECT_FALSE(found[2].documentsURL);  // a link is no folder of the drive
  EXPECT_EQ(found[3].displayName, "Notes (org.c)");
  EXPECT_EQ(found[4].containerID, "org.b");
  EXPECT_EQ(found[4].displayName, "Notes");
  EXPECT_EQ(found[4].icon, "notes");
  EXPECT_EQ(found[4].documentsURL->path(), d.state.path + "/org.b/Documents");
  EXPECT_TRUE(std::filesystem::is_directory(d.state.path + "/org.b/Documents"));
  EXPECT_EQ(found[5].displayName, "Notes (org.c) (org.c)");
  EXPECT_EQ(found[6].displayName, "org.f");
  ASSERT_EQ(d.store->containers.size(), 4u);
  EXPECT_EQ(d.store->containers[2].containerID, "org.c");

  std::filesystem::create_directory(d.state.path + "/aside");
  std::filesystem::rename(d.drive.path + "/Documents", d.state.path + "/aside/Documents");
  d.daemon->refreshDriveFolders();
  d.executor->runAll();
  EXPECT_FALSE(containers()[1].documentsURL);
  EXPECT_EQ(containers().size(), 7u);
  EXPECT_EQ(events->containerChanges, 2);

  std::filesystem::remove(d.applications.path + "/b.desktop");
  d.daemon->refreshContainers();
  d.executor->runAll();
  EXPECT_EQ(containers()[4].displayName, "Later");
  EXPECT_EQ(events->containerChanges, 3);
  EXPECT_TRUE(std::filesystem::is_directory(d.state.path + "/org.c/Documents"));
}

TEST_F(DaemonCalls, AContainersFolderIsMadeAgainWhenThatIsWanted) {
  writeEntry("org.b.desktop", "Name=Notes\nX-Skein-Services=SkeinDocuments;\n");
  d.daemon->refreshContainers();
  d.executor->runAll();
  struct Found {
    std::string path;
    bool recreated = false;
    std::int64_t error = 0;
    bool operator==(const Found&) const = default;
  };
  const auto find = [&](const char* id, bool recreate) {
    const auto [url, name, recreated, error] =
        d.call<NSURLPtr, std::optional<std::string>, bool, NSErrorPtr>(
            [&](LocalDaemon& daemon, auto reply) {
              daemon.getContainerURLForID(id, recreate, std::move(reply));
            });
    return Found{url ? url->path() : "", recreated, error ? error->code() : 0};
  };
  // An app that keeps documents and lists no container has the one of its identifier.
  const std::string app = d.state.path + "/org.b/Documents";
  EXPECT_EQ(find("org.b", false), (Found{app, false, 0}));
  std::filesystem::remove_all(d.state.path + "/org.b");
  EXPECT_EQ(find("org.b", false), (Found{"", false, NSFileNoSuchFileError}));
  EXPECT_EQ(find("org.b", true), (Found{app, true, 0}));
  EXPECT_TRUE(std::filesystem::is_directory(app));
  EXPECT_EQ(find("org.b", true), (Found{app, false, 0}));

  const std::string documents = d.drive.path + "/Documents";
  EXPECT_EQ(find(VLUbiquitousDocumentsContainerID, true), (Found{documents, true, 0}));
  EXPECT_EQ(find(VLUbiquitousDefaultContainerID, true), (Found{d.drive.path, false, 0}));
  for (const char* unknown : {"org.nobody", "../b", ""}) {
    EXPECT_EQ(find(unknown, true), (Found{"", false, VLVellumErrorInvalidParameter})) << unknown;
  }
}

TEST_F(DaemonCalls, ApplicationFoldersAreWatchedBeforeAndAfterTheyExist) {
  const std::string later = d.applications.path + "/share/applications";
  Mutex mutex;
  CondVar heard;
  int calls = 0;
  ApplicationsWatcher watcher(
      {later}, std::chrono::milliseconds(0),
      [&] {
        MutexLock lock(mutex);
        ++calls;
        heard.notifyAll();
      },
      d.log);
  const auto wait = [&](int atLeast) {
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(20);
    MutexLock lock(mutex);
    while (calls < atLeast && heard.waitUntil(mutex, deadline)) {
    }
    EXPECT_GE(calls, atLeast);
    return calls;
  };
  int before = wait(1);  // what changed before the watch stood
  std::filesystem::create_directories(later);
  before = wait(before + 1);
  // The folder may have come while it was looked for: the entry is heard of either way.
  std::ofstream(later + "/x.desktop") << "x";
  before = wait(before + 1);
}

TEST_F(DaemonCalls, FaultsComeAsOftenAsTheyWereAskedForAndOnlyWhenAllowed) {
  const auto inject = [&](FaultInjection fault) {
    return std::get<0>(d.call<NSErrorPtr>(
        [&](LocalDaemon& to, auto reply) { to.injectFault(fault, std::move(reply)); }));
  };
  FaultInjection fault{"status", FaultInjection::Action::AnswerError, "X", 7, 0, 2};
  const NSErrorPtr refusal = FaultInjector(false).plan(fault);
  ASSERT_TRUE(refusal);
  EXPECT_NE(refusal->localizedDescription().find("SKEIN_ALLOW_FAULTS=1"), std::string::npos);

  EXPECT_FALSE(inject(fault));
  fault.action = FaultInjection::Action::Delay;
  fault.times = 1;
  EXPECT_FALSE(inject(fault));
  EXPECT_FALSE(d.faults.take("account"));
  for (int i = 0; i < 2; ++i) {
    EXPECT_EQ(d.faults.take("status").value().action, FaultInjection::Action::AnswerError);
  }
  EXPECT_EQ(d.faults.take("status").value().action, FaultInjection::Action::Delay);
  EXPECT_FALSE(d.faults.take("status"));

  // What is served on the way to something else can have faults too, but not every one.
  fault.method = "boostPriority";
  EXPECT_FALSE(inject(fault));
  fault.action = FaultInjection::Action::AnswerError;
  EXPECT_TRUE(inject(fault));
  for (const char* kept : {"stop", "injectFault", "checkIndex", "nonsense"}) {
    fault.method = kept;
    EXPECT_TRUE(inject(fault)) << kept;
  }
  fault.method = "status";
  fault.times = 0;
  EXPECT_TRUE(inject(fault));
}

TEST_F(DaemonCalls, StopRepliesAndAsksTheProcessToEnd) {
  EXPECT_EQ(d.stops, 0);
  d.call<NSErrorPtr>([](LocalDaemon& daemon, auto reply) { daemon.stop(std::move(reply)); });
  EXPECT_EQ(d.stops, 1);
}

}  // namespace
}  // namespace skein::vald
