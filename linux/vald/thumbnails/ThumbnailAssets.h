#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "linux/protocol/FileDescriptor.h"
#include "linux/rendering/RenderMessages.h"
#include "linux/vald/cloud/ContentHash.h"
#include "linux/vald/cloud/Outcome.h"
#include "linux/vald/files/FileLayer.h"
#include "linux/vald/thumbnails/RenderWorker.h"

namespace skein::vald {

// The pictures that records refer to, in a folder of their own and named after the contents
// that they show and after what these were taken for, so that equal documents share one:
//
//   pictures/ab/ab12…-jpeg.jpg   or .png; never changed once it stands there
//   pictures/ab/ab12…-jpeg.none  there is no picture of these contents: an empty file
//   incoming/                    what is still being written; emptied at the opening
//
// Pictures appear by atomic rename when they are durable. Any thread; calls block.
class ThumbnailAssets {
 public:
  // Makes the folder when it does not stand, for its owner alone. `files` outlives it.
  static Outcome<std::unique_ptr<ThumbnailAssets>> open(const std::string& folder,
                                                        FileLayer& files);

  // The picture's path; nil when there is none yet.
  std::optional<std::string> find(const ContentHash& contents, PictureKind kind) const;
  // Takes the picture in and answers its path.
  Outcome<std::string> add(const ContentHash& contents, PictureKind kind,
                           const RenderedPicture& picture);

  // That there is no picture of these contents, for the next process too.
  bool isHopeless(const ContentHash& contents, PictureKind kind) const;
  NSErrorPtr setHopeless(const ContentHash& contents, PictureKind kind);

  // Removes what belongs to contents that `isReferred` does not know; answers how many files.
  Outcome<std::uint64_t> collectGarbage(const std::function<bool(const ContentHash&)>& isReferred);

 private:
  ThumbnailAssets(std::string folder, FileLayer& files, FileDescriptor pictures,
                  FileDescriptor incoming)
      : _folder(std::move(folder)),
        _files(files),
        _pictures(std::move(pictures)),
        _incoming(std::move(incoming)) {}

  bool stands(const std::string& name) const;
  NSErrorPtr write(const std::string& name, std::string_view bytes);
  std::string pathOf(const std::string& name) const;

  const std::string _folder;
  FileLayer& _files;
  const FileDescriptor _pictures;
  const FileDescriptor _incoming;
  std::atomic<std::uint64_t> _nextIncoming{0};
};

}  // namespace skein::vald
