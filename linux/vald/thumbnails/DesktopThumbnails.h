#pragma once

#include <functional>
#include <memory>
#include <string>
#include <string_view>

#include "base/Executor.h"
#include "linux/vald/cloud/BoundedRunner.h"
#include "linux/vald/cloud/CloudRecords.h"
#include "linux/vald/thumbnails/ThumbnailRenderer.h"

namespace skein::vald {

// Keeps the desktop's own cache of thumbnails right for documents whose contents are not
// here: a file manager that finds an entry there has no reason to open the document, which
// would download it. An entry is named after the document's URL and bears the time of its
// last change, both as file managers see them. Any thread; the work is done in order, one
// document after the other.
class DesktopThumbnails {
 public:
  // `folder`: $XDG_CACHE_HOME/thumbnails. `executor` runs what blocks; it may be the
  // renderer's. `renderer` and `log` outlive this.
  DesktopThumbnails(std::string folder, ThumbnailRenderer& renderer,
                    std::shared_ptr<Executor> executor, Log& log);
  // Drops what has not begun, and waits for the rest.
  ~DesktopThumbnails();
  DesktopThumbnails(const DesktopThumbnails&) = delete;
  DesktopThumbnails& operator=(const DesktopThumbnails&) = delete;

  // The document at `path` (absolute, as file managers see it) is in the cloud alone from now
  // on; or it was already and its record changed. Writes entries of all sizes that its
  // thumbnail is good for. Without a thumbnail, removes the entries.
  void documentWasEvicted(std::string path, CloudRecord record);
  // It is here again, or is not at this path any more. Removes the entries that were written
  // here; those of others stay.
  void documentCameBack(std::string path);

  // $XDG_CACHE_HOME/thumbnails, else ~/.cache/thumbnails.
  static std::string userFolder();
  // Where the entry of a URL is: "normal", "large", "x-large" or "xx-large".
  std::string entryPath(std::string_view size, const std::string& url) const;

 private:
  struct Entry;

  void write(const std::string& path, const CloudRecord& record);
  NSErrorPtr writeEntry(const Entry& entry, const std::string& picture, bool& isLargest);
  void remove(const std::string& path);
  Outcome<RenderedPicture> draw(const std::string& picture, std::uint32_t side);

  const std::string _folder;
  ThumbnailRenderer& _renderer;
  const std::shared_ptr<Executor> _executor;
  Log& _log;
  BoundedRunner _runner;
};

}  // namespace skein::vald
