#include "vellum/VLDaemonSyncProxy.h"

#include <utility>

namespace skein {

VLDaemonSyncProxy::VLDaemonSyncProxy(VLDaemonConnection& connection,
                                     std::shared_ptr<Executor> executor)
    : _executor(std::move(executor)),
      _answer(std::make_shared<Answer>()),
      _daemon(connection.remoteObjectProxyWithErrorHandler([answer = _answer](NSErrorPtr error) {
        answer->setBoolResult(false, std::move(error));
      })) {}

void VLDaemonSyncProxy::Answer::setBoolResult(bool result, NSErrorPtr error) {
  MutexLock lock(_mutex);
  if (_isAnswered) return;
  _isAnswered = true;
  if (!error) _result = result;
  _error = std::move(error);
  _answered.notifyAll();
}

std::optional<bool> VLDaemonSyncProxy::result() {
  {
    MutexLock lock(_answer->_mutex);
    if (_answer->_isAnswered) return _answer->_result;
  }
  ScopedWait wait(*_executor);
  MutexLock lock(_answer->_mutex);
  while (!_answer->_isAnswered) _answer->_answered.wait(_answer->_mutex);
  return _answer->_result;
}

NSErrorPtr VLDaemonSyncProxy::error() const {
  MutexLock lock(_answer->_mutex);
  return _answer->_error;
}

}  // namespace skein
