#pragma once

#include <memory>
#include <string>

#include "linux/protocol/LocalCloud.h"
#include "linux/vald/ClosableExecutor.h"
#include "linux/vald/CollectionRounds.h"
#include "linux/vald/UploadFeed.h"
#include "linux/vald/cloud/CloudPlaces.h"
#include "linux/vald/cloud/Downloader.h"
#include "linux/vald/files/FileOperations.h"
#include "linux/vald/thumbnails/ThumbnailService.h"

namespace skein::vald {

// The drive's local cloud: what is in it, and what goes there and comes back. It is opened,
// and what a crash left of its work is mended, before the store looks at the documents;
// start() then begins to upload.
class Cloud final : public LocalCloud {
 public:
  struct Options {
    std::string folder;  // the cloud's own; made when missing
    std::string drive;   // the drive's folder
    UploadPolicy policy;
    // Whether somebody agreed to uploads: asked again and again, since that may come while
    // it runs. Empty: yes.
    std::function<bool()> mayUpload = {};
    bool allowsConditions = false;
    std::string desktopThumbnails;     // the desktop's cache of them; empty: none are made
    std::string drives;                // holds the folders of all drives, see CloudContents
    std::vector<std::string> trashes;  // the desktop's own, where markers of the drive may lie
    std::size_t downloads = 4;         // at a time
    Uploader::Options uploads;
  };
  // Null with an error. `operations` and `log` outlive it.
  static std::unique_ptr<Cloud> open(Options options, FileOperations& operations, Log& log,
                                     NSErrorOut error);
  ~Cloud() override;

  CloudPlaces places();
  CloudConditions& conditions() { return _conditions; }
  CloudRecords& records() { return *_records; }
  Downloader& downloader() { return *_downloader; }
  Uploader& uploader() { return *_uploader; }

  // Begins to upload what the store has. `store` outlives stop().
  void start(FolderStore& store);
  // Ends uploads and downloads, and waits for them. Before the store goes.
  void stop();
  // What the store told; from start() to stop().
  void storeDidChange(const std::vector<StoreChange>& changes) SKEIN_EXCLUDES(_mutex);
  void storeDidOverflow() SKEIN_EXCLUDES(_mutex);
  // Why nothing is drawn at the moment; empty: nothing hinders it, or nothing was asked for.
  std::string thumbnailProblem() SKEIN_EXCLUDES(_mutex);
  std::string whyNotUploaded(VLFileObjectID document) SKEIN_EXCLUDES(_mutex);
  // What became of the document at this path. Cheap; any thread.
  void documentWasEvicted(const std::string& path, VLFileObjectID document) SKEIN_EXCLUDES(_mutex);
  void documentWasDownloaded(const std::string& path) SKEIN_EXCLUDES(_mutex);

  // Answered on a thread of the cloud's.
  void setConditions(LocalCloudConditions conditions, Reply<NSErrorPtr> reply) override;
  void cloudStatus(Reply<LocalCloudStatus, NSErrorPtr> reply) override;
  void setKeeping(LocalCloudKeeping keeping, Reply<NSErrorPtr> reply) override;
  void collect(Reply<LocalCloudCollection, NSErrorPtr> reply) override SKEIN_EXCLUDES(_mutex);
  void verify(std::vector<std::string> markers, bool quick,
              Reply<LocalCloudVerification, NSErrorPtr> reply) override;

 private:
  Cloud(Options options, FileOperations& operations, Log& log);

  std::shared_ptr<UploadFeed> feed() SKEIN_EXCLUDES(_mutex);
  void startThumbnails(FolderStore& store) SKEIN_EXCLUDES(_mutex);
  // Null unless thumbnails are made.
  std::shared_ptr<ThumbnailService> thumbnails() SKEIN_EXCLUDES(_mutex);
  std::shared_ptr<CollectionRounds> rounds() SKEIN_EXCLUDES(_mutex);
  // How long, and how much, of what no record refers to is kept.
  Outcome<CollectionRounds::Rule> collectionRule();
  // Whether a copy of a document shares its blocks.
  bool probeSharing();

  Options _options;
  FileOperations& _operations;
  Log& _log;
  bool _sharesBlocks = false;
  CloudConditions _conditions;
  SystemCloudClock _clock;
  std::unique_ptr<CloudContents> _contents;
  std::unique_ptr<CloudRecords> _records;
  const std::shared_ptr<ClosableExecutor> _uploadThreads;
  const std::shared_ptr<ClosableExecutor> _downloadThreads;
  const std::shared_ptr<ClosableExecutor> _answers;
  const std::shared_ptr<ClosableExecutor> _checks;
  Cancellation _checksCancellation;
  std::unique_ptr<Downloader> _downloader;
  std::unique_ptr<Uploader> _uploader;

  Mutex _mutex;
  std::shared_ptr<UploadFeed> _feed SKEIN_GUARDED_BY(_mutex);
  std::shared_ptr<ThumbnailService> _thumbnails SKEIN_GUARDED_BY(_mutex);
  std::shared_ptr<CollectionRounds> _rounds SKEIN_GUARDED_BY(_mutex);
  std::string _thumbnailProblem SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein::vald
