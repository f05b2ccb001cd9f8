// Between the daemon's structs and the host's values of it; as Codec.h.
#pragma once

#include "linux/protocol/Codec.h"
#include "linux/protocol/LocalDaemon.h"
#include "linux/protocol/daemon.capnp.h"

namespace skein::codec {

void encode(wire::Account::Builder builder, const LocalAccount& account);
LocalAccount decode(wire::Account::Reader reader);

void encode(wire::Container::Builder builder, const VLContainer::Properties& container);
VLContainer::Properties decode(wire::Container::Reader reader);

void encode(wire::Status::Builder builder, const LocalDaemonStatus& status);
LocalDaemonStatus decode(wire::Status::Reader reader);

void encode(wire::Difference::Builder builder, const IndexDifference& difference);
IndexDifference decode(wire::Difference::Reader reader);

void encode(wire::Fault::Builder builder, const FaultInjection& fault);
FaultInjection decode(wire::Fault::Reader reader);

}  // namespace skein::codec
