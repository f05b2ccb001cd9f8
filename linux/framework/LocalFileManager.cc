#include "linux/framework/LocalFileManager.h"

#include "linux/framework/EvictionOutcome.h"
#include "linux/framework/FileCall.h"

namespace skein {

bool LocalFileManager::evictUbiquitousItemAtURL(const NSURLPtr& url, NSErrorOut error) {
  NSErrorPtr problem =
      askFilesForError(_access, [&](LocalFiles& files, const RequestOrigin&, auto reply) {
        files.evict(url, std::move(reply));
      });
  EvictionOutcomeScope::note(problem);
  if (!problem) return true;
  error.store(std::move(problem));
  return false;
}

bool LocalFileManager::vl_trashItemAtURL(const NSURLPtr& url, NSURLPtr* resultingURL,
                                         NSErrorOut error) {
  auto [trashed, problem] =
      askFiles<NSURLPtr>(_access, [&](LocalFiles& files, const RequestOrigin& origin, auto reply) {
        files.trash(url, origin, std::move(reply));
      });
  if (problem) {
    error.store(std::move(problem));
    return false;
  }
  if (resultingURL != nullptr) *resultingURL = std::move(trashed);
  return true;
}

NSURLPtr LocalFileManager::vl_putBackURLForTrashedItemAtURL(const NSURLPtr& url, NSErrorOut error) {
  auto [putBack, problem] =
      askFiles<NSURLPtr>(_access, [&](LocalFiles& files, const RequestOrigin&, auto reply) {
        files.putBackURL(url, std::move(reply));
      });
  if (problem) error.store(std::move(problem));
  return putBack;
}

void LocalFileManager::vl_setLastOpenDate(std::optional<NSDate> date, const NSURLPtr& onItemAtURL) {
  if (!onItemAtURL) return;
  const NSErrorPtr problem =
      askFilesForError(_access, [&](LocalFiles& files, const RequestOrigin&, auto reply) {
        files.setLastOpenDate(onItemAtURL, date, std::move(reply));
      });
  if (problem) {
    VL_ERROR(_log, "[ERROR] can't set the last used date of %@: %@", onItemAtURL, problem);
  }
}

void LocalFileManager::vl_setFavoriteRank(std::optional<std::int64_t> rank,
                                          const NSURLPtr& onItemAtURL) {
  if (!onItemAtURL) return;
  const NSErrorPtr problem =
      askFilesForError(_access, [&](LocalFiles& files, const RequestOrigin&, auto reply) {
        files.setFavoriteRank(onItemAtURL, rank, std::move(reply));
      });
  if (problem) {
    VL_ERROR(_log, "[ERROR] can't set the favourite rank of %@: %@", onItemAtURL, problem);
  }
}

}  // namespace skein
