// Between the shares' structs and the host's values of them; as Codec.h.
#pragma once

#include <optional>
#include <vector>

#include "linux/protocol/Codec.h"
#include "linux/protocol/LocalShares.h"
#include "linux/protocol/shares.capnp.h"

namespace skein::codec {

void encode(wire::Share::Builder builder, const CKShare& share);
CKShare decode(wire::Share::Reader reader);
void encode(capnp::List<wire::Share::Participant>::Builder builder,
            const std::vector<CKShareParticipant>& participants);
std::vector<CKShareParticipant> decode(capnp::List<wire::Share::Participant>::Reader reader);

void encode(wire::Zone::Builder builder, const CKRecordZoneID& zone);
CKRecordZoneID decode(wire::Zone::Reader reader);

void encode(wire::AttachedZone::Builder builder, const AttachedZone& zone);
AttachedZone decode(wire::AttachedZone::Reader reader);

void encode(wire::ShareOptions::Builder builder, const ShareOptions& options);
ShareOptions decode(wire::ShareOptions::Reader reader);

// A text that may be nil.
std::optional<std::string> optionalText(bool there, capnp::Data::Reader data);

}  // namespace skein::codec
