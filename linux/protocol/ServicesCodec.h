// Between services.capnp and its values; as Codec.h.
#pragma once

#include <string>

#include "linux/protocol/SharesCodec.h"
#include "linux/protocol/services.capnp.h"

namespace skein::codec {

// As a client of one item sees a share, and as it comes from one: without the name of its
// root record.
void encodeForClient(wire::Share::Builder builder, const CKShare& share);
CKSharePtr decodeFromClient(wire::Share::Reader reader);

// Any URL as a string: a file's path, or another address.
std::string address(const NSURLPtr& url);
NSURLPtr urlFromAddress(const std::string& address);

}  // namespace skein::codec
