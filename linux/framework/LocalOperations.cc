#include "linux/framework/LocalOperations.h"

#include <string>

#include "base/Mutex.h"
#include "linux/framework/FileCall.h"
#include "linux/framework/RequestProgress.h"
#include "platform/foundation/NSFileCoordinatorReadingOptions.h"

namespace skein {
namespace {

NSErrorPtr cancelled() {
  return NSError::errorWithDomain(
      NSCocoaErrorDomain, NSUserCancelledError,
      {{NSLocalizedDescriptionKey, std::string("The download was cancelled.")}});
}

class LocalFileProvidingOperation final
    : public VLFileProvidingOperation,
      public std::enable_shared_from_this<LocalFileProvidingOperation> {
 public:
  LocalFileProvidingOperation(DaemonAccess access, NSURLPtr url, std::uint64_t readingOptions)
      : _access(std::move(access)),
        _url(std::move(url)),
        _currentVersion((readingOptions & NSFileCoordinatorReadingAlwaysFetches) != 0),
        _requestProgress(RequestProgressScope::current()) {}

  void setFileProvidingCompletion(UniqueFunction<void(NSErrorPtr)> completion) override {
    MutexLock lock(_mutex);
    std::swap(_completion, completion);
  }
  void setWantsCurrentVersion(bool wantsCurrentVersion) override {
    MutexLock lock(_mutex);
    _currentVersion = wantsCurrentVersion;
  }

  void start() override {
    bool currentVersion = false;
    {
      MutexLock lock(_mutex);
      currentVersion = _currentVersion;
    }
    if (isCancelled()) {
      complete(cancelled());
      return;
    }
    UniqueFunction<void(NSErrorPtr)> done = [self = shared_from_this()](NSErrorPtr error) {
      self->complete(std::move(error));
    };
    std::shared_ptr<NSProgress> progress;
    callFiles(_access, std::move(done), [&](LocalFiles& files, const RequestOrigin&, auto reply) {
      progress = files.download(_url, currentVersion, reply);
    });
    {
      MutexLock lock(_mutex);
      _progress = progress;
    }
    if (_requestProgress) _requestProgress->follow(progress);
    // A cancel() since the test above found no progress to cancel.
    if (isCancelled()) progress->cancel();
  }

  void cancel() override {
    VLFileProvidingOperation::cancel();
    std::shared_ptr<NSProgress> progress;
    {
      MutexLock lock(_mutex);
      progress = _progress;
    }
    if (progress) progress->cancel();
  }

 private:
  void complete(NSErrorPtr error) {
    UniqueFunction<void(NSErrorPtr)> completion;
    {
      MutexLock lock(_mutex);
      std::swap(completion, _completion);
    }
    if (completion) completion(std::move(error));
  }

  const DaemonAccess _access;
  const NSURLPtr _url;
  Mutex _mutex;
  bool _currentVersion SKEIN_GUARDED_BY(_mutex);
  UniqueFunction<void(NSErrorPtr)> _completion SKEIN_GUARDED_BY(_mutex);
  std::shared_ptr<NSProgress> _progress SKEIN_GUARDED_BY(_mutex);
  const std::shared_ptr<RequestProgress> _requestProgress;
};

}  // namespace

std::shared_ptr<VLFileProvidingOperation> LocalOperations::fileProvidingOperation(
    const NSURLPtr& url, std::uint64_t readingOptions) {
  return std::make_shared<LocalFileProvidingOperation>(_access, url, readingOptions);
}

}  // namespace skein
