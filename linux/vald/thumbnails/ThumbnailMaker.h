#pragma once

#include <chrono>
#include <cstddef>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "base/Executor.h"
#include "linux/vald/cloud/CloudContents.h"
#include "linux/vald/cloud/CloudRecords.h"
#include "linux/vald/thumbnails/ThumbnailAssets.h"
#include "linux/vald/thumbnails/ThumbnailRenderer.h"

namespace skein::vald {

// What making thumbnails needs. References: all of it outlives whoever is given this.
struct ThumbnailServices {
  CloudContents& contents;
  CloudRecords& records;
  ThumbnailAssets& assets;
  ThumbnailRenderer& renderer;
  Log& log;
  // The document's content type, by its name; nil when there is no such document any more.
  // Any thread; may block for a moment.
  std::function<std::optional<std::string>(VLFileObjectID)> contentType;
};

// Gives records their thumbnails, after the upload and in the background: a picture within
// 1024 by 1024 of what the record's contents show. What could not be drawn is not tried
// again until the contents change. Any thread.
class ThumbnailMaker {
 public:
  // At most `limit` documents are worked on at a time; a few more than the renderer draws
  // keep it busy. `executor` runs what blocks for a moment: reading records, writing files.
  ThumbnailMaker(ThumbnailServices services, std::shared_ptr<Executor> executor, std::size_t limit);
  // Ends what runs, and waits for it. Not on a thread of the executor's.
  ~ThumbnailMaker();
  ThumbnailMaker(const ThumbnailMaker&) = delete;
  ThumbnailMaker& operator=(const ThumbnailMaker&) = delete;

  // The document's record is new, or has new contents. Cheap.
  void documentWasUploaded(VLFileObjectID document);
  // Looks through all records for those without a thumbnail, after what waits already: for
  // the start, since another process may have ended before it had made them all.
  void makeMissing();

  // Waits until nothing is left to do; for benchmarks and tests. False at the deadline.
  bool waitUntilIdle(std::chrono::steady_clock::time_point deadline);

 private:
  struct Core;
  const std::shared_ptr<Core> _core;
};

}  // namespace skein::vald
