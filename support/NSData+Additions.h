// Category Additions on NSData: the bytes of page tokens and of a folder's sync anchors.
//
//   page token, 16 bytes:    offset (8, host byte order), sort order (1), zeros (7)
//   change token, 24 bytes:  rank (8, host byte order), uuid (16)
//
// Readers check no length: what a token lacks reads as zero, so a foreign token is read
// as some page and as an expired anchor. Pure functions, any thread.
#pragma once

#include <cstdint>
#include <optional>

#include "platform/foundation/NSData.h"
#include "platform/foundation/uuid.h"

namespace skein {

// vl_pageTokenSortOrder
// 0 by name, 1 by date. The platform's initial pages are told by value; nil reads as 0.
std::uint8_t vl_pageTokenSortOrder(const std::optional<NSData>& page);

// vl_pageTokenOffset
// The index of the page's first item; 0 for the initial pages and for nil.
std::uint64_t vl_pageTokenOffset(const std::optional<NSData>& page);

// vl_pageTokenFromSortOrder:offset:
// nil for offset 0, which is how the daemon says "no further page" and how the host
// wants to hear it.
std::optional<NSData> vl_pageTokenFromSortOrder(std::uint8_t sortOrder, std::uint64_t offset);

// vl_changeTokenRankWithUUID:
// The token's rank when it carries `uuid`, else -1. Any negative answer means expired.
// nil reads as empty data.
std::int64_t vl_changeTokenRankWithUUID(const std::optional<NSData>& token, const uuid_t& uuid);

// vl_changeTokenFromRank:uuid:
NSData vl_changeTokenFromRank(std::uint64_t rank, const uuid_t& uuid);

}  // namespace skein
