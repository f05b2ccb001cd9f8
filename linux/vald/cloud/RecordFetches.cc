#include "linux/vald/cloud/RecordFetches.h"

#include <algorithm>
#include <chrono>
#include <map>
#include <unordered_map>
#include <utility>

#include "linux/vald/cloud/CloudErrors.h"
#include "platform/cloudkit/CKError.h"

namespace skein::vald {
namespace {

// No document has this number: what a name that is no identifier stands for.
const VLFileObjectID kNobody = VLFileObjectID::documentWithRawID(0);

NSErrorPtr cloudKitError(std::int64_t code, std::string text) {
  return NSError::errorWithDomain(CKErrorDomain, code,
                                  {{NSLocalizedDescriptionKey, std::move(text)}});
}

NSErrorPtr fetchCancelled() {
  return cloudKitError(CKErrorOperationCancelled, "The records were no longer wanted.");
}

NSErrorPtr unknownItem(const CKRecordID& recordID) {
  return cloudKitError(CKErrorUnknownItem, "The zone " + recordID.zoneID.zoneName + " of " +
                                               recordID.zoneID.ownerName + " has no record " +
                                               recordID.recordName + ".");
}

std::map<std::string, CKRecord::Value> fieldsOf(const CloudRecord& record,
                                                const std::vector<std::string>& desiredKeys) {
  std::map<std::string, CKRecord::Value> fields;
  for (const std::string& key : desiredKeys) {
    if (key == kVLRecordKeySize) {
      fields.emplace(key, static_cast<std::int64_t>(record.contents.size));
    } else if (key == kVLRecordKeyThumbnail1024x1024 && record.thumbnail) {
      fields.emplace(
          key, std::make_shared<const CKAsset>(CKAsset{NSURL::fileURLWithPath(*record.thumbnail)}));
    }
  }
  return fields;
}

}  // namespace

Outcome<std::vector<CloudRecord>> RecordFetches::recordsOf(
    const std::vector<VLFileObjectID>& documents) {
  auto found = _parts.records.records(documents);
  if (!found || !_parts.attachedZones) return found;
  const auto attachedZoneOf = _parts.attachedZones();
  if (!attachedZoneOf) return attachedZoneOf.error();
  for (CloudRecord& record : *found) {
    if (const auto zone = (*attachedZoneOf)(record.document)) record.zone = *zone;
  }
  return found;
}

void RecordFetches::resolveFileObjectIDsToContentRecordIDs(
    const std::vector<VLFileObjectID>& fileObjectIDs,
    Reply<std::optional<VLContentRecordIDs>, NSErrorPtr> reply) {
  _parts.executor->post([this, fileObjectIDs, reply = std::move(reply)]() mutable {
    ++_resolutions;
    const auto records = recordsOf(fileObjectIDs);
    if (!records) {
      reply(std::nullopt, records.error());
      return;
    }
    VLContentRecordIDs recordIDs;
    for (const CloudRecord& record : *records) {
      recordIDs.emplace(record.document, record.recordID());
    }
    reply(std::move(recordIDs), nullptr);
  });
}

std::shared_ptr<NSProgress> RecordFetches::fetchRecords(RecordQuery query, RecordsReply reply) {
  auto progress = NSProgress::progressWithTotalUnitCount(0);
  const auto cancellation = std::make_shared<Cancellation>();
  progress->setCancellationHandler([cancellation] { cancellation->cancel(); });
  _parts.executor->post(
      [this, query = std::move(query), reply = std::move(reply), cancellation]() mutable {
        ++_fetches;
        auto records = fetch(query, *cancellation);
        if (records) {
          reply(std::move(*records), nullptr);
        } else {
          reply({}, records.error());
        }
      });
  return progress;
}

NSErrorPtr RecordFetches::meetConditions(const CKRecordZoneID& zone, Cancellation& cancellation) {
  if (NSErrorPtr error = _parts.conditions.admit()) return error;
  std::chrono::milliseconds delay = _parts.conditions.settings().delay;
  if (const auto fault =
          _parts.faults.take("fetchRecords " + zone.zoneName + ":" + zone.ownerName)) {
    if (fault->action == FaultInjection::Action::AnswerError) {
      return NSError::errorWithDomain(
          fault->errorDomain, fault->errorCode,
          {{NSLocalizedDescriptionKey, "A fault that was asked for: " + fault->method + "."}});
    }
    delay += std::chrono::milliseconds(fault->delayMilliseconds);
  }
  if (delay.count() > 0) {
    ScopedWait wait(*_parts.executor);
    _parts.clock.wait(delay, cancellation);
  }
  return cancellation.isCancelled() ? fetchCancelled() : nullptr;
}

Outcome<std::vector<FetchedRecord>> RecordFetches::fetch(const RecordQuery& query,
                                                         Cancellation& cancellation) {
  if (NSErrorPtr error = meetConditions(query.zone, cancellation)) return error;

  std::vector<VLFileObjectID> documents;
  documents.reserve(query.recordNames.size());
  for (const std::string& name : query.recordNames) {
    documents.push_back(VLFileObjectID::fileObjectIDWithString(name).value_or(kNobody));
  }
  auto found = recordsOf(documents);
  if (!found) return found.error();
  std::unordered_map<VLFileObjectID, const CloudRecord*> byDocument;
  for (const CloudRecord& record : *found) {
    // A record's name is known in its own zone alone.
    if (record.zone == query.zone) byDocument.emplace(record.document, &record);
  }

  std::vector<FetchedRecord> records;
  records.reserve(query.recordNames.size());
  for (std::size_t at = 0; at < documents.size(); ++at) {
    FetchedRecord fetched{{query.recordNames[at], query.zone}, nullptr, nullptr};
    if (const auto record = byDocument.find(documents[at]); record != byDocument.end()) {
      fetched.record = std::make_shared<const CKRecord>(
          fetched.recordID, fieldsOf(*record->second, query.desiredKeys));
    } else {
      fetched.error = unknownItem(fetched.recordID);
    }
    records.push_back(std::move(fetched));
  }
  return records;
}

}  // namespace skein::vald
