// Between the schema's structs and shares; as Codec.h.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "linux/protocol/Codec.h"
#include "linux/protocol/services.capnp.h"
#include "platform/cloudkit/CKShare.h"

namespace skein::codec {

// The record's name does not cross.
void encode(wire::Share::Builder builder, const CKShare& share);
// Refuses a share that is larger than any person's.
CKSharePtr decode(wire::Share::Reader reader);

void encode(capnp::List<wire::Participant>::Builder builder,
            const std::vector<CKShareParticipant>& participants);
std::vector<CKShareParticipant> decode(capnp::List<wire::Participant>::Reader reader);

// The address of a share: any URL, as its string.
std::string address(const NSURLPtr& url);
NSURLPtr urlFromAddress(const std::string& address);

}  // namespace skein::codec
