// vald's file operations across the socket: what arrives, what comes back, and transfers,
// which end once however they end.
#include "tests/protocol/ProtocolTest.h"

namespace skein {
namespace {

NSURLPtr url(const char* path) { return NSURL::fileURLWithPath(path); }

class Files : public ProtocolTest {
 protected:
  FakeFiles& files() { return daemon->fakeFiles; }
  std::string asked() { return files().asked.take().value_or("nothing"); }

  // Asks with `send(files, reply)` and waits for the reply's values.
  template <class... Values, class Send>
  std::tuple<Values...> askFiles(Send send) {
    return ask<Values...>(
        *client, [&](LocalDaemon& proxy, auto reply) { send(proxy.files(), std::move(reply)); });
  }
  // What a call that answers a URL brought, and what vald was asked.
  template <class Send>
  std::string urlCall(Send send) {
    const auto [got, error] = askFiles<NSURLPtr, NSErrorPtr>(send);
    return asked() + " -> " + (got ? got->path() : "nil") + (error ? " error" : "");
  }
  template <class Send>
  std::string errorCall(Send send) {
    const NSErrorPtr error = std::get<0>(askFiles<NSErrorPtr>(send));
    return asked() + (error ? " -> error" : "");
  }
};

TEST_F(Files, ChangesArriveAsTheyWereAskedForAndAnswerWhereTheItemIs) {
  files().url = url("/s/\xff new\nname");
  const std::string there = " -> /s/\xff new\nname";
  using Reply = LocalFiles::URLReply;
  EXPECT_EQ(urlCall([](LocalFiles& to, Reply r) {
              to.createFolder(url("/s"), "n\n", "o", std::move(r));
            }),
            "createFolder /s n\n o" + there);
  EXPECT_EQ(urlCall([](LocalFiles& to, Reply r) {
              to.makeAlias(url("/s"), "n", "/else/where", "o", std::move(r));
            }),
            "makeAlias /s n /else/where o" + there);
  EXPECT_EQ(urlCall([](LocalFiles& to, Reply r) { to.rename(url("/s/a"), "", "", std::move(r)); }),
            "rename /s/a  " + there);
  EXPECT_EQ(urlCall([](LocalFiles& to, Reply r) {
              to.move(url("/s/a"), url("/s/b"), std::nullopt, true, "o", std::move(r));
            }),
            "move /s/a /s/b nil bounce o" + there);
  EXPECT_EQ(urlCall([](LocalFiles& to, Reply r) {
              to.move(url("/s/a"), url("/s/b"), "", false, "o", std::move(r));
            }),
            "move /s/a /s/b  plain o" + there);
  EXPECT_EQ(urlCall([](LocalFiles& to, Reply r) { to.trash(url("/s/a"), "o", std::move(r)); }),
            "trash /s/a o" + there);
  EXPECT_EQ(urlCall([](LocalFiles& to, Reply r) { to.putBackURL(url("/s/a"), std::move(r)); }),
            "putBackURL /s/a" + there);
  EXPECT_EQ(
      urlCall([](LocalFiles& to, Reply r) { to.coordinateDeletion(url("/s/a"), std::move(r)); }),
      "coordinateDeletion /s/a" + there);

  // Null URLs, and paths that lead nowhere, are null over there: the daemon refuses them.
  files().url = nullptr;
  files().error = vlc_errorInvalidParameter("url", "");
  EXPECT_EQ(urlCall([](LocalFiles& to, Reply r) { to.rename(nullptr, "n", "o", std::move(r)); }),
            "rename nil n o -> nil error");
  EXPECT_EQ(urlCall([](LocalFiles& to, Reply r) { to.trash(url("/s/../x"), "o", std::move(r)); }),
            "trash nil o -> nil error");
}

TEST_F(Files, MetadataAndQuestionsCross) {
  using Reply = Reply<NSErrorPtr>;
  EXPECT_EQ(errorCall([](LocalFiles& to, Reply r) { to.remove(url("/s/a"), "o", std::move(r)); }),
            "remove /s/a o");
  EXPECT_EQ(errorCall([](LocalFiles& to, Reply r) {
              to.setTagNames(url("/s/a"), {"red", "", "gr\xc3\xbcn"}, std::move(r));
            }),
            "setTagNames /s/a red  gr\xc3\xbcn");
  EXPECT_EQ(errorCall([](LocalFiles& to, Reply r) {
              to.setLastOpenDate(url("/s/a"), NSDate(std::chrono::nanoseconds(-5)), std::move(r));
            }),
            "setLastOpenDate /s/a -5");
  EXPECT_EQ(errorCall([](LocalFiles& to, Reply r) {
              to.setLastOpenDate(url("/s/a"), std::nullopt, std::move(r));
            }),
            "setLastOpenDate /s/a nil");
  EXPECT_EQ(
      errorCall([](LocalFiles& to, Reply r) { to.setFavoriteRank(url("/s/a"), 0, std::move(r)); }),
      "setFavoriteRank /s/a 0");
  EXPECT_EQ(errorCall([](LocalFiles& to, Reply r) {
              to.setFavoriteRank(url("/s/a"), std::nullopt, std::move(r));
            }),
            "setFavoriteRank /s/a nil");
  EXPECT_EQ(
      errorCall([](LocalFiles& to, Reply r) { to.setPinned(url("/s/a"), true, std::move(r)); }),
      "setPinned /s/a yes");
  files().error = NSError::errorWithDomain(NSCocoaErrorDomain, NSFileWriteFileExistsError);
  EXPECT_EQ(errorCall([](LocalFiles& to, Reply r) { to.evict(url("/s/a"), std::move(r)); }),
            "evict /s/a -> error");

  files().number = 1ULL << 63;
  const auto [capability, refusal] =
      askFiles<std::uint64_t, NSErrorPtr>([](LocalFiles& to, auto reply) {
        to.capabilityToMove(url("/s/a"), url("/s/b/a"), std::move(reply));
      });
  EXPECT_EQ(asked(), "capabilityToMove /s/a /s/b/a");
  EXPECT_EQ(capability, 1ULL << 63);
  EXPECT_EQ(refusal->code(), NSFileWriteFileExistsError);
  files().error = nullptr;
  files().url = url("/s/.a.skein");
  files().flag = true;
  const auto [physical, isMarker, error] = askFiles<NSURLPtr, bool, NSErrorPtr>(
      [](LocalFiles& to, auto reply) { to.physicalURL(url("/s/a"), std::move(reply)); });
  EXPECT_EQ(physical->path(), "/s/.a.skein");
  EXPECT_TRUE(isMarker);
  EXPECT_FALSE(error);
}

TEST_F(Files, ListsCrossWithEverythingInThemAndPagesAreBounded) {
  VLQueryItem::Properties properties;
  properties.fileObjectID = VLFileObjectID::documentWithRawID(7);
  properties.itemIdentifier = properties.fileObjectID.asString();
  properties.isTrashed = true;
  files().trashed = {{std::make_shared<const VLQueryItem>(properties), url("/s/.Trash/a"),
                      url("/s/a"), NSDate(std::chrono::nanoseconds(3))},
                     {}};
  files().number = 2;
  const auto [items, next, error] = askFiles<std::vector<TrashedItem>, std::uint64_t, NSErrorPtr>(
      [](LocalFiles& to, auto reply) { to.trashedItems(1, 1'000'000, std::move(reply)); });
  EXPECT_EQ(asked(), "trashedItems 1 1000");
  ASSERT_EQ(items.size(), 2U);
  EXPECT_EQ(items[0].item->properties(), properties);
  EXPECT_EQ(items[0].url->path(), "/s/.Trash/a");
  EXPECT_EQ(items[0].putBackURL->path(), "/s/a");
  EXPECT_EQ(items[0].trashed, NSDate(std::chrono::nanoseconds(3)));
  EXPECT_TRUE(!items[1].item && !items[1].url && !items[1].putBackURL && !items[1].trashed);
  EXPECT_EQ(next, 2U);

  const FileHistoryEntry entry{
      NSDate(std::chrono::nanoseconds(9)), "move", "skein mv", "d07", "/s/a", "/s/b", true};
  files().entries = {entry, {}};
  const auto [entries, none] = askFiles<std::vector<FileHistoryEntry>, NSErrorPtr>(
      [](LocalFiles& to, auto reply) { to.history("/s/a", "d07", ~0ULL, std::move(reply)); });
  EXPECT_EQ(asked(), "history /s/a d07 1000");
  ASSERT_EQ(entries.size(), 2U);
  const FileHistoryEntry& got = entries[0];
  EXPECT_EQ(std::tie(got.when, got.operation, got.origin, got.identifier, got.path, got.destination,
                     got.undone),
            std::tie(entry.when, entry.operation, entry.origin, entry.identifier, entry.path,
                     entry.destination, entry.undone));

  files().tags = {{"red", 3}, {"", 0}};
  const auto [tags, noError] = askFiles<std::vector<TagUse>, NSErrorPtr>(
      [](LocalFiles& to, auto reply) { to.tagsInUse("blue\n", std::move(reply)); });
  EXPECT_EQ(asked(), "tagsInUse blue\n");
  ASSERT_EQ(tags.size(), 2U);
  EXPECT_EQ(tags[0].name, "red");
  EXPECT_EQ(tags[0].items, 3U);
}

// --- Transfers.

class Transfers : public Files {
 protected:
  // Starts an import; its one answer comes to `imported`.
  std::shared_ptr<NSProgress> import(DaemonClient& from) {
    return from.remoteObjectProxyWithErrorHandler(imported.errorHandler())
        ->files()
        .importDocument(url("/from"), url("/s"), "n", "o", imported.reply());
  }
  FakeFiles::Transfer begun() {
    auto transfer = files().transfers.take();
    EXPECT_TRUE(transfer) << "vald was not asked";
    return transfer ? std::move(*transfer) : FakeFiles::Transfer();
  }
  // Nothing more than `answers` came, also after what is under way has arrived.
  void expectAnswers(std::size_t replies, std::size_t errors) {
    ask<LocalDaemonStatus, NSErrorPtr>(
        *client, [](LocalDaemon& proxy, auto reply) { proxy.status(std::move(reply)); });
    EXPECT_EQ(imported.replies->count(), replies);
    EXPECT_EQ(imported.errors->count(), errors);
  }

  Outcome<NSURLPtr, NSErrorPtr> imported;
};

TEST_F(Transfers, TellHowFarTheyAreAndEndWithTheLastCounts) {
  const auto progress = import(*client);
  EXPECT_EQ(progress->totalUnitCount(), 0);
  FakeFiles::Transfer transfer = begun();
  EXPECT_EQ(asked(), "import /from /s n o");
  transfer.progress->setTotalUnitCount(1000);
  transfer.progress->setCompletedUnitCount(400);
  EXPECT_TRUE(becomesTrue([&] { return progress->completedUnitCount() == 400; }));
  EXPECT_EQ(progress->totalUnitCount(), 1000);

  transfer.progress->setCompletedUnitCount(1000);
  transfer.reply(url("/s/n"), nullptr);
  const auto [placed, error] = imported.value();
  EXPECT_EQ(placed->path(), "/s/n");
  EXPECT_EQ(progress->completedUnitCount(), 1000);
  // Too late: nothing is left that could be cancelled.
  progress->cancel();
  expectAnswers(0, 0);
  EXPECT_EQ(files().cancellations.count(), 0U);
}

TEST_F(Transfers, ADownloadIsATransferToo) {
  Outcome<NSErrorPtr> downloaded;
  const auto progress = client->remoteObjectProxyWithErrorHandler(downloaded.errorHandler())
                            ->files()
                            .download(url("/s/a"), true, downloaded.reply());
  FakeFiles::Transfer transfer = begun();
  EXPECT_EQ(asked(), "download /s/a current");
  transfer.reply(nullptr, NSError::errorWithDomain(NSCocoaErrorDomain, NSFileNoSuchFileError));
  EXPECT_EQ(std::get<0>(downloaded.value())->code(), NSFileNoSuchFileError);
}

TEST_F(Transfers, CancellingReachesValdWhoseAnswerIsTheOnlyOne) {
  const auto during = import(*client);
  FakeFiles::Transfer transfer = begun();
  during->cancel();
  ASSERT_TRUE(files().cancellations.waitForCount(1));
  EXPECT_TRUE(transfer.progress->isCancelled());
  expectAnswers(0, 0);
  transfer.reply(nullptr, NSError::errorWithDomain(NSCocoaErrorDomain, NSUserCancelledError));
  EXPECT_EQ(std::get<1>(imported.value())->code(), NSUserCancelledError);

  // At once, maybe before it was sent: vald is told all the same, and may have been faster.
  import(*client)->cancel();
  FakeFiles::Transfer second = begun();
  ASSERT_TRUE(files().cancellations.waitForCount(2));
  second.reply(url("/s/n"), nullptr);
  EXPECT_FALSE(std::get<1>(imported.value()));
  expectAnswers(0, 0);
}

TEST_F(Transfers, ALostConnectionFailsThemOnceAndEndsThemInVald) {
  const auto progress = import(*client);
  FakeFiles::Transfer transfer = begun();
  server->dropConnections();
  unreachable(imported.errors->take().value_or(nullptr));
  ASSERT_TRUE(files().cancellations.waitForCount(1));
  transfer.reply(url("/s/n"), nullptr);
  progress->cancel();
  expectAnswers(0, 0);

  // The same when the client goes, or vald drops the reply.
  const auto other = newClient();
  const auto kept = import(*other);
  FakeFiles::Transfer second = begun();
  other->remoteObjectProxyWithErrorHandler(nullptr);
  std::weak_ptr<NSProgress> inVald = second.progress;
  second.reply = nullptr;
  unreachable(imported.errors->take().value_or(nullptr));
  second.progress = nullptr;
  EXPECT_TRUE(becomesTrue([&] { return inVald.expired(); }));
  expectAnswers(0, 0);
}

TEST_F(Transfers, AClientHasOnlySoManyAndAllEndWithIt) {
  constexpr std::size_t kMost = 256;
  std::vector<std::shared_ptr<NSProgress>> progresses;
  for (std::size_t at = 0; at <= kMost; ++at) progresses.push_back(import(*client));
  ASSERT_TRUE(files().transfers.waitForCount(kMost));
  const NSErrorPtr refusal = unreachable(imported.errors->take().value_or(nullptr));
  EXPECT_NE(refusal->localizedDescription().find("too many transfers"), std::string::npos);
  // Another client has its own.
  const auto other = newClient();
  Outcome<NSErrorPtr> downloaded;
  const auto download = other->remoteObjectProxyWithErrorHandler(downloaded.errorHandler())
                            ->files()
                            .download(url("/s/a"), false, downloaded.reply());
  ASSERT_TRUE(files().transfers.waitForCount(kMost + 1));
  client.reset();
  EXPECT_TRUE(files().cancellations.waitForCount(kMost));
  EXPECT_TRUE(imported.errors->waitForCount(kMost));
  EXPECT_EQ(files().cancellations.count(), kMost) << "the other client's goes on";
  while (files().transfers.count() > 0) begun().reply(nullptr, nullptr);
  EXPECT_FALSE(std::get<0>(downloaded.value()));
  EXPECT_EQ(imported.replies->count(), 0U);
}

// --- Faults, of every object that vald serves.

class PlannedFaults final : public CallFaults {
 public:
  std::optional<FaultInjection> take(std::string_view method) override {
    MutexLock lock(_mutex);
    if (!_next || _next->method != method) return std::nullopt;
    return std::exchange(_next, std::nullopt);
  }
  void plan(FaultInjection fault) {
    MutexLock lock(_mutex);
    _next = std::move(fault);
  }

 private:
  Mutex _mutex;
  std::optional<FaultInjection> _next SKEIN_GUARDED_BY(_mutex);
};

class Faults : public Transfers {
 protected:
  Faults() {
    server.reset();
    NSErrorPtr error;
    server = DaemonServer::listen(loop, executor, daemon, socketPath, log, &error, faults);
  }
  void plan(const char* method, FaultInjection::Action action) {
    faults->plan({method, action, "X", -7, 20, 1});
  }
  const std::shared_ptr<PlannedFaults> faults = std::make_shared<PlannedFaults>();
};

TEST_F(Faults, AnswerErrorsWhereverAnswersHaveOne) {
  plan("rename", FaultInjection::Action::AnswerError);
  const auto rename = [](LocalFiles& to, auto reply) {
    to.rename(url("/s/a"), "b", "o", std::move(reply));
  };
  const auto failed = askFiles<NSURLPtr, NSErrorPtr>(rename);
  ASSERT_TRUE(std::get<1>(failed));
  EXPECT_EQ(std::get<1>(failed)->domain(), "X");
  EXPECT_EQ(std::get<1>(failed)->code(), -7);
  EXPECT_EQ(files().asked.count(), 0U) << "the daemon is not asked";
  EXPECT_FALSE(std::get<1>(askFiles<NSURLPtr, NSErrorPtr>(rename)));

  plan("currentNotifRank", FaultInjection::Action::AnswerError);
  EXPECT_EQ(
      std::get<1>(ask<std::uint64_t, NSErrorPtr>(*client,
                                                 [](LocalDaemon& to, auto reply) {
                                                   to.currentNotifRankWithReply(std::move(reply));
                                                 }))
          ->code(),
      -7);
  for (const char* method : {"importDocument", "result"}) {
    plan(method, FaultInjection::Action::AnswerError);
    const auto progress = import(*client);
    EXPECT_EQ(std::get<1>(imported.value())->code(), -7) << method;
  }
}

TEST_F(Faults, ReachTheSendersThatAnAnswerCarried) {
  class Nobody final : public VLItemNotificationReceiving {
    void receiveUpdates(const VLQueryItems&, const std::vector<std::string>&,
                        const std::vector<std::string>&, Reply<>) override {}
    void receiveProgressUpdates(const VLQueryItems&, Reply<>) override {}
  };
  const auto [sender, dictionary, error] =
      ask<std::shared_ptr<VLItemNotificationSender>, VLDaemon::Dictionary, NSErrorPtr>(
          *client, [](LocalDaemon& to, auto reply) {
            to.getItemUpdateSenderWithReceiver(std::make_shared<Nobody>(), std::move(reply));
          });
  const auto fake = daemon->senders.take().value();
  plan("watchItem", FaultInjection::Action::AnswerError);
  Outcome<NSErrorPtr> watched;
  sender->watchItemAtURL(url("/s"), 19, watched.reply());
  EXPECT_EQ(std::get<0>(watched.value())->code(), -7);

  plan("boostPriority", FaultInjection::Action::Delay);
  Outcome<> boosted;
  sender->boostPriority(boosted.reply());
  fake->boosts.take().value()();
  boosted.value();

  plan("watchItem", FaultInjection::Action::DropConnection);
  Outcome<NSErrorPtr> lost;
  sender->remoteObjectProxyWithErrorHandler(lost.errorHandler())
      ->watchItemAtURL(url("/s"), 19, lost.reply());
  unreachable(lost.errors->take().value_or(nullptr));
  EXPECT_EQ(fake->watches.count(), 0U);
}

}  // namespace
}  // namespace skein
