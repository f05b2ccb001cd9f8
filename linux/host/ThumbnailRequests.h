#pragma once

#include <memory>

#include "linux/host/DriveRequests.h"
#include "linux/protocol/HostThumbnails.h"

namespace skein {

// Thumbnails for the command line, from the extension: a batch is one of the extension's.
class ThumbnailRequests final : public HostThumbnails {
 public:
  explicit ThumbnailRequests(std::shared_ptr<DriveRequests> drive) : _drive(std::move(drive)) {}

  void fetchThumbnails(std::vector<HostTarget> targets, NSSize size,
                       Reply<std::shared_ptr<HostThumbnailBatch>, NSErrorPtr> reply) override;

 private:
  const std::shared_ptr<DriveRequests> _drive;
};

}  // namespace skein
