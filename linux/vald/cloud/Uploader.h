#pragma once

#include <cstddef>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "linux/vald/cloud/BoundedRunner.h"
#include "linux/vald/cloud/UploadAttempt.h"

namespace skein::vald {

struct UploadState {
  enum class Phase : std::uint8_t {
    Waiting,    // until the file has settled, or, with an error, until the cloud is there
    Uploading,  //
    Uploaded,   // as the file that `stamp` describes
    Failed,     // with the error; tried again when the document changes, or on retry()
  };

  Phase phase = Phase::Waiting;
  std::optional<UploadStamp> stamp;
  NSErrorPtr error;
};

// Hears of each new state, on a thread of the uploader's and without a lock. It must not
// let the uploader go.
class UploadListener {
 public:
  virtual ~UploadListener() = default;
  virtual void uploadStateDidChange(VLFileObjectID document, const UploadState& state) = 0;
};

// Uploads documents when they have settled: when nothing about the file changed for a while,
// by what the uploader was told and by the file's own times. A change during an upload ends
// it, and it is done again after the next settling. While the cloud cannot be reached, one
// document is tried now and then, at growing intervals, for all of them. Any thread.
class Uploader {
 public:
  struct Options {
    CloudClock::Duration settle = std::chrono::seconds(2);
    CloudClock::Duration shortestPause = std::chrono::seconds(1);  // of tries while offline
    CloudClock::Duration longestPause = std::chrono::minutes(5);
    std::size_t limit = 2;  // uploads at a time
  };

  // `executor` has at least `limit` threads: uploads block them. `listener` outlives it.
  Uploader(UploadServices services, UploadListener& listener, std::shared_ptr<Executor> executor,
           Options options);
  // Ends what runs, which is not told any more, and waits for it.
  ~Uploader();
  Uploader(const Uploader&) = delete;
  Uploader& operator=(const Uploader&) = delete;

  // The document is new, or its file changed in any way (contents, name, attributes), and is
  // at `path` now. Cheap; documents that are uploaded already cost a look at the file.
  void documentDidChange(VLFileObjectID document, std::string path);
  // The document is gone for good: its record goes too, also when an upload of it is just
  // ending. An error: the record is still there.
  NSErrorPtr documentWasRemoved(VLFileObjectID document);

  // Nil for a document that nobody spoke of and that has no record.
  Outcome<std::optional<UploadState>> state(VLFileObjectID document);
  // Documents whose upload is to come, or runs.
  std::size_t pending();
  // What could not be uploaded, and why.
  std::vector<std::pair<VLFileObjectID, UploadState>> failures();

  // Tries at once again what failed and what waits for the cloud.
  void retry();

 private:
  struct Core;
  const std::shared_ptr<Core> _core;
};

}  // namespace skein::vald
