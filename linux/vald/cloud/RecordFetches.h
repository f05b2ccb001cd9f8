#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <vector>

#include "base/Executor.h"
#include "linux/protocol/CallFaults.h"
#include "linux/protocol/LocalRecords.h"
#include "linux/vald/cloud/CloudClock.h"
#include "linux/vald/cloud/CloudConditions.h"
#include "linux/vald/cloud/CloudRecords.h"

namespace skein::vald {

// Answers for the cloud's records: which record a document has, and records themselves, as
// their zone's database would. Reads the records alone and opens no file. Any thread.
//
// A fetch meets the cloud's conditions (offline, its delay), and the faults that are planned
// for its zone under "fetchRecords ZONE:OWNER". While it waits it can be cancelled.
class RecordFetches final : public LocalRecords {
 public:
  using ZoneFinder = std::function<std::optional<CKRecordZoneID>(VLFileObjectID)>;

  // All outlive this object and what it posted.
  struct Parts {
    std::shared_ptr<Executor> executor;
    CloudRecords& records;
    CloudConditions& conditions;
    CloudClock& clock;
    CallFaults& faults;
    // Asked once for a request: what tells the zone of somebody else's that a document is in,
    // whatever zone its record was put into; nil for one's own. May be empty, and may block.
    std::function<Outcome<ZoneFinder>()> attachedZones = {};
  };

  explicit RecordFetches(Parts parts) : _parts(std::move(parts)) {}

  void resolveFileObjectIDsToContentRecordIDs(
      const std::vector<VLFileObjectID>& fileObjectIDs,
      Reply<std::optional<VLContentRecordIDs>, NSErrorPtr> reply) override;
  std::shared_ptr<NSProgress> fetchRecords(RecordQuery query, RecordsReply reply) override;

  // The requests that the cloud was asked so far, of either kind.
  std::uint64_t resolutions() const { return _resolutions.load(); }
  std::uint64_t fetches() const { return _fetches.load(); }

 private:
  // Each record in the zone that its document is in at the moment.
  Outcome<std::vector<CloudRecord>> recordsOf(const std::vector<VLFileObjectID>& documents);
  Outcome<std::vector<FetchedRecord>> fetch(const RecordQuery& query, Cancellation& cancellation);
  // What the request meets before it is answered; null: nothing.
  NSErrorPtr meetConditions(const CKRecordZoneID& zone, Cancellation& cancellation);

  const Parts _parts;
  std::atomic<std::uint64_t> _resolutions{0};
  std::atomic<std::uint64_t> _fetches{0};
};

}  // namespace skein::vald
