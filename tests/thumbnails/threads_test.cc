// Batches on real threads.
#include <gtest/gtest.h>

#include <atomic>

#include "tests/support/CountingPool.h"
#include "tests/thumbnails/ThumbnailFixture.h"

namespace skein {
namespace {

// A download that starts on the only thread there is, while a record's callback holds it.
TEST(ThumbnailThreads, WaitingForADownloadToStartLeavesAThreadForIt) {
  const auto pool = std::make_shared<CountingPool>(1);
  TestEnvironment env(pool);
  ScriptedFramework& framework = env.framework;
  const auto document = VLFileObjectID::documentWithRawID(1);
  framework.documents.urls[document] = storeURL("/1");
  VLQueryItem::Properties properties;
  properties.typeIdentifier = framework.transfer.renderableType;
  framework.queryItems.items["/store/1"] = std::make_shared<VLQueryItem>(properties);
  framework.transfer.holdsStarts = true;
  std::atomic<int> thumbnails{0};
  framework.transfer.starts.handTo([&](const auto& call) {
    pool->post([&thumbnails, call] {
      EXPECT_EQ(thumbnails, 0) << "answered before the download was under way";
      call->reply(nullptr);
    });
  });
  // The answer of vald comes on the same thread, which the question does not hold.
  framework.daemon.contentRecords.handTo([&](const auto& call) {
    pool->post([call, document] {
      call->reply(VLContentRecordIDs{{document, {"1", {"z", CKCurrentUserDefaultName}}}}, nullptr);
    });
  });

  const auto extension =
      VLFileProviderExtension::init(std::make_shared<NSExtensionAttributes>(), env.environment);
  std::atomic<int> completions{0};
  pool->post([&] {
    extension->fetchThumbnailsForItemIdentifiersWithType(
        {document.asString()}, {64, 64}, [&](auto&&...) { ++thumbnails; },
        [&](const NSErrorPtr&) { ++completions; });
  });
  ASSERT_TRUE(pool->waitIdle());
  const auto operation = framework.cloud.privateDatabase.next();
  pool->post([&] {
    operation->record("1", {{kVLRecordKeySize, std::int64_t{1}}});
    operation->finish();
  });
  ASSERT_TRUE(pool->waitIdle());
  EXPECT_EQ(thumbnails, 1);
  EXPECT_EQ(completions, 1);
}

}  // namespace
}  // namespace skein
