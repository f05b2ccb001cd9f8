#include "linux/protocol/ServicesCodec.h"

#include <memory>
#include <utility>

namespace skein::codec {
namespace {

// More than any person's share has.
constexpr unsigned kMostParticipants = 1'000;
constexpr unsigned kMostValues = 100;

}  // namespace

void encodeForClient(wire::Share::Builder builder, const CKShare& share) {
  encode(builder, share);
  builder.disownRootRecordName();
}

CKSharePtr decodeFromClient(wire::Share::Reader reader) {
  KJ_REQUIRE(reader.getParticipants().size() <= kMostParticipants, "too many participants");
  KJ_REQUIRE(reader.getValues().size() <= kMostValues, "too many values in a share");
  CKShare share = decode(reader);
  share.rootRecordName.clear();
  return std::make_shared<const CKShare>(std::move(share));
}

std::string address(const NSURLPtr& url) {
  if (!url) return {};
  return url->isFileURL() ? url->path() : url->absoluteString();
}

NSURLPtr urlFromAddress(const std::string& address) {
  return address.starts_with('/') ? NSURL::fileURLWithPath(address) : NSURL::URLWithString(address);
}

}  // namespace skein::codec
