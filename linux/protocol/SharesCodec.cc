#include "linux/protocol/SharesCodec.h"

namespace skein::codec {
namespace {

void encodeParticipant(wire::Share::Participant::Builder builder, const CKShareParticipant& one) {
  builder.setName(bytes(one.name));
  builder.setRole(static_cast<std::uint8_t>(one.role));
  builder.setAcceptanceStatus(static_cast<std::uint8_t>(one.acceptanceStatus));
  builder.setPermission(one.permission);
}

CKShareParticipant decodeParticipant(wire::Share::Participant::Reader reader) {
  return {text(reader.getName()), enumerator(reader.getRole(), CKShareParticipantRole::PublicUser),
          enumerator(reader.getAcceptanceStatus(), CKShareParticipantAcceptanceStatus::Removed),
          reader.getPermission()};
}

}  // namespace

void encode(wire::Share::Builder builder, const CKShare& share) {
  builder.setRootRecordName(bytes(share.rootRecordName));
  auto values = builder.initValues(static_cast<unsigned>(share.values.size()));
  unsigned at = 0;
  for (const auto& [key, value] : share.values) {
    values[at].setKey(bytes(key));
    values[at++].setText(bytes(value));
  }
  encode(builder.initParticipants(static_cast<unsigned>(share.participants.size())),
         share.participants);
  builder.setPublicPermission(share.publicPermission);
  builder.setIsKnownToServer(share.isKnownToServer);
  if (share.url) builder.setAddress(bytes(share.url->absoluteString()));
}

CKShare decode(wire::Share::Reader reader) {
  CKShare share;
  share.rootRecordName = text(reader.getRootRecordName());
  for (const auto value : reader.getValues()) {
    share.values.insert_or_assign(text(value.getKey()), text(value.getText()));
  }
  share.participants = decode(reader.getParticipants());
  share.publicPermission = reader.getPublicPermission();
  share.isKnownToServer = reader.getIsKnownToServer();
  if (reader.hasAddress()) share.url = NSURL::URLWithString(text(reader.getAddress()));
  return share;
}

void encode(capnp::List<wire::Share::Participant>::Builder builder,
            const std::vector<CKShareParticipant>& participants) {
  unsigned at = 0;
  for (const CKShareParticipant& one : participants) encodeParticipant(builder[at++], one);
}

std::vector<CKShareParticipant> decode(capnp::List<wire::Share::Participant>::Reader reader) {
  std::vector<CKShareParticipant> participants;
  participants.reserve(reader.size());
  for (const auto one : reader) participants.push_back(decodeParticipant(one));
  return participants;
}

void encode(wire::Zone::Builder builder, const CKRecordZoneID& zone) {
  builder.setZoneName(bytes(zone.zoneName));
  builder.setOwnerName(bytes(zone.ownerName));
}

CKRecordZoneID decode(wire::Zone::Reader reader) {
  return {text(reader.getZoneName()), text(reader.getOwnerName())};
}

void encode(wire::AttachedZone::Builder builder, const AttachedZone& zone) {
  if (zone.folder) builder.setFolder(bytes(zone.folder->path()));
  encode(builder.initZone(), zone.zone);
  builder.setPermission(zone.permission);
}

AttachedZone decode(wire::AttachedZone::Reader reader) {
  AttachedZone zone;
  if (reader.hasFolder()) zone.folder = NSURL::fileURLWithPath(text(reader.getFolder()));
  zone.zone = decode(reader.getZone());
  zone.permission = reader.getPermission();
  return zone;
}

void encode(wire::ShareOptions::Builder builder, const ShareOptions& options) {
  builder.setFlags(options.flags);
  builder.setOwnFlags(options.ownFlags);
  builder.setPublicPermission(options.publicPermission);
  if (options.sharedFolder) builder.setSharedFolder(bytes(*options.sharedFolder));
}

ShareOptions decode(wire::ShareOptions::Reader reader) {
  return {reader.getFlags(), reader.getOwnFlags(), reader.getPublicPermission(),
          optionalText(reader.hasSharedFolder(), reader.getSharedFolder())};
}

std::optional<std::string> optionalText(bool there, capnp::Data::Reader data) {
  return there ? std::optional(text(data)) : std::nullopt;
}

}  // namespace skein::codec
