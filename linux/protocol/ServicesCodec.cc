#include "linux/protocol/ServicesCodec.h"

#include <utility>

namespace skein::codec {
namespace {

constexpr unsigned kMostParticipants = 10'000;
constexpr unsigned kMostValues = 1'000;

}  // namespace

void encode(wire::Share::Builder builder, const CKShare& share) {
  auto values = builder.initValues(static_cast<unsigned>(share.values.size()));
  unsigned at = 0;
  for (const auto& [key, value] : share.values) {
    values[at].setKey(bytes(key));
    values[at++].setValue(bytes(value));
  }
  encode(builder.initParticipants(static_cast<unsigned>(share.participants.size())),
         share.participants);
  builder.setPublicPermission(share.publicPermission);
  builder.setIsKnownToServer(share.isKnownToServer);
  if (share.url) builder.setUrl(bytes(address(share.url)));
}

CKSharePtr decode(wire::Share::Reader reader) {
  KJ_REQUIRE(reader.getValues().size() <= kMostValues, "too many values in a share");
  CKShare share;
  for (const auto value : reader.getValues()) {
    share.values.emplace(text(value.getKey()), text(value.getValue()));
  }
  share.participants = decode(reader.getParticipants());
  share.publicPermission = reader.getPublicPermission();
  share.isKnownToServer = reader.getIsKnownToServer();
  if (reader.hasUrl()) share.url = urlFromAddress(text(reader.getUrl()));
  return std::make_shared<const CKShare>(std::move(share));
}

void encode(capnp::List<wire::Participant>::Builder builder,
            const std::vector<CKShareParticipant>& participants) {
  unsigned at = 0;
  for (const CKShareParticipant& participant : participants) {
    auto one = builder[at++];
    one.setName(bytes(participant.name));
    one.setRole(static_cast<std::uint8_t>(participant.role));
    one.setAcceptanceStatus(static_cast<std::uint8_t>(participant.acceptanceStatus));
    one.setPermission(participant.permission);
  }
}

std::vector<CKShareParticipant> decode(capnp::List<wire::Participant>::Reader reader) {
  KJ_REQUIRE(reader.size() <= kMostParticipants, "too many participants in a share");
  std::vector<CKShareParticipant> participants;
  participants.reserve(reader.size());
  for (const auto one : reader) {
    participants.push_back(
        {text(one.getName()), enumerator(one.getRole(), CKShareParticipantRole::PublicUser),
         enumerator(one.getAcceptanceStatus(), CKShareParticipantAcceptanceStatus::Removed),
         one.getPermission()});
  }
  return participants;
}

std::string address(const NSURLPtr& url) {
  if (!url) return {};
  return url->isFileURL() ? url->path() : url->absoluteString();
}

NSURLPtr urlFromAddress(const std::string& address) {
  return address.starts_with('/') ? NSURL::fileURLWithPath(address) : NSURL::URLWithString(address);
}

}  // namespace skein::codec
