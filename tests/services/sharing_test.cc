// The sharing proxy: what it answers, logs, caches, counts and refuses.
#include "platform/cloudkit/CKError.h"
#include "tests/services/ServicesFixture.h"

namespace skein {
namespace {

struct Sharing : ProxyFixture<VLSharingProxy> {
  Sharing() { use(document); }
  void use(const std::string& identifier) {
    proxy = makeProxy(identifier);
    who = description(*proxy);
    take();
  }
  std::string opening(int section, const std::string& method,
                      const std::string& identifier = documentID(1)) const {
    return "[INFO] ┏" + std::to_string(section) + " " + who + " -[VLSharingProxy " + method + "] " +
           identifier;
  }
  std::string replied(const std::string& values) const {
    return "[DEBUG] " + who + ": reply(" + values + ")";
  }
  static std::string closing(int section) { return "[INFO] ┗" + std::to_string(section) + " "; }

  std::shared_ptr<NSProgress> fetch() {
    return proxy->fetchShareWithCompletion(
        [this](const CKSharePtr& share, const NSErrorPtr& error) {
          answered(share, say(error));
          lastShare = share;
          lastError = error;
        });
  }
  std::shared_ptr<NSProgress> save(const CKSharePtr& share) {
    return proxy->saveShare(share, [this](const CKSharePtr& saved, const NSErrorPtr& error) {
      answered(saved, say(error));
      lastError = error;
    });
  }
  std::shared_ptr<NSProgress> unshare() {
    return proxy->unshareWithCompletion([this](const NSErrorPtr& error) {
      answered(say(error));
      lastError = error;
    });
  }
  // A fetch that finds `share`.
  void know(const CKSharePtr& share) {
    fetch();
    env.run();
    framework.sharing.copies.next()->finish(share, std::nullopt, nullptr);
    take();
  }
  bool isCached() {
    const bool cached = fetch() == nullptr;
    if (!cached) {
      env.run();
      framework.sharing.copies.next()->finish(nullptr, "i1", error(4));
    }
    take();
    return cached;
  }

  std::shared_ptr<VLSharingProxy> proxy;
  std::string who;
  CKSharePtr lastShare;
  NSErrorPtr lastError;
  const CKSharePtr known = makeShare("public.text", true);
  const CKSharePtr folders = makeShare("folder", true);
};

TEST_F(Sharing, TheFlagQueriesAnswerWhetherTheItemIsShared) {
  const auto ask = [&] {
    proxy->fetchSharingInfo(
        [&](bool shared, const NSFileProviderItemPtr& item, const NSErrorPtr& error) {
          answered(shared ? "shared" : "not shared", item, say(error));
          lastError = error;
        });
    return take();
  };
  const auto preflight = [&] {
    EXPECT_FALSE(proxy->preflightCheckIfCurrentlyShareableWithCompletion(
        [&](bool shared, const auto& item, const auto& some, const auto& others,
            const NSErrorPtr& error) {
          answered(shared ? "shared" : "not shared", item, some, others, say(error));
        }));
    return take();
  };
  framework.resourceValues.flags["NSURLUbiquitousItemIsSharedKey /store/a"] = true;
  EXPECT_EQ(ask(),
            (Lines{opening(2, "fetchSharingInfo:"),
                   "read NSURLUbiquitousItemIsSharedKey of file:///store/a",
                   replied("1, (null), (null)"), "answer: shared (null) no error", closing(2)}));
  EXPECT_EQ(preflight(), (Lines{opening(4, "preflightCheckIfCurrentlyShareableWithCompletion:"),
                                "read NSURLUbiquitousItemIsSharedKey of file:///store/a",
                                replied("1, (null), (null), (null), (null)"),
                                "answer: shared (null) (null) (null) no error", closing(4)}));

  framework.resourceValues.error = error(257);
  EXPECT_EQ(ask().at(3), "answer: not shared (null) NSCocoaErrorDomain 257");
  EXPECT_EQ(lastError, framework.resourceValues.error);
  EXPECT_EQ(preflight().at(3), "answer: not shared (null) (null) (null) NSCocoaErrorDomain 257");

  lookup->urls.clear();
  EXPECT_EQ(ask().at(2), "answer: not shared (null) NSFileProviderErrorDomain -1005");
  EXPECT_EQ(std::get<std::string>(lastError->userInfo().begin()->second), document);
  EXPECT_EQ(preflight().at(2),
            "answer: not shared (null) (null) (null) NSFileProviderErrorDomain -1005");
}

TEST_F(Sharing, PreparingHasNoEffect) {
  proxy->startPreparingForShareWhenForcing(true);
  EXPECT_EQ(take(), (Lines{opening(2, "startPreparingForShareWhenForcing:"), closing(2)}));
}

TEST_F(Sharing, AFetchAsksOnceAndThenAnswersFromWhatIsKnown) {
  const auto progress = fetch();
  ASSERT_TRUE(progress);
  EXPECT_EQ(progress->totalUnitCount(), 1);
  EXPECT_EQ(take(), (Lines{opening(2, "fetchShareWithCompletion:"), closing(2),
                           "start share copy of file:///store/a"}));
  framework.sharing.copies.next()->finish(known, std::nullopt, nullptr);
  EXPECT_EQ(take(), (Lines{replied(description(*known) + ", (null)"),
                           "answer: " + description(*known) + " no error"}));
  EXPECT_EQ(progress->completedUnitCount(), 0);

  EXPECT_FALSE(fetch());
  EXPECT_EQ(lastShare, known);
  EXPECT_EQ(take(), (Lines{opening(4, "fetchShareWithCompletion:"),
                           replied(description(*known) + ", (null)"),
                           "answer: " + description(*known) + " no error", closing(4)}));
}

TEST_F(Sharing, WhatIsStoredDependsOnTheSecondValueAlone) {
  const auto fetchGiving = [&](const CKSharePtr& share, const std::optional<std::string>& second,
                               const NSErrorPtr& error) {
    fetch();
    env.run();
    framework.sharing.copies.next()->finish(share, second, error);
    take();
  };
  fetchGiving(folders, "i7", nullptr);
  EXPECT_EQ(lastShare, folders);
  EXPECT_FALSE(isCached());
  // Beside an error the share is stored, and not answered.
  const NSErrorPtr failure = error(4355);
  fetchGiving(known, std::nullopt, failure);
  EXPECT_EQ(lastShare, nullptr);
  EXPECT_EQ(lastError, failure);
  EXPECT_TRUE(isCached());
}

TEST_F(Sharing, AnItemWithoutAShareGetsOneToBeginWithWhichIsNotKept) {
  framework.sharing.createdShare = makeShare("public.text", false);
  const NSErrorPtr partial = NSError::errorWithDomain(
      CKErrorDomain, CKErrorPartialFailure,
      {{std::string(CKPartialErrorsByItemIDKeyPrefix) + "share", error(11, CKErrorDomain)}});
  for (const NSErrorPtr& missing :
       {error(11, CKErrorDomain), error(20, "VLVellumErrorDomain"), partial}) {
    fetch();
    take();
    framework.sharing.copies.next()->finish(nullptr, std::nullopt, missing);
    EXPECT_EQ(take().at(0), "sharing: new share of file:///store/a");
    EXPECT_EQ(lastShare, framework.sharing.createdShare);
    EXPECT_FALSE(lastError);
    EXPECT_FALSE(isCached());
  }
  framework.sharing.createdShare = nullptr;
  framework.sharing.createError = error(513);
  fetch();
  env.run();
  framework.sharing.copies.next()->finish(nullptr, std::nullopt, partial);
  EXPECT_EQ(lastError, framework.sharing.createError);

  // Other errors are handed on; so is one of another domain with that number.
  for (const NSErrorPtr& other :
       {error(20), error(11, "VLVellumErrorDomain"), error(2, CKErrorDomain)}) {
    fetch();
    env.run();
    framework.sharing.copies.next()->finish(nullptr, std::nullopt, other);
    EXPECT_EQ(lastError, other);
  }
}

TEST_F(Sharing, ParticipantsComeFromAFetchThatLogsItself) {
  const auto participants = [&] {
    return proxy->fetchParticipantListAndPublicPermission(
        [this](const auto& list, std::int64_t permission, const NSErrorPtr& error) {
          answered(list, std::to_string(permission), say(error));
        });
  };
  const auto progress = participants();
  ASSERT_TRUE(progress);
  EXPECT_EQ(take(), (Lines{opening(2, "fetchParticipantListAndPublicPermission:"),
                           opening(4, "fetchShareWithCompletion:"), closing(4), closing(2),
                           "start share copy of file:///store/a"}));
  framework.sharing.copies.next()->finish(known, std::nullopt, nullptr);
  const std::string list = "(" + description(known->participants[0]) + ")";
  EXPECT_EQ(take(), (Lines{replied(description(*known) + ", (null)"), replied(list + ", 3, (null)"),
                           "answer: " + list + " 3 no error"}));
  EXPECT_FALSE(participants());

  use(folder);
  participants();
  env.run();
  framework.sharing.copies.next()->finish(nullptr, std::nullopt, error(4355));
  EXPECT_EQ(take().back(), "answer: (null) 0 NSCocoaErrorDomain 4355");
}

TEST_F(Sharing, TheShareURLNeedsATypeAndCountsBeforeItReplies) {
  std::int64_t countAtReply = -1;
  std::shared_ptr<NSProgress> progress;
  const auto fetchURL = [&] {
    progress =
        proxy->fetchShareURLWithCompletion([&](const NSURLPtr& url, const NSErrorPtr& error) {
          countAtReply = progress ? progress->completedUnitCount() : -1;
          answered(url, say(error));
        });
  };
  fetchURL();
  EXPECT_EQ(take(), (Lines{opening(2, "fetchShareURLWithCompletion:"), closing(2),
                           "start share URL of file:///store/a, public.text"}));
  framework.sharing.urls.next()->finish(NSURL::URLWithString("https://share.test/x%20y?z"),
                                        nullptr);
  EXPECT_EQ(take(), (Lines{replied("https://share.test/x%20y?z, (null)"),
                           "answer: https://share.test/x%20y?z no error"}));
  EXPECT_EQ(countAtReply, 1);

  fetchURL();
  env.run();
  progress->cancel();
  EXPECT_EQ(take().back(), "answer: (null) NSCocoaErrorDomain 3072");

  framework.resourceValues.error = error(257);
  progress = nullptr;
  fetchURL();
  EXPECT_FALSE(progress);
  EXPECT_EQ(take().at(2), "answer: (null) NSCocoaErrorDomain 257");
  lookup->urls.clear();
  fetchURL();
  EXPECT_EQ(take().at(2), "answer: (null) no error");
}

TEST_F(Sharing, SavingStoresWhatIsGivenAndThenWhatCameBack) {
  const CKSharePtr mine = makeShare("public.text", false);
  const auto progress = save(mine);
  ASSERT_TRUE(progress);
  EXPECT_EQ(take(), (Lines{opening(2, "saveShare:completion:"), closing(2),
                           "start save of " + description(*mine)}));
  EXPECT_EQ(framework.sharing.lastSaved, mine);
  fetch();
  EXPECT_EQ(lastShare, mine);
  take();
  framework.sharing.saves.next()->finish(known, nullptr);
  EXPECT_EQ(take(), (Lines{replied(description(*known) + ", (null)"),
                           "answer: " + description(*known) + " no error"}));
  EXPECT_EQ(progress->completedUnitCount(), 1);
  fetch();
  EXPECT_EQ(lastShare, known);

  // A failure leaves nothing known.
  save(mine);
  env.run();
  framework.sharing.saves.next()->finish(nullptr, error(4355));
  EXPECT_FALSE(isCached());
}

TEST_F(Sharing, AFoldersShareIsNeverSavedHere) {
  for (const std::string& identifier : {document, folder}) {
    use(identifier);
    know(known);
    EXPECT_FALSE(save(folders));
    EXPECT_EQ(take().at(2), "answer: (null) NSPOSIXErrorDomain 45");
    fetch();
    EXPECT_EQ(lastShare, known);
  }
}

TEST_F(Sharing, UnsharingRepliesBeforeItsSecondUnit) {
  std::vector<std::int64_t> counts;
  std::shared_ptr<NSProgress> progress;
  progress = proxy->unshareWithCompletion([&](const NSErrorPtr& error) {
    counts.push_back(progress->completedUnitCount());
    answered(say(error));
  });
  EXPECT_EQ(progress->totalUnitCount(), 2);
  EXPECT_EQ(take(),
            (Lines{opening(2, "unshareWithCompletion:"), opening(4, "fetchShareWithCompletion:"),
                   closing(4), closing(2), "start share copy of file:///store/a"}));
  framework.sharing.copies.next()->finish(known, std::nullopt, nullptr);
  counts.push_back(progress->completedUnitCount());
  EXPECT_EQ(take(), (Lines{replied(description(*known) + ", (null)"),
                           "start removal of " + description(*known)}));
  EXPECT_FALSE(isCached());
  framework.sharing.destroys.next()->finish(nullptr);
  EXPECT_EQ(take(), (Lines{replied("(null)"), "answer: no error"}));
  EXPECT_EQ(counts, (std::vector<std::int64_t>{1, 1}));
  EXPECT_EQ(progress->completedUnitCount(), 2);
}

TEST_F(Sharing, UnsharingLeavesAloneWhatIsNotItsOwn) {
  // Not on the server: nothing to remove.
  know(makeShare("public.text", false));
  const auto progress = unshare();
  EXPECT_EQ(take().at(4), "answer: no error");
  EXPECT_EQ(progress->completedUnitCount(), 0);
  progress->cancel();  // of a fetch that has no progress

  use(document);
  know(folders);
  unshare();
  EXPECT_EQ(take().at(4), "answer: NSPOSIXErrorDomain 45");
  EXPECT_TRUE(isCached());

  use(folder);
  know(folders);
  unshare();
  EXPECT_EQ(take().back(), "start removal of " + description(*folders));

  use(document);
  unshare();
  env.run();
  const NSErrorPtr failure = error(4355);
  framework.sharing.copies.next()->finish(nullptr, std::nullopt, failure);
  EXPECT_EQ(lastError, failure);
}

TEST_F(Sharing, CancellingEndsTheOperationThatIsUnderWay) {
  const auto cancelled = [&](const std::string& operation) {
    const Lines lines = take();
    EXPECT_EQ(lines.at(0), "cancel " + operation);
    EXPECT_TRUE(lines.back().ends_with(" NSCocoaErrorDomain 3072")) << lines.back();
    framework.sharing.drop();
  };
  auto progress = fetch();
  take();
  progress->cancel();
  cancelled("share copy of file:///store/a");

  progress = save(known);
  take();
  progress->cancel();
  cancelled("save of " + description(*known));

  // Unsharing: the fetch first, then the removal.
  progress = unshare();
  take();
  progress->cancel();
  cancelled("share copy of file:///store/a");
  know(known);
  progress = unshare();
  take();
  progress->cancel();
  cancelled("removal of " + description(*known));

  // Between the two: the removal is cancelled before it starts.
  use(document);
  std::shared_ptr<NSProgress> late;
  framework.sharing.destroys.made = [&](const auto&) { late->cancel(); };
  late = unshare();
  env.run();
  framework.sharing.copies.next()->finish(known, std::nullopt, nullptr);
  EXPECT_EQ(take().back(), "answer: NSCocoaErrorDomain 3072");
}

TEST_F(Sharing, AProgressKeepsNoOperation) {
  const auto progress = fetch();
  env.run();
  auto copy = framework.sharing.copies.next();
  const std::weak_ptr<ScriptedShareCopy> weak = copy;
  copy->finish(known, std::nullopt, nullptr);
  copy = nullptr;
  EXPECT_TRUE(weak.expired());
  progress->cancel();
}

}  // namespace
}  // namespace skein
