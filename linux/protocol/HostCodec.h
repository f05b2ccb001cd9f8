// Between the schema's structs and the host service's values; as DaemonCodec.h.
#pragma once

#include <vector>

#include "linux/protocol/DaemonCodec.h"
#include "linux/protocol/HostService.h"
#include "linux/protocol/host.capnp.h"

namespace skein::codec {

void encode(wire::Target::Builder builder, const HostTarget& target);
HostTarget decode(wire::Target::Reader reader);

void encode(wire::HostItem::Builder builder, const HostItem& item);
HostItem decode(wire::HostItem::Reader reader);

void encode(wire::Change::Builder builder, const HostChange& change);
HostChange decode(wire::Change::Reader reader);

void encode(wire::HostStatus::Builder builder, const HostStatus& status);
HostStatus decode(wire::HostStatus::Reader reader);

void encode(wire::HostDifference::Builder builder, const HostDifference& difference);
HostDifference decode(wire::HostDifference::Reader reader);

}  // namespace skein::codec
