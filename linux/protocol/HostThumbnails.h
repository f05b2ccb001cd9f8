// Thumbnails of many items, as the command line asks skein-host for them. Stands on both
// sides of the socket, as HostService does.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "linux/protocol/HostTypes.h"
#include "platform/foundation/NSData.h"
#include "platform/foundation/NSSize.h"

namespace skein {

// What came for one of the items that were asked for.
struct HostThumbnail {
  enum class Kind : std::uint8_t {
    Thumbnail,  // a picture of the document
    Icon,       // of a container's app
    None,       // the item has none: a folder, or the cloud stored none of it
    Missing,    // the cloud has no record of the document: it was not uploaded yet
    Error,
  };
  std::uint32_t index = 0;  // in the request
  Kind kind = Kind::None;
  std::optional<NSData> data;       // the first two: a picture file's bytes
  std::optional<std::string> type;  // of an icon that is an app's own, without a folder around
  NSErrorPtr error;
};

// Some of the batch; `done` of `total` items have been told of with it. The last step has
// `finished`, and the error of the batch, if it has one.
struct HostThumbnailStep {
  std::vector<HostThumbnail> thumbnails;
  std::uint64_t done = 0;
  std::uint64_t total = 0;
  bool finished = false;
};
// Letting go cancels the batch.
using HostThumbnailBatch = HostStream<HostThumbnailStep>;

// Asynchronous: each reply runs once, on any thread but the caller's.
class HostThumbnails {
 public:
  // What one batch may name; more is an invalid-parameter error.
  static constexpr std::size_t kMostTargets = 1000;

  virtual ~HostThumbnails() = default;

  // Each target is told of once, in any order. `size` in points; it matters to icons alone.
  virtual void fetchThumbnails(std::vector<HostTarget> targets, NSSize size,
                               Reply<std::shared_ptr<HostThumbnailBatch>, NSErrorPtr> reply) = 0;
};

}  // namespace skein
