// Between the schema of the cloud's records and the host's values of it; as Codec.h.
#pragma once

#include "linux/protocol/Codec.h"
#include "linux/protocol/LocalRecords.h"
#include "linux/protocol/records.capnp.h"

namespace skein::codec {

void encode(wire::ZoneID::Builder builder, const CKRecordZoneID& zoneID);
CKRecordZoneID decode(wire::ZoneID::Reader reader);

// Into both lists of the results; nil leaves them out.
void encode(wire::Records::ContentRecordIDsResults::Builder builder,
            const std::optional<VLContentRecordIDs>& recordIDs);
std::optional<VLContentRecordIDs> decode(wire::Records::ContentRecordIDsResults::Reader reader);

void encode(wire::RecordQuery::Builder builder, const RecordQuery& query);
RecordQuery decode(wire::RecordQuery::Reader reader);

void encode(wire::Record::Builder builder, const FetchedRecord& fetched);
FetchedRecord decode(wire::Record::Reader reader, const CKRecordZoneID& zone);

}  // namespace skein::codec
