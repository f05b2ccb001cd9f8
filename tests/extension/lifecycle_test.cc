// The principal class: construction, account changes, destruction.
#include <gtest/gtest.h>

#include "extension/VLFileProviderExtension.h"
#include "tests/support/Observers.h"
#include "tests/support/TestEnvironment.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

struct Lifecycle : testing::Test {
  std::size_t observers() {
    return env.notificationCenter.observerCount(VLAccountTokenDidChangeNotification);
  }
  TestEnvironment env;
  const std::shared_ptr<const NSExtensionAttributes> attributes =
      std::make_shared<NSExtensionAttributes>();
};

TEST_F(Lifecycle, WithoutTheSuperclassNothingIsMadeOrRegistered) {
  EXPECT_FALSE(VLFileProviderExtension::init(nullptr, env.environment));
  EXPECT_EQ(env.run(), Lines{});
  EXPECT_EQ(observers(), 0u);
}

TEST_F(Lifecycle, AnAccountChangeSignalsTheRootUntilTheEnd) {
  // Changes are posted before anybody listens, so none is heard half made.
  env.framework.accounts.observed = [this] { EXPECT_EQ(observers(), 0u); };
  auto extension = VLFileProviderExtension::init(attributes, env.environment);
  ASSERT_TRUE(extension);
  EXPECT_EQ(env.run(), Lines{"accounts: observe"});

  const Lines signalled = {
      "[DEBUG] received account did update notification, signal changes to fileproviderd",
      "manager: signal NSFileProviderRootContainerItemIdentifier"};
  env.notificationCenter.postNotificationName(VLAccountTokenDidChangeNotification);
  EXPECT_EQ(env.run(), signalled);
  env.framework.manager.signals.next()->reply(nullptr);
  EXPECT_EQ(env.run(), Lines{});
  env.notificationCenter.postNotificationName(VLAccountTokenDidChangeNotification);
  const auto signal = env.framework.manager.signals.next();
  env.run();
  // The answer may come after the object's end.
  extension = nullptr;
  EXPECT_EQ(observers(), 0u);
  signal->reply(NSError::errorWithDomain(NSCocoaErrorDomain, 14));
  EXPECT_EQ(env.run(), Lines{"[ERROR] failed to signal enumerator for root container: "
                             "NSCocoaErrorDomain 14"});
}

TEST_F(Lifecycle, ServesLookupsAndEnumerators) {
  const auto extension = VLFileProviderExtension::init(attributes, env.environment);
  NSFileProviderExtension& host = *extension;
  env.framework.documents.urls[VLFileObjectID::documentWithRawID(1)] = storeURL("/a");
  env.framework.queryItems.items["/store/a"] = makeItem(1);
  const std::string one = documentID(1);
  EXPECT_EQ(host.URLForItemWithPersistentIdentifier(one)->path(), "/store/a");
  EXPECT_EQ(host.persistentIdentifierForItemAtURL(storeURL("/a")), one);
  EXPECT_EQ(host.itemForIdentifier(one, nullptr)->itemIdentifier(), one);
  EXPECT_TRUE(host.enumeratorForContainerItemIdentifier(NSFileProviderRootContainerItemIdentifier,
                                                        nullptr));
  const NSErrorPtr exists =
      NSError::errorWithDomain(NSCocoaErrorDomain, 516, {{NSURLErrorKey, storeURL("/a")}});
  EXPECT_EQ(brief(host.fileProviderErrorFromFSError(exists)), "NSFileProviderErrorDomain -1001");
}

}  // namespace
}  // namespace skein
