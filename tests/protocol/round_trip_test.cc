// Every message of vald's interface, there and back.
#include "tests/protocol/ProtocolTest.h"

namespace skein {
namespace {

const VLFileObjectID kFolder = VLFileObjectID::folderOrAliasWithRawID(0xFFFFFFFFFFFFFFFE);
const VLFileObjectID kDocument = VLFileObjectID::documentWithRawID(1);

VLQueryItemPtr item(VLQueryItem::Properties properties) {
  return std::make_shared<const VLQueryItem>(std::move(properties));
}

VLQueryItem::Properties everythingSet() {
  VLQueryItem::Properties all;
  all.fileObjectID = kFolder;
  all.itemIdentifier = NSFileProviderRootContainerItemIdentifier;
  all.parentItemIdentifier = "i0000000000000001";
  all.filename = "new\nline \xff\xfe \"quote\" caf\xc3\xa9";
  all.typeIdentifier = "inode/directory";
  all.kind = VLQueryItem::Kind::Folder;
  all.isDead = all.isTrashed = all.isUploaded = all.isShared = true;
  all.isDownloaded = false;
  all.capabilities = 0x8000000000000001;
  all.size = 1ULL << 63;
  all.creationDate = NSDate(std::chrono::nanoseconds(-1));
  all.contentModificationDate = NSDateDistantFuture();
  all.lastUsedDate = NSDate(std::chrono::nanoseconds(0));
  all.tagData = NSData(std::string_view("\0tag", 4));
  all.favoriteRank = -7;
  all.childItemCount = 0;
  all.containerID = "org.example.App";
  return all;
}

// Nothing that is nil, and nothing that is empty.
VLQueryItem::Properties emptyTexts() {
  VLQueryItem::Properties empty;
  empty.typeIdentifier = "";
  empty.tagData = NSData();
  empty.containerID = "";
  return empty;
}

VLQueryItem::Properties nothingSet() {
  VLQueryItem::Properties nothing;
  nothing.fileObjectID = kDocument;
  nothing.itemIdentifier = kDocument.asString();
  nothing.kind = VLQueryItem::Kind::Alias;
  return nothing;
}

NSErrorPtr errorWithEverything() {
  const NSErrorPtr deepest = NSError::errorWithDomain(NSPOSIXErrorDomain, 13);
  const NSErrorPtr below = NSError::errorWithDomain(
      VLVellumErrorDomain, 2, {{NSUnderlyingErrorKey, deepest}, {"empty", std::string()}});
  return NSError::errorWithDomain(NSCocoaErrorDomain, -5,
                                  {{NSUnderlyingErrorKey, below},
                                   {NSLocalizedDescriptionKey, std::string("why \xff")},
                                   {NSURLErrorKey, NSURL::fileURLWithPath("/a\nb")},
                                   {"item", NSFileProviderItemPtr(item(everythingSet()))}});
}

void expectSameError(const NSErrorPtr& got, const NSErrorPtr& sent) {
  ASSERT_TRUE(got && sent);
  EXPECT_EQ(got->domain(), sent->domain());
  EXPECT_EQ(got->code(), sent->code());
  EXPECT_EQ(got->userInfo().size(), sent->userInfo().size());
  EXPECT_EQ(got->localizedDescription(), sent->localizedDescription());
  ASSERT_EQ(got->underlyingError() != nullptr, sent->underlyingError() != nullptr);
  if (sent->underlyingError()) expectSameError(got->underlyingError(), sent->underlyingError());
}

void expectSameItems(const NSFileProviderItems& got, const VLQueryItems& sent) {
  ASSERT_EQ(got.size(), sent.size());
  for (std::size_t at = 0; at < sent.size(); ++at) {
    const auto* query = dynamic_cast<const VLQueryItem*>(got[at].get());
    ASSERT_NE(query, nullptr);
    EXPECT_EQ(query->properties(), sent[at]->properties()) << "item " << at;
  }
}

class RoundTrip : public ProtocolTest {};

TEST_F(RoundTrip, PagesOfItems) {
  daemon->items = {item(everythingSet()), item(emptyTexts()), item(nothingSet())};
  daemon->number = ~0ULL;
  const auto [items, next, error] = ask<NSFileProviderItems, std::uint64_t, NSErrorPtr>(
      *client, [](LocalDaemon& proxy, auto reply) {
        proxy.enumerateItemsInFolder(kFolder, 1, 1ULL << 40, 200, std::move(reply));
      });
  EXPECT_EQ(daemon->asked.take(), "items " + kFolder.asString() + " 1 1099511627776 200");
  expectSameItems(items, daemon->items);
  EXPECT_EQ(next, ~0ULL);
  EXPECT_EQ(error, nullptr);

  daemon->items.clear();
  daemon->error = errorWithEverything();
  const auto [folders, end, problem] = ask<NSFileProviderItems, std::uint64_t, NSErrorPtr>(
      *client, [](LocalDaemon& proxy, auto reply) {
        proxy.enumerateAllFoldersWithSortOrder(255, 0, 1ULL << 60, std::move(reply));
      });
  EXPECT_EQ(daemon->asked.take(), "folders 255 0 1000") << "a page is bounded at the door";
  EXPECT_TRUE(folders.empty());
  expectSameError(problem, daemon->error);
  const auto inside = std::get<NSFileProviderItemPtr>(problem->userInfo().at("item"));
  expectSameItems({inside}, {item(everythingSet())});
  EXPECT_EQ(std::get<NSURLPtr>(problem->userInfo().at(NSURLErrorKey))->path(), "/a\nb");
}

TEST_F(RoundTrip, TheRootIsNilAndNotAnEmptyIdentifier) {
  ask<NSFileProviderItems, std::uint64_t, NSErrorPtr>(*client, [](LocalDaemon& proxy, auto reply) {
    proxy.enumerateItemsInFolder(std::nullopt, 0, 0, 1, std::move(reply));
  });
  EXPECT_EQ(daemon->asked.take(), "items nil 0 0 1");
}

TEST_F(RoundTrip, WorkingSetTokensAreNilOrEmptyOrBytes) {
  const auto changes = [&](std::optional<NSData> from) {
    return ask<NSFileProviderItems, std::vector<VLFileObjectID>, std::optional<NSData>, NSErrorPtr>(
        *client, [&](LocalDaemon& proxy, auto reply) {
          proxy.enumerateWorkingSetChangesFromChangeToken(from, 200, std::move(reply));
        });
  };
  daemon->items = {item(nothingSet())};
  daemon->deletions = {kDocument, kFolder, kDocument};
  EXPECT_EQ(std::get<2>(changes(std::nullopt)), std::nullopt);
  EXPECT_EQ(daemon->asked.take(), "changes nil 200");
  daemon->token = NSData();
  EXPECT_EQ(std::get<2>(changes(NSData())), NSData());
  EXPECT_EQ(daemon->asked.take(), "changes \"\" 200");
  daemon->token = NSData(std::string_view("\0\xff", 2));
  const auto [updates, deletions, token, error] = changes(NSData(std::string_view("from\0", 5)));
  EXPECT_EQ(daemon->asked.take(), std::string("changes \"from\0\" 200", 19));
  expectSameItems(updates, daemon->items);
  EXPECT_EQ(deletions, daemon->deletions);
  EXPECT_EQ(token, daemon->token);
}

TEST_F(RoundTrip, LookupsAnswerNilWithAndWithoutAnError) {
  const auto lookUp = [&](const std::string& path, bool scanFirst) {
    return ask<VLQueryItemPtr, NSErrorPtr>(*client, [&](LocalDaemon& proxy, auto reply) {
      proxy.queryItemForURL(NSURL::fileURLWithPath(path), scanFirst, std::move(reply));
    });
  };
  const auto urlOf = [&](const VLFileObjectID& id) {
    return ask<NSURLPtr, NSErrorPtr>(*client, [&](LocalDaemon& proxy, auto reply) {
      proxy.URLForFileObjectID(id, std::move(reply));
    });
  };
  EXPECT_EQ(lookUp("/s/\xff\n", true), std::tuple(VLQueryItemPtr(), NSErrorPtr()));
  EXPECT_EQ(daemon->asked.take(), "item /s/\xff\n scan");
  EXPECT_EQ(urlOf(kDocument), std::tuple(NSURLPtr(), NSErrorPtr()));
  daemon->item = item(everythingSet());
  daemon->url = NSURL::fileURLWithPath("/s/..odd. \x01");
  EXPECT_EQ(std::get<0>(lookUp("/s", false))->properties(), everythingSet());
  EXPECT_EQ(*std::get<0>(urlOf(kFolder)), *daemon->url);

  const auto urlsOf = [&](std::vector<VLFileObjectID> ids) {
    return std::get<0>(
        ask<std::vector<NSURLPtr>, NSErrorPtr>(*client, [&](LocalDaemon& proxy, auto reply) {
          proxy.URLsForFileObjectIDs(std::move(ids), std::move(reply));
        }));
  };
  EXPECT_TRUE(urlsOf({}).empty());
  daemon->urls = {nullptr, daemon->url, nullptr};
  const auto urls = urlsOf({kFolder, kDocument, kFolder});
  ASSERT_EQ(urls.size(), 3U);
  EXPECT_FALSE(urls[0] || urls[2]);
  EXPECT_EQ(*urls[1], *daemon->url);

  // Paths that are none are refused before vald sees them.
  for (const char* path : {"", "relative", "/s/../etc", "/s/."}) {
    const auto [found, error] = lookUp(path, false);
    EXPECT_EQ(found, nullptr) << path;
    ASSERT_TRUE(error) << path;
    EXPECT_EQ(error->code(), VLVellumErrorInvalidParameter) << path;
  }
}

TEST_F(RoundTrip, AccountsAndContainers) {
  const auto account = [&] {
    return std::get<0>(ask<std::optional<LocalAccount>, NSErrorPtr>(
        *client, [](LocalDaemon& proxy, auto reply) { proxy.account(std::move(reply)); }));
  };
  const auto logIn = [&](const LocalAccount& who) {
    ask<NSErrorPtr>(*client,
                    [&](LocalDaemon& proxy, auto reply) { proxy.logIn(who, std::move(reply)); });
  };
  EXPECT_EQ(account(), std::nullopt);
  for (const LocalAccount& who :
       {LocalAccount{"a", std::nullopt}, LocalAccount{"", ""}, LocalAccount{"b", "id\xff"}}) {
    logIn(who);
    EXPECT_EQ(account(), who);
  }
  ask<NSErrorPtr>(*client, [](LocalDaemon& proxy, auto reply) { proxy.logOut(std::move(reply)); });
  EXPECT_EQ(account(), std::nullopt);

  daemon->setContainers({{"none", nullptr, "", std::nullopt},
                         {"app", NSURL::fileURLWithPath("/s/App"), "An \xff app", ""}});
  const auto [containers, error] = ask<std::vector<VLContainer::Properties>, NSErrorPtr>(
      *client, [](LocalDaemon& proxy, auto reply) { proxy.containers(std::move(reply)); });
  ASSERT_EQ(containers.size(), 2U);
  EXPECT_EQ(containers[0].documentsURL, nullptr);
  EXPECT_EQ(containers[0].icon, std::nullopt);
  EXPECT_EQ(containers[1].containerID, "app");
  EXPECT_EQ(containers[1].documentsURL->path(), "/s/App");
  EXPECT_EQ(containers[1].displayName, "An \xff app");
  EXPECT_EQ(containers[1].icon, "");
}

TEST_F(RoundTrip, StatusChecksFaultsAndStop) {
  LocalDaemonStatus sent;
  sent.store = "/s\n";
  sent.processID = -1;
  sent.documents = 1;
  sent.folders = 2;
  sent.aliases = 3;
  sent.scan = LocalDaemonStatus::Scan::Rescanning;
  sent.scannedFolders = 4;
  sent.pendingFolders = 5;
  sent.unreadableFolders = 6;
  sent.watch = LocalDaemonStatus::Watch::Degraded;
  sent.watchReason = "budget";
  sent.notes = {"a \xff", ""};
  sent.watches = 7;
  sent.watchBudget = 8;
  sent.overflows = 9;
  sent.rank = 10;
  sent.oldestTokenRank = 11;
  sent.senders = 12;
  sent.account = LocalAccount{"a", "b"};
  daemon->statusNow = sent;
  const auto [status, error] = ask<LocalDaemonStatus, NSErrorPtr>(
      *client, [](LocalDaemon& proxy, auto reply) { proxy.status(std::move(reply)); });
  const auto fields = [](const LocalDaemonStatus& s) {
    return std::tuple(s.store, s.processID, s.documents, s.folders, s.aliases, s.scan,
                      s.scannedFolders, s.pendingFolders, s.unreadableFolders, s.watch,
                      s.watchReason, s.notes, s.watches, s.watchBudget, s.overflows, s.rank,
                      s.oldestTokenRank, s.senders, s.account);
  };
  EXPECT_EQ(fields(status), fields(sent));

  daemon->differences = {{IndexDifference::Kind::Identity, "/s/\xff", "inode"}};
  const auto [differences, none] = ask<std::vector<IndexDifference>, NSErrorPtr>(
      *client, [](LocalDaemon& proxy, auto reply) { proxy.checkIndex(5, std::move(reply)); });
  ASSERT_EQ(differences.size(), 1U);
  EXPECT_EQ(differences[0].kind, IndexDifference::Kind::Identity);
  EXPECT_EQ(differences[0].path, "/s/\xff");
  EXPECT_EQ(differences[0].detail, "inode");

  daemon->error = errorWithEverything();
  const FaultInjection fault{"stop", FaultInjection::Action::Delay, "D", -9, 8, 7};
  expectSameError(std::get<0>(ask<NSErrorPtr>(*client,
                                              [&](LocalDaemon& proxy, auto reply) {
                                                proxy.injectFault(fault, std::move(reply));
                                              })),
                  daemon->error);
  ask<NSErrorPtr>(*client, [](LocalDaemon& proxy, auto reply) { proxy.stop(std::move(reply)); });
  daemon->number = 77;
  EXPECT_EQ(std::get<0>(ask<std::uint64_t, NSErrorPtr>(
                *client, [](LocalDaemon& proxy,
                            auto reply) { proxy.currentNotifRankWithReply(std::move(reply)); })),
            77U);
  EXPECT_EQ(daemon->asked.take(), "check 5");
  EXPECT_EQ(daemon->asked.take(), "fault stop 2 D -9 8 7");
  EXPECT_EQ(daemon->asked.take(), "stop");
}

// Answers may be long; what a client asks may not, and a question that is too long fails
// without costing the connection.
TEST_F(RoundTrip, LongAnswersArriveAndLongQuestionsFailAlone) {
  VLQueryItem::Properties large = nothingSet();
  large.tagData = NSData(std::string(300'000, 't'));
  daemon->items.assign(100, item(large));
  const auto [items, next, error] =
      ask<NSFileProviderItems, std::uint64_t, NSErrorPtr>(*client, [](auto& proxy, auto reply) {
        proxy.enumerateItemsInFolder(std::nullopt, 0, 0, 1000, std::move(reply));
      });
  ASSERT_EQ(items.size(), 100U);
  EXPECT_EQ(items.back()->tagData(), large.tagData);

  daemon->holds = true;
  Outcome<NSFileProviderItems, std::uint64_t, NSErrorPtr> held;
  client->remoteObjectProxyWithErrorHandler(held.errorHandler())
      ->enumerateItemsInFolder(std::nullopt, 0, 0, 1, held.reply());
  auto answer = daemon->held.take();
  ASSERT_TRUE(answer);
  Outcome<NSErrorPtr> refused;
  client->remoteObjectProxyWithErrorHandler(refused.errorHandler())
      ->files()
      .setTagNames(NSURL::fileURLWithPath("/s/a"), {std::string(600'000, 't')}, refused.reply());
  EXPECT_TRUE(refused.errors->waitForCount(1));
  (*answer)({}, 0, nullptr);
  held.value();
}

}  // namespace
}  // namespace skein
