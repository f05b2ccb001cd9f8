// Which items offer which services, and what becomes of listeners and connections.
#include "tests/services/ServicesFixture.h"

namespace skein {
namespace {

struct ServiceSources : ServicesFixture {
  std::vector<std::string> names(const std::string& identifier) {
    std::vector<std::string> names;
    for (const auto& source : sources(identifier)) names.push_back(source->serviceName());
    return names;
  }
  // Answers the daemon's check at once, as a daemon's thread would.
  void answerChecks(bool shareable, const NSErrorPtr& error = nullptr) {
    framework.daemon.shareableChecks.handTo(
        [=](const auto& call) { call->reply(shareable, error); });
  }
  const std::vector<std::string> both{"com.tessel.QuireCollaboration",
                                      "com.tessel.Vellum.SharingV1"};
};

TEST_F(ServiceSources, ADocumentOffersCollaborationThenSharing) {
  EXPECT_EQ(names(document), both);
  EXPECT_EQ(take(), Lines{"read promised NSURLIsAliasFileKey of file:///store/a"});

  // What cannot be read is no alias; a document that has no URL is not even asked about.
  framework.resourceValues.error = error(4);
  EXPECT_EQ(names(document), both);
  EXPECT_EQ(take().at(1),
            "[ERROR] Failed to get alias file key at file:///store/a - NSCocoaErrorDomain 4");
  EXPECT_EQ(names(documentID(99)), both);
  EXPECT_EQ(take(), Lines{"[ERROR] Failed to get alias file key at (null) - (null)"});

  framework.resourceValues.error = nullptr;
  framework.resourceValues.flags["NSURLIsAliasFileKey /store/a"] = true;
  EXPECT_TRUE(names(document).empty());
  EXPECT_EQ(take().at(1),
            "[DEBUG] Not allowing sharing of file:///store/a because it's a rover bookmark");
}

TEST_F(ServiceSources, AFolderOffersSharingWhenTheDaemonSaysSo) {
  answerChecks(true);
  EXPECT_EQ(names(folder), std::vector<std::string>{"com.tessel.Vellum.SharingV1"});
  EXPECT_EQ(take(), Lines{"daemon: is inode 7 shareable"});
  answerChecks(false);
  EXPECT_TRUE(names(folder).empty());
  answerChecks(true, error(4));
  EXPECT_TRUE(names(folder).empty());
  // The connection fails instead of a reply.
  framework.daemon.shareableChecks.handTo([](const auto& call) { call->fail(error(4097)); });
  EXPECT_TRUE(names(folder).empty());
  take();
  // What is no identifier names no inode.
  EXPECT_TRUE(names("i-7").empty());
  EXPECT_EQ(take(), Lines{"daemon: is inode 0 shareable"});
}

TEST_F(ServiceSources, EverythingElseOffersNothing) {
  for (const char* identifier : {"", "x", "NSFileProviderRootContainerItemIdentifier",
                                 "NSFileProviderWorkingSetContainerItemIdentifier",
                                 "NSFileProviderAllDirectoriesContainerItemIdentifier"}) {
    EXPECT_TRUE(names(identifier).empty()) << identifier;
  }
  EXPECT_TRUE(take().empty());
}

TEST_F(ServiceSources, AListenerLivesUntilItsFirstConnectionAndThenWithIt) {
  auto source = sources(document).at(1);
  take();
  NSErrorPtr untouched;
  ASSERT_TRUE(source->makeListenerEndpointAndReturnError(&untouched));
  EXPECT_FALSE(untouched);
  EXPECT_EQ(take(), (Lines{"listener 1 delegate", "listener 1 endpoint", "listener 1 resume"}));
  const auto listener = framework.xpcListeners.made.at(0);
  ASSERT_FALSE(listener.expired());

  const auto first = listener.lock()->connect();
  const auto second = listener.lock()->connect();
  EXPECT_EQ(take(), (Lines{"listener 1 connection 1 exports VLSharingServiceV1",
                           "listener 1 connection 1 resume",
                           "listener 1 connection 2 exports VLSharingServiceV1",
                           "listener 1 connection 2 resume"}));
  EXPECT_TRUE(exported<VLSharingProxy>(first->object));
  EXPECT_NE(first->object, second->object);

  // The source and the host let go; the connections alone keep the listener.
  source = nullptr;
  first->close();
  EXPECT_EQ(take(), (Lines{"[DEBUG] sharing service source connection invalidated",
                           "listener 1 invalidate"}));
  EXPECT_FALSE(listener.expired());
  second->interrupt();
  EXPECT_EQ(take(), (Lines{"[DEBUG] sharing service source connection interrupted",
                           "listener 1 connection 2 invalidate",
                           "[DEBUG] sharing service source connection invalidated",
                           "listener 1 invalidate"}));
  EXPECT_TRUE(listener.expired());
}

TEST_F(ServiceSources, AnEndpointThatNobodyConnectsToEndsWithItsSource) {
  auto source = sources(document).at(0);
  source->makeListenerEndpointAndReturnError(nullptr);
  const auto listener = framework.xpcListeners.made.at(0);
  EXPECT_FALSE(listener.expired());
  source = nullptr;
  EXPECT_TRUE(listener.expired());
}

TEST_F(ServiceSources, AConnectionThatEndedTakesItsListenerAlongThoughTheSourceStays) {
  const auto source = sources(document).at(1);
  source->makeListenerEndpointAndReturnError(nullptr);
  const auto listener = framework.xpcListeners.made.at(0);
  auto connection = listener.lock()->connect();
  connection->close();
  connection = nullptr;
  EXPECT_TRUE(listener.expired());
}

TEST_F(ServiceSources, CollaborationExportsItsOwnProxyAndSaysSo) {
  const auto source = sources(document).at(0);
  source->makeListenerEndpointAndReturnError(nullptr);
  const auto connection = framework.xpcListeners.made.at(0).lock()->connect();
  EXPECT_TRUE(exported<VLFileProviderQuireCollaborationProxy>(connection->object));
  take();
  // The interruption handler does not keep the connection.
  std::weak_ptr<ScriptedConnection> weak = connection;
  connection->interrupt();
  EXPECT_EQ(take(), (Lines{"[DEBUG] collaboration service source connection interrupted",
                           "listener 1 connection 1 invalidate",
                           "[DEBUG] collaboration service source connection invalidated",
                           "listener 1 invalidate"}));
}

TEST_F(ServiceSources, AConnectionKeepsTheExtensionAndNothingKeepsTheConnection) {
  const auto source = sources(document).at(1);
  source->makeListenerEndpointAndReturnError(nullptr);
  auto connection = framework.xpcListeners.made.at(0).lock()->connect();
  const std::weak_ptr<ScriptedConnection> weak = connection;
  connection = nullptr;
  EXPECT_TRUE(weak.expired());
}

}  // namespace
}  // namespace skein
