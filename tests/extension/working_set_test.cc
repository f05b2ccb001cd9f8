// The working set: relayed from the daemon's journal.
#include "enumeration/VLWorkingSetEnumerator.h"

#include <gtest/gtest.h>

#include "tests/support/Observers.h"
#include "tests/support/TestEnvironment.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

NSData token(std::string_view text) { return NSData(text); }

struct WorkingSet : testing::Test {
  std::shared_ptr<RecordingChangeObserver> changes(std::optional<NSData> from) {
    const auto observer = std::make_shared<RecordingChangeObserver>(env.transcript);
    enumerator->enumerateChangesForObserver(observer, std::move(from));
    return observer;
  }
  std::shared_ptr<RecordingObserver> list() {
    const auto observer = std::make_shared<RecordingObserver>(env.transcript);
    enumerator->enumerateItemsForObserver(observer, NSFileProviderInitialPageSortedByDate());
    return observer;
  }
  static NSErrorPtr error(const char* domain, std::int64_t code) {
    return NSError::errorWithDomain(domain, code);
  }

  TestEnvironment env;
  ScriptedDaemon& daemon = env.framework.daemon;
  std::shared_ptr<VLWorkingSetEnumerator> enumerator =
      std::make_shared<VLWorkingSetEnumerator>(env.environment);
};

TEST_F(WorkingSet, AListingEndsEmptyThenSignals) {
  list();
  EXPECT_EQ(env.run(), Lines{"daemon: rank"});
  daemon.ranks.next()->reply(7, nullptr);
  EXPECT_EQ(env.run(), (Lines{"observer: end",
                              "manager: signal NSFileProviderWorkingSetContainerItemIdentifier"}));
  env.framework.manager.signals.next()->reply(error(NSCocoaErrorDomain, 14));
  EXPECT_EQ(env.run(), Lines{});
}

TEST_F(WorkingSet, ChangesAreHandedThroughUntilTheTokenStandsStill) {
  enumerator->currentSyncAnchorWithCompletionHandler(
      [](auto anchor) { EXPECT_EQ(anchor, token("initialSyncAnchor")); });
  const auto deleted =
      std::vector{VLFileObjectID::documentWithRawID(2), VLFileObjectID::folderOrAliasWithRawID(1)};
  auto observer = changes(VLWorkingSetEnumerator::initialSyncAnchor());
  daemon.workingSetChanges.next()->reply({makeItem(1)}, deleted, token("t1"), nullptr);
  EXPECT_EQ(env.run(), (Lines{"daemon: working set from nil limit 200", "observer: updated [doc]",
                              "observer: deleted [d0000000000000002, i0000000000000001]",
                              "observer: anchor, more coming"}));
  EXPECT_EQ(observer->deleted, (Lines{"d0000000000000002", "i0000000000000001"}));
  observer = changes(observer->anchor);
  daemon.workingSetChanges.next()->reply({}, {}, token("t1"), nullptr);
  EXPECT_EQ(env.run(), (Lines{"daemon: working set from t1 limit 200", "observer: updated []",
                              "observer: deleted []", "observer: anchor"}));
  EXPECT_EQ(observer->anchor, token("t1"));
  // Nil is the start of the history; empty data is a token like any other.
  for (const auto& [anchor, asked] :
       {std::pair(std::optional<NSData>(), "nil"), std::pair(std::optional(token("")), "")}) {
    observer = changes(anchor);
    daemon.workingSetChanges.next()->reply({}, {}, token("t1"), nullptr);
    EXPECT_TRUE(observer->moreComing);
    EXPECT_EQ(env.run()[0], "daemon: working set from " + std::string(asked) + " limit 200");
  }
}

TEST_F(WorkingSet, RepliesErrorsAreTranslatedTheConnectionsAreNot) {
  const struct {
    NSErrorPtr reply;
    std::string told;
  } kCases[] = {
      // Plainly, without what lies under it.
      {error(VLVellumErrorDomain, 2), "NSFileProviderErrorDomain -1000"},
      {error(NSCocoaErrorDomain, 4355),
       "NSFileProviderErrorDomain -1004 under NSCocoaErrorDomain 4355"},
      {error(VLVellumErrorDomain, 9), "VLVellumErrorDomain 9"},
      {error(NSCocoaErrorDomain, 2), "NSCocoaErrorDomain 2"},
  };
  for (const auto& [reply, told] : kCases) {
    const auto listing = list();
    daemon.ranks.next()->reply(0, reply);
    EXPECT_EQ(brief(listing->error), told);
    const auto batch = changes(token("t"));
    daemon.workingSetChanges.next()->reply({}, {}, std::nullopt, reply);
    EXPECT_EQ(brief(batch->error), told);
  }
  const NSErrorPtr connection = error(VLVellumErrorDomain, 2);
  const auto listing = list();
  const auto batch = changes(token("t"));
  env.framework.dropConnection(connection);
  EXPECT_EQ(listing->error, connection);
  EXPECT_EQ(batch->error, connection);
  EXPECT_EQ(listing->finishes + batch->finishes, 2);
}

}  // namespace
}  // namespace skein
