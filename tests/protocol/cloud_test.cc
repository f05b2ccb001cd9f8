// The local cloud across the socket.
#include "tests/protocol/ProtocolTest.h"

namespace skein {
namespace {

using Cloud = ProtocolTest;

TEST_F(Cloud, ConditionsAndStatusArriveWholeAndErrorsToo) {
  LocalCloudStatus sent;
  sent.uploads = LocalCloudStatus::Uploads::Unlimited;
  sent.uploadLimit = ~0ULL;
  sent.sharesBlocks = true;
  sent.usedBytes = 2;
  sent.waiting = 3;
  sent.failed = 4;
  sent.leftOut = 5;
  sent.lastFailure = "full\n\xff";
  sent.keptLimit = 9;
  sent.keptFiles = 10;
  sent.keptBytes = 11;
  sent.onlyCopiesBytes = 12;
  daemon->fakeCloud.status = sent;

  LocalCloudConditions unlimited{true, true, std::nullopt, 6, 7, 8};
  LocalCloudConditions nothingFits;
  nothingFits.quota = 0;
  for (const LocalCloudConditions& conditions : {unlimited, nothingFits, LocalCloudConditions()}) {
    EXPECT_FALSE(std::get<0>(ask<NSErrorPtr>(*client, [&](LocalDaemon& proxy, auto reply) {
      proxy.cloud().setConditions(conditions, std::move(reply));
    })));
    sent.conditions = conditions;
    const auto [status, error] = ask<LocalCloudStatus, NSErrorPtr>(
        *client,
        [](LocalDaemon& proxy, auto reply) { proxy.cloud().cloudStatus(std::move(reply)); });
    EXPECT_FALSE(error);
    EXPECT_EQ(status, sent);
  }

  EXPECT_FALSE(std::get<0>(ask<NSErrorPtr>(*client, [](LocalDaemon& proxy, auto reply) {
    proxy.cloud().setKeeping({13, 14}, std::move(reply));
  })));
  EXPECT_EQ(daemon->fakeCloud.status.keeping, (LocalCloudKeeping{13, 14}));
  daemon->fakeCloud.collection = {1, 2, 3, ~0ULL};
  const auto [collection, failure] = ask<LocalCloudCollection, NSErrorPtr>(
      *client, [](LocalDaemon& proxy, auto reply) { proxy.cloud().collect(std::move(reply)); });
  EXPECT_FALSE(failure);
  EXPECT_EQ(collection, daemon->fakeCloud.collection);

  for (const bool quick : {false, true}) {
    const auto [verification, problem] =
        ask<LocalCloudVerification, NSErrorPtr>(*client, [quick](LocalDaemon& proxy, auto reply) {
          proxy.cloud().verify({"/a\xff", "/b"}, quick, std::move(reply));
        });
    EXPECT_FALSE(problem);
    EXPECT_EQ(verification, (LocalCloudVerification{
                                {{"/a\xff", "gone"}, {"/b", "gone"}}, quick ? 1U : 2U, ~0ULL}));
  }

  daemon->fakeCloud.error = NSError::errorWithDomain("d", 1);
  EXPECT_TRUE(std::get<0>(ask<NSErrorPtr>(*client, [](LocalDaemon& proxy, auto reply) {
    proxy.cloud().setConditions({}, std::move(reply));
  })));
}

}  // namespace
}  // namespace skein
