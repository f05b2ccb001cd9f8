#include "linux/framework/UnsupportedFileOperations.h"

#include <unistd.h>

#include <cerrno>
#include <system_error>
#include <utility>

#include "base/Mutex.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

NSErrorPtr notSupported(const std::string& operation) {
  return NSError::errorWithDomain(
      NSCocoaErrorDomain, NSFeatureUnsupportedError,
      {{NSLocalizedDescriptionKey, "This host does not offer " + operation + "."}});
}

NSErrorPtr noURL() {
  return NSError::errorWithDomain(NSCocoaErrorDomain, NSFileNoSuchFileError,
                                  {{NSLocalizedDescriptionKey, std::string("There is no URL.")}});
}

class UnsupportedProvidingOperation final : public VLFileProvidingOperation {
 public:
  // Never finishes before it was started, so a cancelled one reports there too.
  void start() override {
    UniqueFunction<void(NSErrorPtr)> completion;
    {
      MutexLock lock(_mutex);
      completion = std::exchange(_completion, nullptr);
    }
    if (!completion) return;
    if (isCancelled()) {
      completion(NSError::errorWithDomain(
          NSCocoaErrorDomain, NSUserCancelledError,
          {{NSLocalizedDescriptionKey, std::string("The download was cancelled.")}}));
    } else {
      completion(notSupported("downloads"));
    }
  }
  void setFileProvidingCompletion(UniqueFunction<void(NSErrorPtr)> completion) override {
    MutexLock lock(_mutex);
    std::swap(_completion, completion);
  }
  void setWantsCurrentVersion(bool /*wantsCurrentVersion*/) override {}

 private:
  Mutex _mutex;
  UniqueFunction<void(NSErrorPtr)> _completion SKEIN_GUARDED_BY(_mutex);
};

}  // namespace

void UnsupportedFileOperations::refuseLater(const char* operation, VLURLHandler handler) {
  _executor->post([operation, handler = std::move(handler)]() mutable {
    handler(nullptr, notSupported(operation));
  });
}

void UnsupportedFileOperations::fp_importUnderFolder(const NSURLPtr& /*url*/,
                                                     const NSURLPtr& /*folder*/,
                                                     VLURLHandler completionHandler) {
  refuseLater("importing a document", std::move(completionHandler));
}

void UnsupportedFileOperations::fp_createSubFolder(const NSURLPtr& /*url*/,
                                                   const std::string& /*name*/,
                                                   VLURLHandler completionHandler) {
  refuseLater("making a folder", std::move(completionHandler));
}

void UnsupportedFileOperations::fp_renameWithNewName(const NSURLPtr& /*url*/,
                                                     const std::string& /*newName*/,
                                                     VLURLHandler completionHandler) {
  refuseLater("renaming", std::move(completionHandler));
}

void UnsupportedFileOperations::fp_reparentUnderFolder_withNewName(
    const NSURLPtr& /*url*/, const NSURLPtr& /*folder*/, std::optional<std::string> /*newName*/,
    VLURLHandler completionHandler) {
  refuseLater("moving", std::move(completionHandler));
}

void UnsupportedFileOperations::fp_reparentUnderFolder_allowBouncing(
    const NSURLPtr& /*url*/, const NSURLPtr& /*folder*/, bool /*allowBouncing*/,
    VLURLHandler completionHandler) {
  refuseLater("putting back from the trash", std::move(completionHandler));
}

void UnsupportedFileOperations::fp_deleteWithCompletionHandler(
    const NSURLPtr& /*url*/, UniqueFunction<void(NSErrorPtr)> completionHandler) {
  _executor->post([completionHandler = std::move(completionHandler)]() mutable {
    completionHandler(notSupported("deleting"));
  });
}

void UnsupportedFileOperations::fp_coordinatedDeleteWithHandler(const NSURLPtr& /*url*/,
                                                                VLURLHandler handler) {
  handler(nullptr, notSupported("moving to the trash"));
}

std::uint64_t UnsupportedFileOperations::vl_capabilityToMoveToURL(const NSURLPtr& /*url*/,
                                                                  const NSURLPtr& /*toURL*/,
                                                                  NSErrorOut error) {
  error.store(notSupported("moving"));
  return 0;
}

bool UnsupportedFileOperations::vl_setTagNames(const NSURLPtr& url,
                                               const std::vector<std::string>& /*names*/,
                                               NSErrorOut error) {
  if (url) error.store(notSupported("setting tags"));
  return false;
}

bool UnsupportedFileOperations::checkResourceIsReachable(const NSURLPtr& url, NSErrorOut error) {
  if (!url) {
    error.store(noURL());
    return false;
  }
  if (::access(url->path().c_str(), F_OK) == 0) return true;
  const int code = errno;
  error.store(vl_errorWithPOSIXCode(code, std::generic_category().message(code)));
  return false;
}

bool UnsupportedFileManager::evictUbiquitousItemAtURL(const NSURLPtr& /*url*/, NSErrorOut error) {
  error.store(notSupported("evicting a file"));
  return false;
}

bool UnsupportedFileManager::vl_trashItemAtURL(const NSURLPtr& /*url*/, NSURLPtr* /*resultingURL*/,
                                               NSErrorOut error) {
  error.store(notSupported("moving to the trash"));
  return false;
}

NSURLPtr UnsupportedFileManager::vl_putBackURLForTrashedItemAtURL(const NSURLPtr& /*url*/,
                                                                  NSErrorOut error) {
  error.store(notSupported("putting back from the trash"));
  return nullptr;
}

void UnsupportedFileManager::vl_setLastOpenDate(std::optional<NSDate> /*date*/,
                                                const NSURLPtr& onItemAtURL) {
  VL_ERROR(_log, "[ERROR] the last used date of %@ is not kept: this host offers no such date",
           onItemAtURL);
}

void UnsupportedFileManager::vl_setFavoriteRank(std::optional<std::int64_t> /*rank*/,
                                                const NSURLPtr& onItemAtURL) {
  VL_ERROR(_log, "[ERROR] the favourite rank of %@ is not kept: this host offers no such rank",
           onItemAtURL);
}

std::shared_ptr<VLFileProvidingOperation> UnsupportedOperations::fileProvidingOperation(
    const NSURLPtr& /*url*/, std::uint64_t /*readingOptions*/) {
  return std::make_shared<UnsupportedProvidingOperation>();
}

}  // namespace skein
