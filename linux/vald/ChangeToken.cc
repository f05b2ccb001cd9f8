#include "linux/vald/ChangeToken.h"

#include <algorithm>
#include <array>
#include <string_view>

#include "base/Fault.h"

namespace skein::vald {
namespace {

constexpr std::string_view kMagic = "VLCT";
constexpr std::size_t kVersionAt = 4;
constexpr std::uint8_t kVersion = 1;
constexpr std::size_t kRankAt = 8;
constexpr std::size_t kJournalAt = kRankAt + sizeof(std::uint64_t);

static_assert(kJournalAt + kLongestJournalID == kChangeTokenLength);

}  // namespace

NSData changeTokenFromRank(std::uint64_t rank, const std::string& journalID) {
  if (journalID.size() > kLongestJournalID) {
    reportFault("the journal's identity is too long for a change token");
  }
  std::array<std::uint8_t, kChangeTokenLength> bytes{};
  std::copy(kMagic.begin(), kMagic.end(), bytes.begin());
  bytes[kVersionAt] = kVersion;
  for (std::size_t i = 0; i < sizeof rank; ++i) {
    bytes[kRankAt + i] = static_cast<std::uint8_t>(rank >> (8 * i));
  }
  std::copy_n(journalID.begin(), std::min(journalID.size(), kLongestJournalID),
              bytes.begin() + kJournalAt);
  return NSData(bytes);
}

std::optional<std::uint64_t> rankOfChangeToken(const NSData& token, const std::string& journalID) {
  if (token.length() != kChangeTokenLength) return std::nullopt;
  std::uint64_t rank = 0;
  for (std::size_t i = 0; i < sizeof rank; ++i) {
    rank |= std::uint64_t{token.bytes()[kRankAt + i]} << (8 * i);
  }
  // There is one token for a rank: whatever differs anywhere is none of this journal's.
  if (!token.isEqualToData(changeTokenFromRank(rank, journalID))) return std::nullopt;
  return rank;
}

}  // namespace skein::vald
