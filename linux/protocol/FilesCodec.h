// Between the schema of vald's file operations and the host's values of it; as Codec.h.
#pragma once

#include "linux/protocol/Codec.h"
#include "linux/protocol/LocalFiles.h"
#include "linux/protocol/files.capnp.h"

namespace skein::codec {

void encode(wire::TrashedItem::Builder builder, const TrashedItem& trashed);
TrashedItem decode(wire::TrashedItem::Reader reader);

void encode(wire::TagUse::Builder builder, const TagUse& use);
TagUse decode(wire::TagUse::Reader reader);

void encode(wire::FileHistoryEntry::Builder builder, const FileHistoryEntry& entry);
FileHistoryEntry decode(wire::FileHistoryEntry::Reader reader);

}  // namespace skein::codec
