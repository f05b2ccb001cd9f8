#include "extension/Contents.h"

#include <optional>
#include <utility>

#include "platform/foundation/NSFileCoordinatorReadingOptions.h"
#include "support/NSError+VLFPAdditions.h"
#include "vellum/VLFileCoordinator.h"

namespace skein {

void Contents::providePlaceholder(ErrorCompletion completionHandler) {
  if (completionHandler) completionHandler(nullptr);
}

void Contents::startProvidingItemAtURL(std::shared_ptr<Contents> self, const NSURLPtr& url,
                                       std::uint64_t readingOptions, NSOperationQueue& queue,
                                       ErrorCompletion completionHandler) {
  Environment& environment = self->_environment;
  Log& log = environment.log;
  // What is not ours is granted without any work.
  if (!environment.documents.vl_isInSyncedLocation(url)) {
    completionHandler(nullptr);
    return;
  }
  const std::string path = url->path();
  const std::uint64_t section = environment.logSections.create(VLLogSectionLevel::Debug);
  VL_DEBUG(log, "[DEBUG] ┣%llx start providing %@ (readingOptions: %@)", section, path,
           VLFileCoordinatorReadingOptionsPrettyPrint(readingOptions));

  if (environment.fileOperations.vl_isPromiseURL(url)) {
    VL_ERROR(log,
             "[ERROR] Someone tries to coordinate at the side fault URL '%@', odd, but allow it",
             path);
  } else if ((readingOptions & NSFileCoordinatorReadingAlwaysFetches) == 0 &&
             environment.fileOperations.checkResourceIsReachable(url, nullptr)) {
    VL_DEBUG(log, "[DEBUG] url exists, granting the read");
    // The section stays open on purpose: no closing line tells a granted read in the log.
    completionHandler(nullptr);
    return;
  }

  const Operation operation = environment.operations.fileProvidingOperation(url, readingOptions);
  operation->setFileProvidingCompletion(
      [self, path, section,
       completionHandler = std::move(completionHandler)](const NSErrorPtr& error) mutable {
        self->_operationDidComplete(path, section, error, completionHandler);
      });
  self->_store(path, operation);
  // Queued even when a stop has cancelled it in between: an operation reports, also a
  // cancelled one, only when it is started.
  queue.addOperation(operation);
}

void Contents::_operationDidComplete(const std::string& path, std::uint64_t section,
                                     const NSErrorPtr& error, ErrorCompletion& completionHandler) {
  VL_DEBUG(_environment.log, "[DEBUG] ┳%llx item providing completion; %@", section, error);
  _remove(path);
  completionHandler(vl_fileProviderError(error));
  vlc_closeLogSection(_environment.log, section);
}

void Contents::_store(const std::string& path, Operation operation) {
  MonitorLock lock(_lock);
  Operation& entry = _downloadOperationByPath[path];
  if (entry) {
    VL_CRIT(_environment.log, "[CRIT] Assertion failed: _downloadOperationByPath[path] == nil");
  }
  // A second start is served like the first: it takes the place, and both are answered.
  // The older operation goes with the parameter, after the lock: that may destroy it.
  entry.swap(operation);
}

void Contents::_remove(const std::string& path) {
  Operation removed;
  MonitorLock lock(_lock);
  const auto found = _downloadOperationByPath.find(path);
  if (found == _downloadOperationByPath.end()) {
    VL_CRIT(_environment.log, "[CRIT] Assertion failed: self->_downloadOperationByPath[path]");
    return;
  }
  // By path alone: where a second start took the place, the first to complete removes it.
  removed = std::move(found->second);
  _downloadOperationByPath.erase(found);
}

Contents::Operation Contents::_operationForPath(const std::string& path) {
  MonitorLock lock(_lock);
  const auto found = _downloadOperationByPath.find(path);
  return found != _downloadOperationByPath.end() ? found->second : nullptr;
}

void Contents::stopProvidingItemAtURL(const NSURLPtr& url) {
  Log& log = _environment.log;
  std::optional<std::string> path;
  if (url) path = url->path();
  VL_DEBUG(log, "[DEBUG] stop providing %@", path);

  if (const Operation operation = path ? _operationForPath(*path) : nullptr) {
    // Its completion removes the entry and answers whoever started it.
    operation->cancel();
    return;
  }
  NSErrorPtr error;
  if (!_environment.fileManager.evictUbiquitousItemAtURL(url, &error)) {
    // The text promises the URL and gives the error, which says more; readers of the log
    // know the line as it is.
    VL_ERROR(log, "[ERROR] can't evict item at url: %@", error);
  }
}

void Contents::itemChangedAtURL(const NSURLPtr& url) {
  VL_DEBUG(_environment.log, "[DEBUG] Item changed at URL %@", url);
}

}  // namespace skein
