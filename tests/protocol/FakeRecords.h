// The cloud's records as a test scripts them: fetches are kept until it answers them.
#pragma once

#include <memory>
#include <optional>
#include <utility>
#include <vector>

#include "linux/protocol/LocalRecords.h"
#include "tests/protocol/Waiting.h"

namespace skein {

class FakeRecords final : public LocalRecords {
 public:
  // What is answered; set it before asking.
  std::optional<VLContentRecordIDs> recordIDs;
  NSErrorPtr error;

  struct Fetch {
    RecordQuery query;
    RecordsReply reply;
  };
  Inbox<Fetch> fetches;
  Inbox<int> cancellations;
  Inbox<std::vector<VLFileObjectID>> resolutions;

  void resolveFileObjectIDsToContentRecordIDs(
      const std::vector<VLFileObjectID>& fileObjectIDs,
      Reply<std::optional<VLContentRecordIDs>, NSErrorPtr> reply) override {
    resolutions.add(fileObjectIDs);
    reply(recordIDs, error);
  }
  std::shared_ptr<NSProgress> fetchRecords(RecordQuery query, RecordsReply reply) override {
    auto progress = NSProgress::progressWithTotalUnitCount(0);
    progress->setCancellationHandler([this] { cancellations.add(1); });
    fetches.add({std::move(query), std::move(reply)});
    return progress;
  }
};

}  // namespace skein
