// The bytes of page tokens and sync anchors.
#include <gtest/gtest.h>

#include "platform/fileprovider/NSFileProviderItem.h"
#include "support/NSData+Additions.h"

namespace skein {
namespace {

NSData bytes(std::vector<std::uint8_t> values) { return NSData(values); }

TEST(Tokens, PageTokensHoldOffsetAndOrder) {
  EXPECT_EQ(vl_pageTokenFromSortOrder(1, 0x0102030405060708),
            bytes({8, 7, 6, 5, 4, 3, 2, 1, 1, 0, 0, 0, 0, 0, 0, 0}));
  EXPECT_EQ(vl_pageTokenFromSortOrder(0, 0), std::nullopt);
  EXPECT_EQ(vl_pageTokenFromSortOrder(1, 0), std::nullopt);
}

TEST(Tokens, ReadersCheckNoLengthAndFillWithZeros) {
  const struct {
    std::optional<NSData> page;
    std::uint8_t order;
    std::uint64_t offset;
  } kCases[] = {
      {std::nullopt, 0, 0},
      {NSFileProviderInitialPageSortedByName(), 0, 0},
      {NSFileProviderInitialPageSortedByDate(), 1, 0},
      // By value: the same bytes in another object.
      {NSData(NSFileProviderInitialPageSortedByDate().view()), 1, 0},
      {vl_pageTokenFromSortOrder(1, ~0ULL), 1, ~0ULL},
      {bytes({}), 0, 0},
      {bytes({5, 1}), 0, 0x105},
      {bytes({1, 0, 0, 0, 0, 0, 0, 0, 7}), 7, 1},
      {bytes({1, 0, 0, 0, 0, 0, 0, 0, 1, 9, 9, 9, 9, 9, 9, 9, 9, 9}), 1, 1},
  };
  for (const auto& [page, order, offset] : kCases) {
    EXPECT_EQ(vl_pageTokenSortOrder(page), order) << (page ? page->view() : "nil");
    EXPECT_EQ(vl_pageTokenOffset(page), offset) << (page ? page->view() : "nil");
  }
}

TEST(Tokens, AChangeTokenReadsAsItsRankForItsUUIDAlone) {
  uuid_t uuid;
  for (std::size_t i = 0; i < uuid.size(); ++i) uuid[i] = static_cast<std::uint8_t>(0x10 + i);
  uuid_t other = uuid;
  other.back() ^= 1;

  const NSData five = vl_changeTokenFromRank(5, uuid);
  EXPECT_EQ(five, bytes({5,    0,    0,    0,    0,    0,    0,    0,    0x10, 0x11, 0x12, 0x13,
                         0x14, 0x15, 0x16, 0x17, 0x18, 0x19, 0x1a, 0x1b, 0x1c, 0x1d, 0x1e, 0x1f}));
  EXPECT_EQ(vl_changeTokenRankWithUUID(five, uuid), 5);
  EXPECT_EQ(vl_changeTokenRankWithUUID(five, other), -1);
  EXPECT_EQ(vl_changeTokenRankWithUUID(vl_changeTokenFromRank(0, uuid), uuid), 0);
  // The top bit makes a rank negative, which is expired whatever its uuid says.
  EXPECT_EQ(vl_changeTokenRankWithUUID(vl_changeTokenFromRank(1ULL << 63, uuid), uuid), INT64_MIN);
  EXPECT_EQ(vl_changeTokenRankWithUUID(NSData(five.span().first(23)), uuid), -1);
  EXPECT_EQ(vl_changeTokenRankWithUUID(NSData(), uuid), -1);
  EXPECT_EQ(vl_changeTokenRankWithUUID(std::nullopt, uuid), -1);
}

}  // namespace
}  // namespace skein
