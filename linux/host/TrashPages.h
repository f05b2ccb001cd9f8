#pragma once

#include <memory>
#include <vector>

#include "linux/host/DriveRequests.h"
#include "linux/protocol/HostFiles.h"

namespace skein {

// The trash, from vald, page by page as they are asked for. Any thread.
class TrashPages final : public HostTrash {
 public:
  explicit TrashPages(std::shared_ptr<DriveRequests> drive);

  void next(Reply<std::vector<HostTrashedItem>, bool, NSErrorPtr> reply) override;

 private:
  class Work;
  const std::shared_ptr<Work> _work;
};

}  // namespace skein
