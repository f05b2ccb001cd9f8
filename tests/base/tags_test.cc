// Tags data and reading options: what the platform's and the framework's functions make of
// bytes and bits.
#include <gtest/gtest.h>

#include "platform/fileprovider/FPTags.h"
#include "vellum/VLFileCoordinator.h"

namespace skein {
namespace {

using Tags = std::vector<FPTag>;

Tags decode(const std::vector<std::uint8_t>& bytes) { return FPGetTagsFromTagsData(NSData(bytes)); }

TEST(TagsData, GivesBackWhatWasWritten) {
  const Tags tags = {{"Red", FPTag::Color::Red},
                     {std::string("\0,\xff", 3), FPTag::Color::None},
                     {std::string(300, 'x'), FPTag::Color::Orange}};
  EXPECT_EQ(FPGetTagsFromTagsData(FPGetTagsDataFromTags(tags)), tags);
  EXPECT_EQ(FPGetTagsDataFromTags({{"ab", FPTag::Color::Gray}}),
            NSData(std::vector<std::uint8_t>{1, 1, 2, 0, 'a', 'b'}));
  EXPECT_EQ(FPGetTagsFromTagsData(FPGetTagsDataFromTags({})), Tags{});
  EXPECT_EQ(FPGetTagsDataFromTags({{"", {}}}), std::nullopt);
  EXPECT_EQ(FPGetTagsDataFromTags({{std::string(65536, 'x'), {}}}), std::nullopt);
}

TEST(TagsData, IsWellFormedOrHoldsNoTagsAtAll) {
  EXPECT_EQ(FPGetTagsFromTagsData(std::nullopt), Tags{});
  const std::vector<std::uint8_t> good = {1, 0, 1, 0, 'a', 7, 1, 0, 'b'};
  ASSERT_EQ(decode(good), (Tags{{"a", {}}, {"b", FPTag::Color::Orange}}));
  for (std::size_t length = 0; length < good.size(); ++length) {
    if (length == 5) continue;  // exactly the first tag
    EXPECT_EQ(decode({good.begin(), good.begin() + static_cast<std::ptrdiff_t>(length)}), Tags{});
  }
  EXPECT_EQ(decode({2, 0, 1, 0, 'a'}), Tags{});
  EXPECT_EQ(decode({1, 8, 1, 0, 'a'}), Tags{});
  EXPECT_EQ(decode({1, 0, 1, 0, 'a', 0, 0, 0}), Tags{});
  EXPECT_EQ(decode({1, 0, 0xff, 0xff, 'a'}), Tags{});
}

TEST(ReadingOptions, AreNamedAndTheRestIsCounted) {
  EXPECT_EQ(VLFileCoordinatorReadingOptionsPrettyPrint(0), "none");
  EXPECT_EQ(VLFileCoordinatorReadingOptionsPrettyPrint(0x2000e),
            "resolves-symbolic-link|metadata-only|for-uploading|always-fetches");
  EXPECT_EQ(VLFileCoordinatorReadingOptionsPrettyPrint(0x8000000000000011),
            "without-changes|0x8000000000000010");
}

}  // namespace
}  // namespace skein
