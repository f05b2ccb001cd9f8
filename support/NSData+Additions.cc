#include "support/NSData+Additions.h"

#include <algorithm>
#include <array>
#include <bit>

#include "platform/fileprovider/NSFileProviderItem.h"

namespace skein {
namespace {

template <std::size_t Size>
using Bytes = std::array<std::uint8_t, Size>;

constexpr std::size_t kNumberSize = 8;
constexpr std::size_t kSortOrderAt = 8;
using PageToken = Bytes<16>;
using ChangeToken = Bytes<24>;

template <class Token>
Token firstBytes(const std::optional<NSData>& data) {
  Token token{};
  if (data) data->getBytes(token.data(), token.size());
  return token;
}

template <class Token>
std::uint64_t number(const Token& token) {
  Bytes<kNumberSize> head;
  std::copy_n(token.begin(), kNumberSize, head.begin());
  return std::bit_cast<std::uint64_t>(head);
}

template <class Token>
void setNumber(Token& token, std::uint64_t number) {
  const auto head = std::bit_cast<Bytes<kNumberSize>>(number);
  std::copy(head.begin(), head.end(), token.begin());
}

}  // namespace

std::uint8_t vl_pageTokenSortOrder(const std::optional<NSData>& page) {
  if (page == NSFileProviderInitialPageSortedByDate()) return 1;
  if (page == NSFileProviderInitialPageSortedByName()) return 0;
  return firstBytes<PageToken>(page)[kSortOrderAt];
}

std::uint64_t vl_pageTokenOffset(const std::optional<NSData>& page) {
  if (page == NSFileProviderInitialPageSortedByName() ||
      page == NSFileProviderInitialPageSortedByDate()) {
    return 0;
  }
  return number(firstBytes<PageToken>(page));
}

std::optional<NSData> vl_pageTokenFromSortOrder(std::uint8_t sortOrder, std::uint64_t offset) {
  if (offset == 0) return std::nullopt;
  PageToken token{};
  setNumber(token, offset);
  token[kSortOrderAt] = sortOrder;
  return NSData(token);
}

std::int64_t vl_changeTokenRankWithUUID(const std::optional<NSData>& token, const uuid_t& uuid) {
  const auto bytes = firstBytes<ChangeToken>(token);
  uuid_t given;
  std::copy(bytes.begin() + kNumberSize, bytes.end(), given.begin());
  if (uuid_compare(given, uuid) != 0) return -1;
  return static_cast<std::int64_t>(number(bytes));
}

NSData vl_changeTokenFromRank(std::uint64_t rank, const uuid_t& uuid) {
  ChangeToken token;
  setNumber(token, rank);
  std::copy(uuid.begin(), uuid.end(), token.begin() + kNumberSize);
  return NSData(token);
}

}  // namespace skein
