// Between the schema of the host's file operations and their values; as HostCodec.h.
#pragma once

#include "linux/protocol/FilesCodec.h"
#include "linux/protocol/HostCodec.h"
#include "linux/protocol/hostfiles.capnp.h"

namespace skein::codec {

void encode(wire::HostTrashedItem::Builder builder, const HostTrashedItem& trashed);
HostTrashedItem decode(wire::HostTrashedItem::Reader reader);

void encode(wire::HostTransfer::NextResults::Builder builder, const HostTransferStep& step);
HostTransferStep decode(wire::HostTransfer::NextResults::Reader reader);

}  // namespace skein::codec
