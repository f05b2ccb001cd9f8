#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "base/ThreadPool.h"
#include "linux/vald/thumbnails/DesktopThumbnails.h"
#include "linux/vald/thumbnails/ThumbnailMaker.h"

namespace skein::vald {

// All that vald has to do with thumbnails, with threads of its own. Any thread.
class ThumbnailService {
 public:
  // References outlive the service.
  struct Parts {
    CloudContents& contents;
    CloudRecords& records;
    FileLayer& files;
    CloudClock& clock;
    Log& log;
    std::string folder;         // of the pictures; the service's own
    std::string desktopFolder;  // DesktopThumbnails::userFolder()
    std::function<std::optional<std::string>(VLFileObjectID)> contentType;  // see ThumbnailMaker
    ThumbnailRenderer::Options renderer;
  };
  // Starts with the thumbnails that are missing.
  static Outcome<std::unique_ptr<ThumbnailService>> start(Parts parts);
  // Ends what runs, and waits for it.
  ~ThumbnailService();
  ThumbnailService(const ThumbnailService&) = delete;
  ThumbnailService& operator=(const ThumbnailService&) = delete;

  // After CloudRecords::put(). Cheap.
  void documentWasUploaded(VLFileObjectID document) { _maker->documentWasUploaded(document); }
  // See DesktopThumbnails. Cheap.
  void documentWasEvicted(std::string path, CloudRecord record) {
    _desktop->documentWasEvicted(std::move(path), std::move(record));
  }
  void documentCameBack(std::string path) { _desktop->documentCameBack(std::move(path)); }
  // ThumbnailRenderer::startProblem().
  std::string startProblem() const { return _renderer->startProblem(); }
  // Removes pictures of contents that no record refers to: with the cloud's own garbage.
  Outcome<std::uint64_t> collectGarbage();

 private:
  ThumbnailService(Parts parts, std::unique_ptr<ThumbnailAssets> assets);

  CloudRecords& _records;
  const std::unique_ptr<ThumbnailAssets> _assets;
  const std::shared_ptr<ThreadPool> _pool;
  std::unique_ptr<ThumbnailRenderer> _renderer;
  std::unique_ptr<ThumbnailMaker> _maker;
  std::unique_ptr<DesktopThumbnails> _desktop;
};

}  // namespace skein::vald
