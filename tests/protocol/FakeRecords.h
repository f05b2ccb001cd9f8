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
  // Kept by what counts in it, which may come when the fake is gone.
  const std::shared_ptr<Inbox<int>> cancelled = std::make_shared<Inbox<int>>();
  Inbox<int>& cancellations = *cancelled;
  Inbox<std::vector<VLFileObjectID>> resolutions;

  void resolveFileObjectIDsToContentRecordIDs(
      const std::vector<VLFileObjectID>& fileObjectIDs,
      Reply<std::optional<VLContentRecordIDs>, NSErrorPtr> reply) override {
    resolutions.add(fileObjectIDs);
    reply(recordIDs, error);
  }
  std::shared_ptr<NSProgress> fetchRecords(RecordQuery query, RecordsReply reply) override {
    auto progress = NSProgress::progressWithTotalUnitCount(0);
    progress->setCancellationHandler([counter = cancelled] { counter->add(1); });
    fetches.add({std::move(query), std::move(reply)});
    return progress;
  }
};

}  // namespace skein
