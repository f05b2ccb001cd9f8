// The cloud's records of documents' contents: the part of the daemon that asks the cloud.
// Stands on both sides of the socket, as LocalDaemon does.
#pragma once

#include <cstddef>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "base/UniqueFunction.h"
#include "platform/cloudkit/CloudKit.h"
#include "platform/foundation/NSProgress.h"
#include "vellum/VLContentRecords.h"

namespace skein {

// One request to the cloud: records of one zone, and what is wanted of each.
struct RecordQuery {
  CKRecordZoneID zone;
  std::vector<std::string> recordNames;
  std::vector<std::string> desiredKeys;
  // As the operation's; they change nothing in a cloud on this machine.
  int qualityOfService = 0;
  CKFetchRecordsOperation::Configuration configuration;
  std::string group;
};

// A record, or the error that stands in its place.
struct FetchedRecord {
  CKRecordID recordID;
  std::shared_ptr<const CKRecord> record;
  NSErrorPtr error;
};

// Asynchronous, as VLDaemon.
class LocalRecords {
 public:
  // What one call may name; more is an invalid-parameter error.
  static constexpr std::size_t kMostRecords = 10'000;

  using RecordsReply = Reply<std::vector<FetchedRecord>, NSErrorPtr>;

  virtual ~LocalRecords() = default;

  // As VLDaemon has it.
  virtual void resolveFileObjectIDsToContentRecordIDs(
      const std::vector<VLFileObjectID>& fileObjectIDs,
      Reply<std::optional<VLContentRecordIDs>, NSErrorPtr> reply) = 0;

  // One entry for each name, in their order; CKErrorUnknownItem for what the zone has not. An
  // error, and no entries, when the cloud could not be asked. Cancelling the progress ends it
  // with CKErrorOperationCancelled, unless it has just ended.
  virtual std::shared_ptr<NSProgress> fetchRecords(RecordQuery query, RecordsReply reply) = 0;
};

}  // namespace skein
