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

  daemon->fakeCloud.error = NSError::errorWithDomain("d", 1);
  EXPECT_TRUE(std::get<0>(ask<NSErrorPtr>(*client, [](LocalDaemon& proxy, auto reply) {
    proxy.cloud().setConditions({}, std::move(reply));
  })));
}

}  // namespace
}  // namespace skein
