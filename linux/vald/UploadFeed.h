#pragma once

#include <chrono>
#include <deque>
#include <functional>
#include <set>
#include <thread>
#include <utility>
#include <vector>

#include "base/Mutex.h"
#include "linux/vald/FolderStore.h"
#include "linux/vald/UploadPolicy.h"
#include "linux/vald/cloud/Uploader.h"

namespace skein::vald {

// The way between the store and the uploader, on a thread of its own: tells the uploader of
// documents in whose upload nothing is known to be in order, a few at a time and never while
// the store is scanning; and tells the store what is uploaded. What is gone for good is
// forgotten by the cloud, too.
class UploadFeed final : public UploadListener {
 public:
  struct Parts {
    FolderStore& store;
    CloudRecords& records;
    UploadPolicy policy;
    std::function<bool()> mayUpload;  // Cloud::Options
    Log& log;
    std::function<void(VLFileObjectID)> didUpload;  // on a thread of the uploader's; returns soon
  };
  explicit UploadFeed(Parts parts);
  ~UploadFeed() override;

  // Begins. `uploader` outlives stop().
  void start(Uploader& uploader);
  // Nothing is told any more. Before the uploader goes; it may still tell.
  void stop() SKEIN_EXCLUDES(_mutex);

  // What the store told, on its writer thread: returns at once.
  void storeDidChange(const std::vector<StoreChange>& changes) SKEIN_EXCLUDES(_mutex);
  void storeDidOverflow() SKEIN_EXCLUDES(_mutex);

  void uploadStateDidChange(VLFileObjectID document, const UploadState& state) override
      SKEIN_EXCLUDES(_mutex);

  // Why the document is not uploaded by itself; empty when it will be.
  std::string whyNot(VLFileObjectID document) SKEIN_EXCLUDES(_mutex);
  // Documents that the bound keeps out.
  std::uint64_t leftOut() const SKEIN_EXCLUDES(_mutex);
  std::string lastFailure() const SKEIN_EXCLUDES(_mutex);

 private:
  using Instant = std::chrono::steady_clock::time_point;

  void run();
  void poke() SKEIN_EXCLUDES(_mutex);
  void pause(std::chrono::milliseconds time) SKEIN_EXCLUDES(_mutex);
  void tellStore() SKEIN_EXCLUDES(_mutex);
  void forgetDead() SKEIN_EXCLUDES(_mutex);
  // Whether there is more to tell when some of it is done.
  void tellUploader() SKEIN_EXCLUDES(_mutex);
  bool isAllowed() const { return !_parts.mayUpload || _parts.mayUpload(); }
  bool mayUpload(const FolderStore::Unsettled& document) SKEIN_EXCLUDES(_mutex);

  const Parts _parts;
  Uploader* _uploader = nullptr;  // set once, before the thread begins
  std::uint64_t _rank = 0;        // the thread's own: where to go on
  std::thread _thread;

  mutable Mutex _mutex;
  CondVar _changed;
  bool _stop SKEIN_GUARDED_BY(_mutex) = false;
  bool _poked SKEIN_GUARDED_BY(_mutex) = true;
  std::vector<UploadedFile> _uploaded SKEIN_GUARDED_BY(_mutex);
  std::deque<std::pair<Instant, VLFileObjectID>> _dead SKEIN_GUARDED_BY(_mutex);
  std::set<VLFileObjectID> _leftOut SKEIN_GUARDED_BY(_mutex);
  std::uint64_t _promisedBytes SKEIN_GUARDED_BY(_mutex) = 0;  // of what was told of lately
  std::string _lastFailure SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein::vald
