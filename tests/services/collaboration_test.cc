// The collaboration proxy: constants, swapped tokens, and whom it asks.
#include "tests/services/ServicesFixture.h"

namespace skein {
namespace {

struct Collaboration : ProxyFixture<VLFileProviderQuireCollaborationProxy> {
  std::shared_ptr<NSProgress> fetchToken() {
    return proxy->fetchCollaborationTokenWithCompletionHandler(
        [this](const auto& provider, const auto& first, const auto& second, const auto& expiry,
               const NSErrorPtr& error) {
          answered(provider, first, second,
                   expiry == NSDateDistantFuture() ? "never" : description(expiry), say(error));
        });
  }
  ErrorHandler answer() {
    return [this](const NSErrorPtr& error) { answered(say(error)); };
  }

  const std::shared_ptr<VLFileProviderQuireCollaborationProxy> proxy = makeProxy(document);
};

TEST_F(Collaboration, AnswersItsConstantsAndLeavesThreeMethodsOut) {
  proxy->fetchVersionAndCapabilitiesWithCompletionHandler(
      [&](std::uint64_t version, std::uint64_t bits, const NSErrorPtr& error) {
        answered(std::to_string(version), std::to_string(bits), say(error));
      });
  proxy->fetchFileProviderIdentifierWithCompletionHandler(
      [&](const auto& identifier, const NSErrorPtr& error) { answered(identifier, say(error)); });
  proxy->fetchURLForSharingFileWithCompletionHandler(
      [&](const NSURLPtr& url, const NSErrorPtr& error) { answered(url, say(error)); });
  EXPECT_EQ(take(), (Lines{"answer: 1 82 no error", "answer: com.tessel.Vellum no error",
                           "answer: (null) no error"}));

  EXPECT_TRUE(proxy->respondsToSelector("fetchSharedFolderInfoWithCompletionHandler:"));
  for (const char* left : {"setEnvironmentType:", "fetchPrivacyStateWithCompletionHandler:",
                           "documentIsInUseWithTimeout:", "fetchSharedFolderInfo", ""}) {
    EXPECT_FALSE(proxy->respondsToSelector(left)) << left;
  }
  EXPECT_FALSE(proxy->fetchPrivacyStateWithCompletionHandler(
      [&](bool, bool, const NSURLPtr&, const NSErrorPtr& error) { answered(say(error)); }));
  EXPECT_EQ(take(), Lines{"answer: NSCocoaErrorDomain 3328"});
}

TEST_F(Collaboration, TheTokensChangePlaces) {
  auto progress = fetchToken();
  EXPECT_EQ(progress->totalUnitCount(), 0);
  EXPECT_EQ(take(), Lines{"start tokens of file:///store/a"});
  framework.sharing.tokens.next()->finish("share", "base", nullptr);
  EXPECT_EQ(take(), Lines{"answer: com.tessel.Vellum base share never no error"});

  // An error takes the tokens with it.
  fetchToken();
  env.run();
  framework.sharing.tokens.next()->finish("share", "base", error(4355));
  EXPECT_EQ(take().back(), "answer: (null) (null) (null) (null) NSCocoaErrorDomain 4355");

  progress = fetchToken();
  env.run();
  progress->cancel();
  EXPECT_EQ(take().back(), "answer: (null) (null) (null) (null) NSCocoaErrorDomain 3072");
  lookup->urls.clear();
  fetchToken();
  EXPECT_EQ(take(), Lines{"start tokens of (null)"});
}

TEST_F(Collaboration, TheLatestRevisionIsFetchedByAnOperationOfItsOwn) {
  const auto progress = proxy->fetchLatestRevisionWithCompletionHandler(answer());
  EXPECT_EQ(progress->totalUnitCount(), 0);
  EXPECT_EQ(take(), (Lines{"[DEBUG] fetchLatestRevisionWithCompletionHandler: " + document +
                               ", file:///store/a",
                           "operation: providing file:///store/a options 0",
                           "operation: start file:///store/a"}));
  auto operation = framework.operations.next();
  EXPECT_TRUE(operation->wantsCurrent);
  operation->finish(nullptr);
  EXPECT_EQ(take(), Lines{"answer: no error"});

  const auto second = proxy->fetchLatestRevisionWithCompletionHandler(answer());
  env.run();
  second->cancel();
  EXPECT_EQ(take(),
            (Lines{"operation: cancel file:///store/a", "answer: NSCocoaErrorDomain 3072"}));
}

TEST_F(Collaboration, ARefreshIsTheDaemonsAndItsProgressHasNoEffect) {
  const auto refresh = [&] { return proxy->refreshSharingStateWithCompletionHandler(answer()); };
  const auto progress = refresh();
  EXPECT_EQ(progress->totalUnitCount(), 0);
  EXPECT_EQ(take(), Lines{"daemon: refresh the sharing of " + document});
  progress->cancel();
  EXPECT_TRUE(take().empty());
  framework.daemon.sharingRefreshes.next()->reply(nullptr);
  EXPECT_EQ(take(), (Lines{"[DEBUG] finished refreshing state for item identifier: " + document,
                           "answer: no error"}));
  refresh();
  framework.daemon.sharingRefreshes.next()->reply(error(4));
  EXPECT_EQ(take().at(1), "[DEBUG] error refreshing state for item identifier " + document +
                              ": NSCocoaErrorDomain 4");
  // A lost connection answers as well, and logs nothing.
  refresh();
  framework.daemon.sharingRefreshes.next()->fail(error(4097));
  EXPECT_EQ(take().back(), "answer: NSCocoaErrorDomain 4097");
}

TEST_F(Collaboration, FolderSharingIsWhatIsLeftOfTheFirstFlags) {
  const auto state = [&] {
    EXPECT_FALSE(proxy->fetchFolderSharingStateWithCompletionHandler(
        [&](bool shared, const NSErrorPtr& error) {
          answered(shared ? "yes" : "no", say(error));
        }));
  };
  const auto info = [&] {
    EXPECT_FALSE(proxy->fetchSharedFolderInfoWithCompletionHandler(
        [&](bool shared, const auto& name, const NSErrorPtr& error) {
          answered(shared ? "yes" : "no", name, say(error));
        }));
  };
  struct Case {
    std::int64_t a, b, c;
    const char* expected;
  };
  constexpr std::int64_t kHigh = std::int64_t{1} << 40;
  for (const Case& one : {Case{0, 1, 0, "no"}, Case{1, 0, 1, "no"}, Case{3, 3, 1, "yes"},
                          Case{1, 0, 2, "yes"}, Case{1, 0, 3, "no"}, Case{kHigh, 0, 1, "yes"}}) {
    state();
    framework.daemon.shareOptions.next()->reply(one.a, one.b, one.c, "Team", nullptr);
    EXPECT_EQ(take().back(), std::string("answer: ") + one.expected + " no error");
    info();
    framework.daemon.shareOptions.next()->reply(one.a, one.b, one.c, "Team", nullptr);
    EXPECT_EQ(take().back(), std::string("answer: ") + one.expected + " Team no error");
  }
  info();
  EXPECT_EQ(take(), Lines{"daemon: share options of " + document});
  framework.daemon.shareOptions.next()->reply(1, 0, 0, std::nullopt, error(4));
  EXPECT_EQ(take(), Lines{"answer: yes (null) NSCocoaErrorDomain 4"});
  state();
  framework.daemon.shareOptions.next()->fail(error(4097));
  EXPECT_EQ(take().back(), "answer: no NSCocoaErrorDomain 4097");
  info();
  framework.daemon.shareOptions.next()->fail(error(4097));
  EXPECT_EQ(take().back(), "answer: no (null) NSCocoaErrorDomain 4097");
}

}  // namespace
}  // namespace skein
