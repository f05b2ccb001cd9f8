#pragma once

#include <optional>
#include <utility>

#include "linux/framework/SyncCall.h"
#include "platform/log/Log.h"
#include "vellum/VLFileOperations.h"

namespace skein {

// The default file manager: waits for vald on the calling thread, which is any but the
// loop's. What the two writes without an error are refused is logged.
class LocalFileManager final : public VLFileManager {
 public:
  // `log` outlives it.
  LocalFileManager(DaemonAccess access, Log& log) : _access(std::move(access)), _log(log) {}

  bool evictUbiquitousItemAtURL(const NSURLPtr& url, NSErrorOut error) override;
  bool vl_trashItemAtURL(const NSURLPtr& url, NSURLPtr* resultingURL, NSErrorOut error) override;
  NSURLPtr vl_putBackURLForTrashedItemAtURL(const NSURLPtr& url, NSErrorOut error) override;
  void vl_setLastOpenDate(std::optional<NSDate> date, const NSURLPtr& onItemAtURL) override;
  void vl_setFavoriteRank(std::optional<std::int64_t> rank, const NSURLPtr& onItemAtURL) override;

 private:
  const DaemonAccess _access;
  Log& _log;
};

}  // namespace skein
