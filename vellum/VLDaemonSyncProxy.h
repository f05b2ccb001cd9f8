#pragma once

#include <concepts>
#include <memory>
#include <optional>
#include <utility>

#include "base/Executor.h"
#include "base/Mutex.h"
#include "vellum/VLDaemonConnection.h"

namespace skein {

// One call to the daemon whose answer is waited for: send it through the arrow, hand what
// its reply brings to the answer, then read result(). For one call and one thread; it may
// wait, so never on a connection's reader thread.
template <class Result = bool>
class VLDaemonSyncProxy {
 public:
  // For the call's reply, on its thread; what it captures is this answer, not the proxy.
  // The first answer counts.
  class Answer {
   public:
    // setObjResult:error: the result is nil when there is none.
    void setObjResult(std::optional<Result> result, NSErrorPtr error) SKEIN_EXCLUDES(_mutex) {
      MutexLock lock(_mutex);
      if (_isAnswered) return;
      _isAnswered = true;
      _result = std::move(result);
      _error = std::move(error);
      _answered.notifyAll();
    }
    // setBoolResult:error: an error means that there is no result.
    void setBoolResult(bool result, NSErrorPtr error) SKEIN_EXCLUDES(_mutex) {
      static_assert(std::same_as<Result, bool>);
      if (error) {
        setObjResult(std::nullopt, std::move(error));
      } else {
        setObjResult(result, nullptr);
      }
    }

   private:
    friend class VLDaemonSyncProxy;

    void wait(Executor& executor) SKEIN_EXCLUDES(_mutex) {
      {
        MutexLock lock(_mutex);
        if (_isAnswered) return;
      }
      ScopedWait scope(executor);
      MutexLock lock(_mutex);
      while (!_isAnswered) _answered.wait(_mutex);
    }

    Mutex _mutex;
    CondVar _answered;
    bool _isAnswered SKEIN_GUARDED_BY(_mutex) = false;
    std::optional<Result> _result SKEIN_GUARDED_BY(_mutex);
    NSErrorPtr _error SKEIN_GUARDED_BY(_mutex);
  };

  // newSyncProxy: of `connection`. `executor` learns that its thread waits.
  VLDaemonSyncProxy(VLDaemonConnection& connection, std::shared_ptr<Executor> executor)
      : _executor(std::move(executor)),
        _daemon(connection.remoteObjectProxyWithErrorHandler([answer = _answer](NSErrorPtr error) {
          answer->setObjResult(std::nullopt, std::move(error));
        })) {}

  VLDaemon* operator->() const { return _daemon.get(); }
  const std::shared_ptr<Answer>& answer() const { return _answer; }

  // Waits for the answer; nil when it brought none, or when the connection failed.
  std::optional<Result> result() {
    _answer->wait(*_executor);
    MutexLock lock(_answer->_mutex);
    return _answer->_result;
  }
  // The error, once result() has answered; null without one.
  NSErrorPtr error() const {
    MutexLock lock(_answer->_mutex);
    return _answer->_error;
  }

 private:
  const std::shared_ptr<Executor> _executor;
  const std::shared_ptr<Answer> _answer = std::make_shared<Answer>();
  const std::shared_ptr<VLDaemon> _daemon;
};

}  // namespace skein
