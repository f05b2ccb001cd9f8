#pragma once

#include <memory>
#include <optional>

#include "base/Executor.h"
#include "base/Mutex.h"
#include "vellum/VLDaemonConnection.h"

namespace skein {

// One call to the daemon whose answer is waited for: send it through the arrow, hand what
// its reply brings to setBoolResult(), then read result(). For one call and one thread; it
// may wait, so never on a connection's reader thread.
class VLDaemonSyncProxy {
 public:
  // newSyncProxy: of `connection`. `executor` learns that its thread waits.
  VLDaemonSyncProxy(VLDaemonConnection& connection, std::shared_ptr<Executor> executor);

  VLDaemon* operator->() const { return _daemon.get(); }

  // For the call's reply, on its thread; what it captures is this answer, not the proxy.
  class Answer {
   public:
    // setBoolResult:error: the first answer counts.
    void setBoolResult(bool result, NSErrorPtr error) SKEIN_EXCLUDES(_mutex);

   private:
    friend class VLDaemonSyncProxy;
    Mutex _mutex;
    CondVar _answered;
    bool _isAnswered SKEIN_GUARDED_BY(_mutex) = false;
    std::optional<bool> _result SKEIN_GUARDED_BY(_mutex);
    NSErrorPtr _error SKEIN_GUARDED_BY(_mutex);
  };
  const std::shared_ptr<Answer>& answer() const { return _answer; }

  // Waits for the answer; nil when it is an error, or when the connection failed.
  std::optional<bool> result();
  // The error, once result() has answered; null without one.
  NSErrorPtr error() const;

 private:
  const std::shared_ptr<Executor> _executor;
  const std::shared_ptr<Answer> _answer;
  const std::shared_ptr<VLDaemon> _daemon;
};

}  // namespace skein
