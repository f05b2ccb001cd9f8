#include "support/RootURL.h"

namespace skein {

NSURLPtr RootURL::get(VLContainers& containers, Executor& executor) {
  bool isAsked = false;
  {
    MutexLock lock(_mutex);
    if (_isKnown) return _url;
    isAsked = _isAsking;
    _isAsking = true;
  }
  if (isAsked) return _waitForAnswer(executor);

  const VLContainersByID table = containers.allContainersByContainerID();
  const auto found = table.find(VLUbiquitousDefaultContainerID);
  const bool wasAnswered = found != table.end() && found->second;
  MutexLock lock(_mutex);
  if (wasAnswered) {
    const NSURLPtr& url = found->second->documentsURL();
    _url = url ? url->copy() : nullptr;
    _isKnown = true;
  }
  _isAsking = false;
  ++_answers;
  _answered.notifyAll();
  return _url;
}

// Whoever waited takes the answer as it is, also when there was none: to ask again one after
// the other would make the last wait for all.
NSURLPtr RootURL::_waitForAnswer(Executor& executor) {
  ScopedWait wait(executor);
  MutexLock lock(_mutex);
  const std::uint64_t before = _answers;
  while (_isAsking && _answers == before) _answered.wait(_mutex);
  return _url;
}

}  // namespace skein
