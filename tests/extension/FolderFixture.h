#pragma once

#include <gtest/gtest.h>

#include "enumeration/VLFileEnumerator.h"
#include "tests/support/Observers.h"
#include "tests/support/TestEnvironment.h"

namespace skein {

inline constexpr char kRoot[] = "NSFileProviderRootContainerItemIdentifier";
inline constexpr char kFolder[] = "i0000000000000007";

inline const NSErrorPtr kCocoa14 = NSError::errorWithDomain(NSCocoaErrorDomain, 14);
inline const NSErrorPtr kVellum9 = NSError::errorWithDomain("VLVellumErrorDomain", 9);

// A folder's enumerator over a scripted daemon.
struct FolderFixture : testing::Test {
  std::shared_ptr<VLFileEnumerator> make(const std::string& identifier, bool recursive = false) {
    return VLFileEnumerator::initWithFileObjectID(
        VLFileObjectID::fileObjectIDWithString(identifier), storeURL("/f"), identifier, recursive,
        env.environment);
  }
  std::shared_ptr<RecordingObserver> list(std::optional<NSData> page = std::nullopt) {
    const auto observer = std::make_shared<RecordingObserver>(env.transcript);
    enumerator->enumerateItemsForObserver(observer, std::move(page));
    return observer;
  }
  // Sets the link up, without a listing.
  std::shared_ptr<ScriptedSender> link() {
    enumerator->setupNotificationReceivingIfNeededWithCompletion([](NSErrorPtr) {});
    env.executor->runAll();
    const auto sender = daemon.makeSender();
    daemon.senders.next()->reply(sender, nullptr);
    env.executor->runAll();
    env.transcript.take();
    return sender;
  }
  // The error a setup ends with, in the transcript.
  void setUpReceiving() {
    enumerator->setupNotificationReceivingIfNeededWithCompletion(
        [this](const NSErrorPtr& error) { env.transcript.add("set up: " + brief(error)); });
    env.executor->runAll();
  }
  void push(const VLQueryItems& items) {
    enumerator->receiveUpdates(items, {}, {}, [this] { env.transcript.add("replied"); });
  }
  NSData currentAnchor() {
    std::optional<NSData> current;
    enumerator->currentSyncAnchorWithCompletionHandler([&](auto anchor) { current = anchor; });
    return current.value();
  }
  std::shared_ptr<RecordingChangeObserver> changes(std::optional<NSData> from) {
    const auto observer = std::make_shared<RecordingChangeObserver>(env.transcript);
    enumerator->enumerateChangesForObserver(observer, std::move(from));
    EXPECT_EQ(observer->finishes, 1);
    return observer;
  }
  // Whether a change request from `anchor` finds it expired.
  bool expired(const NSData& anchor) { return brief(changes(anchor)->error) == kExpired; }

  static constexpr char kExpired[] = "NSFileProviderErrorDomain -1002";

  TestEnvironment env;
  ScriptedDaemon& daemon = env.framework.daemon;
  std::shared_ptr<VLFileEnumerator> enumerator = make(kFolder);
};

}  // namespace skein
