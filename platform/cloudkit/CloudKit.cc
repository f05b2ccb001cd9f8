#include "platform/cloudkit/CloudKit.h"

namespace skein {

std::string description(const CKRecordZoneID& zoneID) {
  return "<CKRecordZoneID: " + zoneID.zoneName + ":" + zoneID.ownerName + ">";
}

std::string description(const CKRecordID& recordID) {
  return "<CKRecordID: " + recordID.recordName + " in " + recordID.zoneID.zoneName + ":" +
         recordID.zoneID.ownerName + ">";
}

std::string description(const CKFetchRecordsOperation& operation) {
  return "<CKFetchRecordsOperation: " + std::to_string(operation.recordIDs.size()) + " records>";
}

}  // namespace skein
