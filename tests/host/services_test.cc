// An item's services through the socket: what crosses, how connections end, and that a
// client reaches nothing but its own item.
#include <dirent.h>

#include "linux/protocol/Codec.h"
#include "linux/protocol/SocketServer.h"
#include "linux/protocol/host.capnp.h"
#include "linux/protocol/services.capnp.h"
#include "tests/host/ServicesHost.h"

namespace skein {
namespace {

CKSharePtr someShare() {
  CKShare share;
  share.rootRecordName = "the server's own";
  share.values = {{CKShareTypeKey, "public.text"}, {"any", "bytes \xff"}};
  share.participants = {
      {"kim", CKShareParticipantRole::Owner, CKShareParticipantAcceptanceStatus::Accepted,
       CKShareParticipantPermissionReadWrite},
      {"ada"}};
  share.publicPermission = -7;
  share.isKnownToServer = true;
  share.url = NSURL::URLWithString("https://share.test/1");
  return std::make_shared<const CKShare>(std::move(share));
}

std::size_t openDescriptors() {
  std::size_t count = 0;
  DIR* folder = opendir("/proc/self/fd");
  while (readdir(folder) != nullptr) ++count;
  closedir(folder);
  return count;
}

using ServicesTest = ServicesHost;
using Words = std::optional<std::string>;

TEST_F(ServicesTest, SourcesAndTheirErrorsCross) {
  const auto sources = [&](const std::string& identifier) {
    return ask<std::vector<std::string>>([&](auto reply) {
      client->serviceSources(HostTarget::identifier(identifier), std::move(reply));
    });
  };
  EXPECT_EQ(
      std::get<0>(sources(documentID(1))),
      (std::vector<std::string>{"com.tessel.QuireCollaboration", "com.tessel.Vellum.SharingV1"}));
  EXPECT_EQ(brief(std::get<1>(sources(documentID(99)))), "NSFileProviderErrorDomain -1005");
  const auto [none, error] = ask<std::shared_ptr<ServiceEndpoint>>([&](auto reply) {
    client->endpoint(HostTarget::identifier(documentID(1)), "other", std::move(reply));
  });
  EXPECT_FALSE(none);
  EXPECT_EQ(error->localizedDescription(),
            "This item does not offer the service other; it offers com.tessel.QuireCollaboration "
            "and com.tessel.Vellum.SharingV1.");
  framework.accounts.account = nullptr;
  EXPECT_EQ(brief(std::get<1>(sources(documentID(1)))).substr(0, 31),
            "NSFileProviderErrorDomain -1000");
}

TEST_F(ServicesTest, EveryReplyOfSharingCrosses) {
  answerFetches(someShare());
  framework.resourceValues.flags["NSURLUbiquitousItemIsSharedKey /store/a"] = true;
  const auto connection = sharingOf();
  ASSERT_TRUE(connection);
  EXPECT_FALSE(connection->collaboration());
  VLSharingServiceV1& sharing = *connection->sharing();
  EXPECT_TRUE(std::get<0>(ask<bool, NSFileProviderItemPtr>(
      [&](auto reply) { sharing.fetchSharingInfo(std::move(reply)); })));
  using Items = VLSharingServiceV1::Items;
  const auto preflight = ask<bool, NSFileProviderItemPtr, Items, Items>([&](auto reply) {
    sharing.preflightCheckIfCurrentlyShareableWithCompletion(std::move(reply));
  });
  EXPECT_EQ(preflight, std::tuple(true, nullptr, std::nullopt, std::nullopt, nullptr));
  sharing.startPreparingForShareWhenForcing(true);

  const auto [share, error] = fetchShare(*connection);
  ASSERT_TRUE(share);
  EXPECT_EQ(share->rootRecordName, "");
  EXPECT_EQ(share->values, someShare()->values);
  EXPECT_EQ(share->participants, someShare()->participants);
  EXPECT_EQ(share->publicPermission, -7);
  EXPECT_TRUE(share->isKnownToServer);
  EXPECT_TRUE(isEqualURL(share->url, someShare()->url));
  const auto [people, permission, none] = ask<VLSharingServiceV1::Participants, std::int64_t>(
      [&](auto reply) { sharing.fetchParticipantListAndPublicPermission(std::move(reply)); });
  EXPECT_EQ(people, someShare()->participants);
  EXPECT_EQ(permission, -7);
}

TEST_F(ServicesTest, EveryReplyOfCollaborationCrosses) {
  framework.sharing.tokens.made = [](const std::shared_ptr<ScriptedCopyToken>& token) {
    token->onStart = [weak = std::weak_ptr(token)] {
      weak.lock()->finish("share", "base", nullptr);
    };
  };
  framework.daemon.shareOptions.handTo(
      [](const auto& call) { call->reply(3, 0, 1, "Team", nullptr); });
  const NSErrorPtr failure = NSError::errorWithDomain(
      "domain", -3, {{NSUnderlyingErrorKey, NSError::errorWithDomain("inner", 5)}});
  framework.daemon.sharingRefreshes.handTo([&](const auto& call) { call->reply(failure); });
  const auto connection = connect(endpoint(VLQuireCollaborationServiceName));
  ASSERT_TRUE(connection);
  EXPECT_FALSE(connection->sharing());
  VLFileProviderQuireCollaboration& service = *connection->collaboration();
  EXPECT_TRUE(service.respondsToSelector("fetchLatestRevisionWithCompletionHandler:"));
  EXPECT_FALSE(service.respondsToSelector("setEnvironmentType:"));
  service.setEnvironmentType(1);
  service.documentIsInUseWithTimeout(1.5);

  const auto version = ask<std::uint64_t, std::uint64_t>([&](auto reply) {
    service.fetchVersionAndCapabilitiesWithCompletionHandler(std::move(reply));
  });
  EXPECT_EQ(version, std::tuple(1, 82, nullptr));
  const auto token = ask<Words, Words, Words, std::optional<NSDate>>(
      [&](auto reply) { service.fetchCollaborationTokenWithCompletionHandler(std::move(reply)); });
  EXPECT_EQ(token,
            std::tuple("com.tessel.Vellum", "base", "share", NSDateDistantFuture(), nullptr));
  EXPECT_EQ(ask<Words>([&](auto reply) {
              service.fetchFileProviderIdentifierWithCompletionHandler(std::move(reply));
            }),
            std::tuple("com.tessel.Vellum", nullptr));
  EXPECT_EQ(ask<NSURLPtr>([&](auto reply) {
              service.fetchURLForSharingFileWithCompletionHandler(std::move(reply));
            }),
            std::tuple(nullptr, nullptr));
  EXPECT_EQ((ask<bool, Words>([&](auto reply) {
              service.fetchSharedFolderInfoWithCompletionHandler(std::move(reply));
            })),
            std::tuple(true, "Team", nullptr));
  EXPECT_EQ(ask<bool>([&](auto reply) {
              service.fetchFolderSharingStateWithCompletionHandler(std::move(reply));
            }),
            std::tuple(true, nullptr));
  const auto [error] = ask<>(
      [&](auto reply) { service.refreshSharingStateWithCompletionHandler(std::move(reply)); });
  EXPECT_EQ(brief(error), brief(failure));
  EXPECT_EQ(std::get<3>(ask<bool, bool, NSURLPtr>([&](auto reply) {
              service.fetchPrivacyStateWithCompletionHandler(std::move(reply));
            }))->code(),
            NSFeatureUnsupportedError);
}

TEST_F(ServicesTest, AProgressIsWatchedAndCancelledFromTheClient) {
  Inbox<std::shared_ptr<ScriptedCopyShareURL>> made;
  framework.sharing.urls.made = [&](const auto& operation) { made.add(operation); };
  const auto connection = sharingOf();
  Outcome<NSURLPtr, NSErrorPtr> outcome;
  auto progress = connection->sharing()->fetchShareURLWithCompletion(outcome.reply());
  auto operation = *made.take();
  EXPECT_TRUE(becomesTrue([&] { return progress->totalUnitCount() == 1; }));
  EXPECT_EQ(progress->completedUnitCount(), 0);
  operation->finish(NSURL::URLWithString("x:y"), nullptr);
  EXPECT_EQ(std::get<0>(outcome.value())->absoluteString(), "x:y");
  EXPECT_TRUE(becomesTrue([&] { return progress->completedUnitCount() == 1; }));

  // Cancelled at once: before the service can have told of its own progress.
  Outcome<NSURLPtr, NSErrorPtr> second;
  progress = connection->sharing()->fetchShareURLWithCompletion(second.reply());
  progress->cancel();
  EXPECT_EQ(std::get<1>(second.value())->code(), NSUserCancelledError);

  // A progress that is let go of cancels nothing, and keeps nothing.
  Outcome<NSURLPtr, NSErrorPtr> third;
  connection->sharing()->fetchShareURLWithCompletion(third.reply());
  made.take();
  operation = *made.take();
  EXPECT_TRUE(pool->waitIdle());
  EXPECT_FALSE(operation->isCancelled());
  operation->finish(nullptr, nullptr);
  third.value();
}

TEST_F(ServicesTest, AConnectionIsClosedOrItsClientIsGone) {
  const auto logged = [&](const std::string& what) {
    EXPECT_TRUE(becomesTrue(nothingIsLeft));
    EXPECT_TRUE(pool->waitIdle());
    const Lines lines = env.transcript.take();
    return std::count(lines.begin(), lines.end(),
                      "[DEBUG] sharing service source connection " + what);
  };
  auto connection = sharingOf();
  connection->close();
  connection->close();
  EXPECT_FALSE(connection->sharing());
  connection = nullptr;
  EXPECT_EQ(logged("invalidated"), 1);

  // What is under way when the client goes is cancelled.
  Inbox<std::shared_ptr<ScriptedShareCopy>> made;
  framework.sharing.copies.made = [&](const auto& operation) { made.add(operation); };
  for (const bool closes : {true, false}) {
    connection = sharingOf();
    Outcome<CKSharePtr, NSErrorPtr> outcome;
    connection->sharing()->fetchShareWithCompletion(outcome.reply());
    const auto operation = *made.take();
    EXPECT_TRUE(pool->waitIdle());
    if (closes) {
      connection->close();
      EXPECT_EQ(std::get<1>(outcome.value())->code(), NSUserCancelledError);
    } else {
      connection = nullptr;
      client = nullptr;  // with its socket
      EXPECT_EQ(std::get<1>(outcome.value())->code(), VLVellumErrorDaemonUnreachable);
    }
    EXPECT_TRUE(becomesTrue([&] { return operation->isCancelled(); }));
    EXPECT_EQ(logged("interrupted"), closes ? 0 : 1);
  }
}

TEST_F(ServicesTest, AnEndpointServesASecondConnectionWhileTheFirstLives) {
  answerFetches(someShare());
  const auto shared = endpoint(VLSharingServiceName);
  const auto first = connect(shared);
  const auto second = connect(shared);
  ASSERT_TRUE(first && second);
  EXPECT_EQ(LocalListeners::livingListeners(), 1U);
  first->close();
  EXPECT_TRUE(becomesTrue([] { return LocalListeners::livingConnections() == 1; }));
  EXPECT_TRUE(std::get<0>(fetchShare(*second)));
  EXPECT_TRUE(pool->waitIdle());
  EXPECT_FALSE(connect(shared));
  EXPECT_EQ(lastError->code(), NSXPCConnectionInvalid);
  second->close();
  EXPECT_TRUE(becomesTrue(nothingIsLeft));
  EXPECT_FALSE(second->sharing());
}

TEST_F(ServicesTest, WhatAClientSendsIsAboutItsOwnItem) {
  answerFetches(someShare());
  framework.sharing.saves.made = [](const std::shared_ptr<ScriptedShareSave>& save) {
    save->onStart = [weak = std::weak_ptr(save)] { weak.lock()->finish(nullptr, nullptr); };
  };
  const auto connection = sharingOf(documentID(2));
  CKShare forged = *someShare();
  forged.rootRecordName = documentID(1);
  ask<CKSharePtr>([&](auto reply) {
    connection->sharing()->saveShare(std::make_shared<const CKShare>(forged), std::move(reply));
  });
  EXPECT_EQ(framework.sharing.lastSaved->rootRecordName, documentID(2));

  // After the item is gone the connection is about nothing.
  framework.documents.urls.erase(VLFileObjectID::documentWithRawID(2));
  const auto [shared, item, error] = ask<bool, NSFileProviderItemPtr>(
      [&](auto reply) { connection->sharing()->fetchSharingInfo(std::move(reply)); });
  EXPECT_EQ(brief(error), "NSFileProviderErrorDomain -1005");
}

// Messages as they are made by hand, with what the proxies never send.
class HandMade : public ServicesTest {
 protected:
  ~HandMade() override { raw.close(); }

  // Gives use(endpoint) a fresh endpoint on the loop's thread.
  template <class Use>
  void withEndpoint(Use use) {
    raw.send(
        [use](capnp::Capability::Client server) -> kj::Promise<Task> {
          auto request = server.castAs<wire::Host>()
                             .servicesRequest()
                             .send()
                             .getServices()
                             .castAs<wire::Services>()
                             .endpointRequest();
          request.setIsIdentifier(true);
          const std::string identifier = documentID(1);
          const std::string name = VLSharingServiceName;
          request.setTarget(codec::bytes(identifier));
          request.setServiceName(codec::bytes(name));
          return request.send().then([use](auto&& results) { return use(results.getEndpoint()); });
        },
        [this](const NSErrorPtr& error) { failures.add(error->localizedDescription()); });
  }
  static wire::ServiceConnection::Client connection(wire::Endpoint::Client& endpoint) {
    return endpoint.connectRequest().send().getConnection();
  }
  template <class Promise>
  static kj::Promise<Task> answered(Promise promise) {
    return promise.then([](auto&&) -> Task { return [] {}; });
  }

  SocketClient raw{clientLoop, clientPool, options()};
  Inbox<std::string> failures;
};

TEST_F(HandMade, WhatAnEndpointIsNotItCannotBeMadeToBe) {
  withEndpoint([](wire::Endpoint::Client endpoint) {
    return answered(endpoint.castAs<wire::Host>().statusRequest().send());
  });
  EXPECT_TRUE(failures.take().has_value());
  withEndpoint([](wire::Endpoint::Client endpoint) {
    return answered(endpoint.castAs<wire::Services>().endpointRequest().send());
  });
  EXPECT_TRUE(failures.take().has_value());
  withEndpoint([](wire::Endpoint::Client endpoint) {
    return answered(connection(endpoint).castAs<wire::Collaboration>().selectorsRequest().send());
  });
  EXPECT_TRUE(failures.take().has_value());
  withEndpoint([](wire::Endpoint::Client endpoint) {
    auto save = connection(endpoint).castAs<wire::Sharing>().saveShareRequest();
    save.initShare().initParticipants(5000);
    return answered(save.send());
  });
  EXPECT_NE(failures.take().value_or("").find("participants"), std::string::npos);
  EXPECT_TRUE(becomesTrue(nothingIsLeft));
  EXPECT_TRUE(sharingOf());
}

TEST_F(HandMade, AnEndpointThatIsHandedOnReachesTheSameItemAlone) {
  answerFetches(someShare());
  Inbox<std::shared_ptr<wire::Endpoint::Client>> handedOn;
  withEndpoint([&](wire::Endpoint::Client endpoint) -> kj::Promise<Task> {
    auto own = clientLoop->own(std::make_unique<wire::Endpoint::Client>(kj::mv(endpoint)));
    return Task([&handedOn, own = std::move(own)] { handedOn.add(own); });
  });
  const auto endpoint = handedOn.take();
  ASSERT_TRUE(endpoint);
  const auto relay = SocketServer::listen(
      clientLoop, folder + "/relay",
      [own = *endpoint](pid_t) -> capnp::Capability::Client { return *own; }, env.log, {}, nullptr);
  const std::shared_ptr<RpcLoop> otherLoop = RpcLoop::start("other-io");
  SocketClient other(otherLoop, clientPool,
                     {"relay", folder + "/relay", std::nullopt, std::chrono::seconds(20)});
  Inbox<std::string> words;
  const auto failed = [&](const NSErrorPtr&) { words.add("refused"); };
  other.send(
      [&](capnp::Capability::Client server) {
        auto own = server.castAs<wire::Endpoint>();
        auto request = connection(own).castAs<wire::Sharing>().fetchShareRequest();
        return request.send().then([&](auto&& results) -> Task {
          const bool isNameless = !results.getShare().hasRootRecordName();
          return [&, isNameless] { words.add(isNameless ? "a share" : "a name"); };
        });
      },
      failed);
  EXPECT_EQ(words.take(), "a share");
  other.send(
      [](capnp::Capability::Client server) {
        return answered(server.castAs<wire::Services>().endpointRequest().send());
      },
      failed);
  EXPECT_EQ(words.take(), "refused");
  other.close();
}

TEST_F(ServicesTest, OneClientHoldsABoundedNumberOfEndpoints) {
  std::vector<std::shared_ptr<ServiceEndpoint>> held;
  NSErrorPtr refused;
  while (held.size() <= 1024 && !refused) {
    const auto [made, error] = ask<std::shared_ptr<ServiceEndpoint>>([&](auto reply) {
      client->endpoint(HostTarget::identifier(documentID(1)), VLSharingServiceName,
                       std::move(reply));
    });
    if (made) held.push_back(made);
    refused = error;
  }
  EXPECT_EQ(held.size(), 1024U);
  ASSERT_TRUE(refused);
  held.clear();
  EXPECT_TRUE(becomesTrue(nothingIsLeft));
  EXPECT_TRUE(endpoint(VLSharingServiceName));
}

TEST_F(ServicesTest, RoundsLeaveNothingBehind) {
  answerFetches(someShare());
  env.log.setEnabled(LogType::Debug, false);
  env.log.setEnabled(LogType::Info, false);
  std::vector<std::shared_ptr<HostServices>> clients;
  for (int i = 0; i < 4; ++i) clients.push_back(newClient());
  const auto round = [&](int number) {
    client = clients[static_cast<std::size_t>(number) % clients.size()];
    const auto connection = number % 2 == 0 ? sharingOf() : sharingOf(documentID(2));
    EXPECT_TRUE(std::get<0>(fetchShare(*connection)));
    if (number % 3 != 0) connection->close();
  };
  for (int number = 0; number < 8; ++number) round(number);
  EXPECT_TRUE(becomesTrue(nothingIsLeft));
  const std::size_t before = openDescriptors();
  for (int number = 0; number < 100; ++number) {
    round(number);
    env.transcript.take();
  }
  EXPECT_TRUE(becomesTrue(nothingIsLeft));
  EXPECT_EQ(openDescriptors(), before);
}

}  // namespace
}  // namespace skein
