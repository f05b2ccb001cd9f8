#pragma once

#include <memory>
#include <tuple>
#include <utility>

#include "base/Mutex.h"
#include "linux/framework/SyncCall.h"
#include "platform/foundation/NSOperation.h"
#include "platform/foundation/NSProgress.h"

namespace skein {

// An operation that makes one call to vald and hands the answer to its block, once: the
// answer, the connection's error, or NSUserCancelledError when it is cancelled first. The
// block runs on the executor, or, for what needs no answer, on the thread that starts it.
//
// `Operation` is the framework's class; `Values` are the block's, the error last.
template <class Operation, class... Values>
class DaemonOperation : public Operation,
                        public std::enable_shared_from_this<DaemonOperation<Operation, Values...>> {
 public:
  using Block = UniqueFunction<void(Values...)>;
  // Sends the call; answers the progress that cancels it.
  using Call = UniqueFunction<std::shared_ptr<NSProgress>(LocalDaemon&, Reply<Values...>)>;

  // An error stands for what need not be asked.
  DaemonOperation(DaemonAccess access, Call call, NSErrorPtr error)
      : _access(std::move(access)), _call(std::move(call)), _error(std::move(error)) {}

  void start() final {
    Call call;
    {
      MutexLock lock(_mutex);
      _started = true;
      call = std::exchange(_call, nullptr);
    }
    if (Operation::isCancelled()) return fail(cancelledError());
    if (_error) return fail(_error);
    const auto daemon = _access.client->remoteObjectProxyWithErrorHandler(
        [self = this->shared_from_this()](NSErrorPtr error) { self->fail(std::move(error)); });
    const auto progress = call(*daemon, [self = this->shared_from_this()](Values... values) {
      self->report(std::tuple<Values...>(std::move(values)...));
    });
    {
      MutexLock lock(_mutex);
      if (_block) _progress = progress;
    }
    if (Operation::isCancelled()) progress->cancel();
  }

  void cancel() final {
    Operation::cancel();
    std::shared_ptr<NSProgress> progress;
    {
      MutexLock lock(_mutex);
      if (!_started) return;  // start() reports
      progress = _progress;
    }
    if (progress) progress->cancel();
    _access.executor->post([self = this->shared_from_this()] { self->fail(cancelledError()); });
  }

 protected:
  void setBlock(Block block) SKEIN_EXCLUDES(_mutex) {
    MutexLock lock(_mutex);
    std::swap(_block, block);
  }

 private:
  static NSErrorPtr cancelledError() {
    return NSError::errorWithDomain(
        NSCocoaErrorDomain, NSUserCancelledError,
        {{NSLocalizedDescriptionKey, std::string("The operation was cancelled.")}});
  }

  void fail(NSErrorPtr error) SKEIN_EXCLUDES(_mutex) {
    std::tuple<Values...> values;
    std::get<sizeof...(Values) - 1>(values) = std::move(error);
    report(std::move(values));
  }

  void report(std::tuple<Values...> values) SKEIN_EXCLUDES(_mutex) {
    Block block;
    std::shared_ptr<NSProgress> progress;
    {
      MutexLock lock(_mutex);
      block = std::exchange(_block, nullptr);
      progress = std::exchange(_progress, nullptr);
    }
    if (block) std::apply([&](Values&... each) { block(std::move(each)...); }, values);
  }

  const DaemonAccess _access;
  Mutex _mutex;
  Call _call SKEIN_GUARDED_BY(_mutex);
  const NSErrorPtr _error;
  bool _started SKEIN_GUARDED_BY(_mutex) = false;
  Block _block SKEIN_GUARDED_BY(_mutex);
  std::shared_ptr<NSProgress> _progress SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein
