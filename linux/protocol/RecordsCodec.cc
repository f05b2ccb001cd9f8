#include "linux/protocol/RecordsCodec.h"

#include <utility>

namespace skein::codec {
namespace {

using Asset = std::shared_ptr<const CKAsset>;

void encodeValue(wire::Record::Field::Builder field, const CKRecord::Value& value) {
  if (const auto* string = std::get_if<std::string>(&value)) {
    field.setText(bytes(*string));
  } else if (const auto* number = std::get_if<std::int64_t>(&value)) {
    field.setNumber(*number);
  } else {
    const Asset& asset = *std::get_if<Asset>(&value);
    // Which of the union it is must be said also where there is no path.
    field.initAsset(0);
    if (asset && asset->fileURL) {
      field.setAsset(bytes(asset->fileURL->path()));
    } else {
      field.disownAsset();
    }
  }
}

CKRecord::Value decodeValue(wire::Record::Field::Reader field) {
  switch (field.which()) {
    case wire::Record::Field::TEXT: return text(field.getText());
    case wire::Record::Field::NUMBER: return field.getNumber();
    case wire::Record::Field::ASSET: {
      CKAsset asset;
      if (field.hasAsset()) asset.fileURL = NSURL::fileURLWithPath(text(field.getAsset()));
      return std::make_shared<const CKAsset>(std::move(asset));
    }
  }
  KJ_FAIL_REQUIRE("a record's field of an unknown kind");
}

}  // namespace

void encode(wire::ZoneID::Builder builder, const CKRecordZoneID& zoneID) {
  builder.setZoneName(bytes(zoneID.zoneName));
  builder.setOwnerName(bytes(zoneID.ownerName));
}

CKRecordZoneID decode(wire::ZoneID::Reader reader) {
  return {text(reader.getZoneName()), text(reader.getOwnerName())};
}

void encode(wire::Records::ContentRecordIDsResults::Builder builder,
            const std::optional<VLContentRecordIDs>& recordIDs) {
  if (!recordIDs) return;
  std::map<CKRecordZoneID, std::uint32_t> zones;
  for (const auto& [document, recordID] : *recordIDs) zones.emplace(recordID.zoneID, 0);
  auto zoneList = builder.initZones(static_cast<unsigned>(zones.size()));
  std::uint32_t number = 0;
  for (auto& [zoneID, index] : zones) {
    encode(zoneList[number], zoneID);
    index = number++;
  }
  auto recordList = builder.initRecords(static_cast<unsigned>(recordIDs->size()));
  unsigned at = 0;
  for (const auto& [document, recordID] : *recordIDs) {
    auto entry = recordList[at++];
    encode(entry.initDocument(), document);
    entry.setRecordName(bytes(recordID.recordName));
    entry.setZone(zones.at(recordID.zoneID));
  }
}

std::optional<VLContentRecordIDs> decode(wire::Records::ContentRecordIDsResults::Reader reader) {
  if (!reader.hasRecords()) return std::nullopt;
  std::vector<CKRecordZoneID> zones;
  for (const auto zone : reader.getZones()) zones.push_back(decode(zone));
  VLContentRecordIDs recordIDs;
  for (const auto entry : reader.getRecords()) {
    KJ_REQUIRE(entry.getZone() < zones.size(), "a record in a zone that is not there");
    recordIDs.emplace(decode(entry.getDocument()),
                      CKRecordID{text(entry.getRecordName()), zones[entry.getZone()]});
  }
  return recordIDs;
}

void encode(wire::RecordQuery::Builder builder, const RecordQuery& query) {
  encode(builder.initZone(), query.zone);
  encode(builder.initRecordNames(static_cast<unsigned>(query.recordNames.size())),
         query.recordNames);
  encode(builder.initDesiredKeys(static_cast<unsigned>(query.desiredKeys.size())),
         query.desiredKeys);
  builder.setQualityOfService(query.qualityOfService);
  builder.setDiscretionaryNetworkBehavior(query.configuration.discretionaryNetworkBehavior);
  builder.setAutomaticallyRetryNetworkFailures(
      query.configuration.automaticallyRetryNetworkFailures);
  builder.setGroup(bytes(query.group));
}

RecordQuery decode(wire::RecordQuery::Reader reader) {
  RecordQuery query;
  query.zone = decode(reader.getZone());
  query.recordNames = decode(reader.getRecordNames());
  query.desiredKeys = decode(reader.getDesiredKeys());
  query.qualityOfService = reader.getQualityOfService();
  query.configuration.discretionaryNetworkBehavior = reader.getDiscretionaryNetworkBehavior();
  query.configuration.automaticallyRetryNetworkFailures =
      reader.getAutomaticallyRetryNetworkFailures();
  query.group = text(reader.getGroup());
  return query;
}

void encode(wire::Record::Builder builder, const FetchedRecord& fetched) {
  builder.setRecordName(bytes(fetched.recordID.recordName));
  setError(builder, fetched.error);
  if (!fetched.record) return;
  const auto& fields = fetched.record->fields();
  auto list = builder.initFields(static_cast<unsigned>(fields.size()));
  unsigned at = 0;
  for (const auto& [key, value] : fields) {
    auto field = list[at++];
    field.setKey(bytes(key));
    encodeValue(field, value);
  }
}

FetchedRecord decode(wire::Record::Reader reader, const CKRecordZoneID& zone) {
  FetchedRecord fetched;
  fetched.recordID = {text(reader.getRecordName()), zone};
  fetched.error = errorOf(reader);
  if (fetched.error) return fetched;
  std::map<std::string, CKRecord::Value> fields;
  for (const auto field : reader.getFields()) {
    fields.emplace(text(field.getKey()), decodeValue(field));
  }
  fetched.record = std::make_shared<const CKRecord>(fetched.recordID, std::move(fields));
  return fetched;
}

}  // namespace skein::codec
