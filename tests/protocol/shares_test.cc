// A drive's shares across the socket: what crosses, giving calls up, and the framework's
// operations, which report once however they end.
#include "linux/framework/LocalFramework.h"
#include "platform/cloudkit/CKError.h"
#include "tests/protocol/ProtocolTest.h"

namespace skein {
namespace {

NSURLPtr shareURL(const char* path) { return NSURL::fileURLWithPath(path); }

CKShare fullShare() {
  CKShare share;
  share.rootRecordName = "d0000000000000001";
  share.values = {{CKShareTypeKey, "folder"}, {"\xff key", "a\nvalue"}};
  share.participants = {
      {"ann", CKShareParticipantRole::Owner, CKShareParticipantAcceptanceStatus::Accepted,
       CKShareParticipantPermissionReadWrite},
      {"bob"}};
  share.publicPermission = -3;
  share.isKnownToServer = true;
  share.url = NSURL::URLWithString("skein://share/1");
  return share;
}

void expectEqual(const CKShare& a, const CKShare& b) {
  EXPECT_EQ(a.rootRecordName, b.rootRecordName);
  EXPECT_EQ(a.values, b.values);
  EXPECT_EQ(a.participants, b.participants);
  EXPECT_EQ(a.publicPermission, b.publicPermission);
  EXPECT_EQ(a.isKnownToServer, b.isKnownToServer);
  EXPECT_EQ(a.url ? a.url->absoluteString() : "nil", b.url ? b.url->absoluteString() : "nil");
}

class SharesAcross : public ProtocolTest {
 protected:
  SharesAcross() {
    DaemonClient::Options options;
    options.socketPath = socketPath;
    framework = std::make_unique<LocalFramework>(clientLoop, executor, center, log, options);
  }
  ~SharesAcross() override { framework.reset(); }

  FakeShares& shares() { return daemon->fakeShares; }
  std::string asked() { return shares().asked.take().value_or("nothing"); }
  template <class... Values, class Send>
  std::tuple<Values...> askShares(Send send) {
    return ask<Values...>(
        *client, [&](LocalDaemon& proxy, auto reply) { send(proxy.shares(), std::move(reply)); });
  }

  // Every operation, each with what tells of the end of it: its error.
  std::vector<std::pair<std::shared_ptr<NSOperation>, Outcome<NSErrorPtr>>> everyOperation(
      const NSURLPtr& of, const CKSharePtr& share) {
    VLSharingOperations& make = framework->sharingOperations();
    std::vector<std::pair<std::shared_ptr<NSOperation>, Outcome<NSErrorPtr>>> all(5);
    const auto copy = make.shareCopyOperation(of);
    copy->setRootShareCopyCompletionBlock(
        [end = all[0].second.reply()](auto, auto, NSErrorPtr error) mutable { end(error); });
    const auto copyURL = make.shareCopyShareURLOperation(of, "public.text");
    copyURL->setCopyShareURLCompletionBlock(
        [end = all[1].second.reply()](auto, NSErrorPtr error) mutable { end(error); });
    const auto save = make.shareSaveOperation(share);
    save->setShareSaveCompletionBlock(
        [end = all[2].second.reply()](auto, NSErrorPtr error) mutable { end(error); });
    const auto destroy = make.shareDestroyOperation(share);
    destroy->setShareDestroyCompletionBlock(all[3].second.reply());
    const auto token = make.copyShareTokenOperation(of);
    token->setShareAndBaseTokenCompletionBlock(
        [end = all[4].second.reply()](auto, auto, NSErrorPtr error) mutable { end(error); });
    all[0].first = copy;
    all[1].first = copyURL;
    all[2].first = save;
    all[3].first = destroy;
    all[4].first = token;
    return all;
  }
  // Waits until all have been cancelled over there as well, and answers too late.
  void answerLate(std::size_t count) {
    EXPECT_TRUE(shares().cancellations.waitForCount(count));
    for (std::size_t i = 0; i < count; ++i) (*shares().held.take())();
  }
  static void expectAll(auto& all, const char* domain, std::int64_t code) {
    for (auto& [operation, outcome] : all) {
      const auto error = std::get<0>(outcome.value());
      ASSERT_TRUE(error);
      EXPECT_EQ(error->domain(), domain);
      EXPECT_EQ(error->code(), code) << error->localizedDescription();
    }
  }

  NSNotificationCenter center;
  std::unique_ptr<LocalFramework> framework;
};

TEST_F(SharesAcross, EverythingCrosses) {
  shares().share = std::make_shared<const CKShare>(fullShare());
  shares().text = "i0000000000000002";
  const auto [copied, folder, _] = askShares<CKSharePtr, std::optional<std::string>, NSErrorPtr>(
      [](LocalShares& to, auto reply) { to.copyShare(shareURL("/s/a"), std::move(reply)); });
  EXPECT_EQ(asked(), "copyShare /s/a");
  expectEqual(*copied, fullShare());
  EXPECT_EQ(folder, "i0000000000000002");
  CKShare bare;
  bare.rootRecordName = "d0000000000000003";
  askShares<CKSharePtr, NSErrorPtr>(
      [&](LocalShares& to, auto reply) { to.saveShare(bare, std::move(reply)); });
  expectEqual(*shares().given.take(), bare);
  EXPECT_EQ(asked(), "saveShare d0000000000000003");

  shares().url = NSURL::URLWithString("skein://share/1");
  shares().error =
      NSError::errorWithDomain(CKErrorDomain, CKErrorPartialFailure,
                               {{std::string(CKPartialErrorsByItemIDKeyPrefix) + "x",
                                 NSError::errorWithDomain(CKErrorDomain, CKErrorUnknownItem)}});
  const auto [address, error] = askShares<NSURLPtr, NSErrorPtr>(
      [](LocalShares& to, auto reply) { to.copyShareURL(shareURL("/s/../a"), std::move(reply)); });
  EXPECT_EQ(asked(), "copyShareURL nil");
  EXPECT_EQ(address->absoluteString(), "skein://share/1");
  EXPECT_TRUE(vlc_checkErrorsFromCloudKit(error, vlc_isCloudKitUnknownItemError));
  shares().error = nullptr;
  const auto [token, base, none] =
      askShares<std::optional<std::string>, std::optional<std::string>, NSErrorPtr>(
          [](LocalShares& to, auto reply) { to.copyShareTokens(nullptr, std::move(reply)); });
  EXPECT_EQ(token, shares().text);
  EXPECT_FALSE(base);
  EXPECT_EQ(asked(), "copyShareTokens nil");

  askShares<NSErrorPtr>([&](LocalShares& to, auto reply) {
    to.answerInvitation(shares().url, "bob", true, std::move(reply));
  });
  EXPECT_EQ(asked(), "answer skein://share/1 bob yes");
  askShares<NSErrorPtr>([](LocalShares& to, auto reply) {
    to.attachZone(shareURL("/s/b"), {"zone", "bob"}, 2, std::move(reply));
  });
  EXPECT_EQ(asked(), "attach /s/b zone bob 2");
  askShares<NSErrorPtr>(
      [](LocalShares& to, auto reply) { to.detachZone(shareURL("/s/b"), std::move(reply)); });
  EXPECT_EQ(asked(), "detach /s/b");
  shares().zones = {{shareURL("/s/b"), {"zone", "bob"}, 2}, {}};
  const auto [zones, problem] = askShares<std::vector<AttachedZone>, NSErrorPtr>(
      [](LocalShares& to, auto reply) { to.attachedZones(std::move(reply)); });
  ASSERT_EQ(zones.size(), 2U);
  EXPECT_EQ(zones[0].zone, (CKRecordZoneID{"zone", "bob"}));
  EXPECT_EQ(zones[0].permission, 2);
  EXPECT_FALSE(zones[1].folder);
}

TEST_F(SharesAcross, TheFrameworksQuestionsAreAnsweredFromTheShares) {
  shares().flag = true;
  EXPECT_TRUE(std::get<0>(ask<bool, NSErrorPtr>(*client, [](VLDaemon& to, auto reply) {
    to.checkIfItemIsShareableWithInode(0x10, std::move(reply));
  })));
  EXPECT_EQ(asked(), "isShareable i0000000000000010");
  ask<NSErrorPtr>(*client, [](VLDaemon& to, auto reply) {
    to.refreshSharingStateForItemIdentifier("x", std::move(reply));
  });
  EXPECT_EQ(asked(), "refresh x");
  shares().options = {-1, 2, 3, "Team"};
  const auto [flags, permission, ownFlags, folder, error] =
      ask<std::int64_t, std::int64_t, std::int64_t, std::optional<std::string>, NSErrorPtr>(
          *client, [](VLDaemon& to, auto reply) {
            to.getShareOptionsOfItemIdentifier("x", std::move(reply));
          });
  EXPECT_EQ(flags, -1);
  EXPECT_EQ(permission, 3);
  EXPECT_EQ(ownFlags, 2);
  EXPECT_EQ(folder, "Team");
}

TEST_F(SharesAcross, ACallIsGivenUpByItsProgressAndWithItsClient) {
  shares().holds = true;
  Outcome<CKSharePtr, NSErrorPtr> outcome;
  const auto proxy = client->remoteObjectProxyWithErrorHandler(outcome.errorHandler());
  const auto progress = proxy->shares().saveShare(fullShare(), outcome.reply());
  EXPECT_EQ(asked(), "saveShare d0000000000000001");
  progress->cancel();
  EXPECT_EQ(std::get<1>(outcome.value())->code(), NSUserCancelledError);
  answerLate(1);

  // Cancelled at once: whether it was sent or not, it is answered and vald does not do it.
  const auto second = proxy->shares().saveShare(fullShare(), outcome.reply());
  second->cancel();
  EXPECT_EQ(std::get<1>(outcome.value())->code(), NSUserCancelledError);

  CKShare other = fullShare();
  other.rootRecordName = "d0000000000000009";
  proxy->shares().saveShare(other, outcome.reply());
  while (asked() != "saveShare d0000000000000009") {
  }
  const std::size_t before = shares().cancellations.count();
  client.reset();
  EXPECT_TRUE(shares().cancellations.waitForCount(before + 1));
  unreachable(outcome.errors->take().value_or(nullptr));
}

// The same fault for every call of its method.
class SameFault final : public CallFaults {
 public:
  explicit SameFault(FaultInjection fault) : _fault(std::move(fault)) {}
  std::optional<FaultInjection> take(std::string_view method) override {
    if (method != _fault.method) return std::nullopt;
    taken.add(1);
    return _fault;
  }
  Inbox<int> taken;

 private:
  const FaultInjection _fault;
};

TEST_F(SharesAcross, WhatIsGivenUpWhileItIsHeldUpIsNeverBegun) {
  const auto listenWith = [this](const std::shared_ptr<SameFault>& faults) {
    server.reset();
    server = DaemonServer::listen(loop, executor, daemon, socketPath, log, nullptr, faults);
    client = newClient();
  };
  const auto delay = std::make_shared<SameFault>(
      FaultInjection{"saveShare", FaultInjection::Action::Delay, "", 0, 100, 1});
  listenWith(delay);
  Outcome<CKSharePtr, NSErrorPtr> outcome;
  const auto proxy = client->remoteObjectProxyWithErrorHandler(outcome.errorHandler());
  const auto progress = proxy->shares().saveShare(fullShare(), outcome.reply());
  ASSERT_TRUE(delay->taken.take());
  progress->cancel();
  EXPECT_EQ(std::get<1>(outcome.value())->code(), NSUserCancelledError);
  // Held up as long, from later on.
  CKShare other = fullShare();
  other.rootRecordName = "d0000000000000009";
  proxy->shares().saveShare(other, outcome.reply());
  EXPECT_FALSE(std::get<1>(outcome.value()));
  EXPECT_EQ(asked(), "saveShare d0000000000000009");

  listenWith(
      std::make_shared<SameFault>(FaultInjection{"copyShare", FaultInjection::Action::AnswerError,
                                                 CKErrorDomain, CKErrorPartialFailure, 0, 1}));
  const auto error = std::get<2>(askShares<CKSharePtr, std::optional<std::string>, NSErrorPtr>(
      [](LocalShares& to, auto reply) { to.copyShare(shareURL("/s/a"), std::move(reply)); }));
  EXPECT_TRUE(vlc_checkErrorsFromCloudKit(error, vlc_isCloudKitUnknownItemError));
}

TEST_F(SharesAcross, OperationsReportOnce) {
  const auto share = std::make_shared<const CKShare>(fullShare());
  // What names nothing is not asked.
  auto nulls = everyOperation(nullptr, nullptr);
  for (auto& [operation, outcome] : nulls) operation->start();
  expectAll(nulls, VLVellumErrorDomain, VLVellumErrorInvalidParameter);
  auto before = everyOperation(shareURL("/s/a"), share);
  for (auto& [operation, outcome] : before) {
    operation->cancel();
    operation->start();
  }
  expectAll(before, NSCocoaErrorDomain, NSUserCancelledError);
  EXPECT_EQ(shares().asked.count(), 0U);

  shares().holds = true;
  auto during = everyOperation(shareURL("/s/a"), share);
  for (auto& [operation, outcome] : during) operation->start();
  ASSERT_TRUE(shares().held.waitForCount(during.size()));
  for (auto& [operation, outcome] : during) operation->cancel();
  expectAll(during, NSCocoaErrorDomain, NSUserCancelledError);
  answerLate(during.size());

  auto cut = everyOperation(shareURL("/s/a"), share);
  for (auto& [operation, outcome] : cut) operation->start();
  ASSERT_TRUE(shares().held.waitForCount(cut.size()));
  const auto cutAt = std::chrono::steady_clock::now();
  server.reset();
  expectAll(cut, VLVellumErrorDomain, VLVellumErrorDaemonUnreachable);
  EXPECT_LT(std::chrono::steady_clock::now() - cutAt, std::chrono::seconds(1));
  for (auto* all : {&nulls, &before, &during, &cut}) {
    for (auto& [operation, outcome] : *all) {
      operation->cancel();
      EXPECT_EQ(outcome.replies->count(), 0U);
    }
  }
}

TEST_F(SharesAcross, TheFrameworkMakesSharesAndReadsFlags) {
  shares().share = std::make_shared<const CKShare>(fullShare());
  VLSharingOperations& operations = framework->sharingOperations();
  expectEqual(*operations.VLSharingCreateShareForItemAtURL(shareURL("/s/a"), nullptr), fullShare());
  NSErrorPtr error;
  EXPECT_FALSE(operations.VLSharingCreateShareForItemAtURL(nullptr, &error));
  EXPECT_EQ(error->code(), VLVellumErrorInvalidParameter);
  shares().share = nullptr;
  shares().error = NSError::errorWithDomain(CKErrorDomain, CKErrorPermissionFailure);
  EXPECT_FALSE(operations.VLSharingCreateShareForItemAtURL(shareURL("/s/a"), &error));
  EXPECT_EQ(error->code(), CKErrorPermissionFailure);

  VLQueryItem::Properties properties;
  properties.kind = VLQueryItem::Kind::Alias;
  properties.isShared = true;
  properties.typeIdentifier = "inode/symlink";
  daemon->item = std::make_shared<const VLQueryItem>(properties);
  VLResourceValues& values = framework->resourceValues();
  EXPECT_EQ(values.getResourceValue(shareURL("/s/a"), NSURLUbiquitousItemIsSharedKey, nullptr),
            true);
  EXPECT_EQ(values.getPromisedItemResourceValue(shareURL("/s/a"), NSURLIsAliasFileKey, nullptr),
            true);
  EXPECT_EQ(values.vl_typeIdentifierWithError(shareURL("/s/a"), nullptr), "inode/symlink");
  error = nullptr;
  EXPECT_FALSE(values.getResourceValue(nullptr, NSURLIsAliasFileKey, &error));
  EXPECT_FALSE(values.getResourceValue(shareURL("/s/a"), "other", &error));
  EXPECT_FALSE(error);
  daemon->item = nullptr;
  daemon->error = NSError::errorWithDomain(NSCocoaErrorDomain, NSFileNoSuchFileError);
  EXPECT_FALSE(values.getResourceValue(shareURL("/s/a"), NSURLIsAliasFileKey, &error));
  EXPECT_EQ(error->code(), NSFileNoSuchFileError);
}

}  // namespace
}  // namespace skein
