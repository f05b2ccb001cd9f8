#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "platform/foundation/NSData.h"

namespace skein::vald {

// A point in the history of the working set, as clients keep it: opaque to them, of one
// length and layout on every machine. Pure; any thread.
//
//   bytes 0-3    "VLCT"
//   byte  4      version, 1
//   bytes 5-7    zero
//   bytes 8-15   rank, little-endian
//   bytes 16-55  the journal's identity, zero-filled
inline constexpr std::size_t kChangeTokenLength = 56;
inline constexpr std::size_t kLongestJournalID = 40;

// `journalID`: at most kLongestJournalID bytes, without NUL.
NSData changeTokenFromRank(std::uint64_t rank, const std::string& journalID);

// nil for anything that changeTokenFromRank did not make for this very journal.
std::optional<std::uint64_t> rankOfChangeToken(const NSData& token, const std::string& journalID);

}  // namespace skein::vald
