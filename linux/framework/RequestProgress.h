#pragma once

#include <cstdint>
#include <memory>

#include "base/Mutex.h"
#include "platform/foundation/NSProgress.h"

namespace skein {

// How far the transfer is that a request of the extension started, and the way to cancel it.
// The extension's operations have no place for either, so the host says whose request it is
// while it calls one (RequestProgressScope), and the framework's operation that moves the
// bytes reports here. Any thread.
class RequestProgress {
 public:
  // The framework's operation has begun; cancelled at once if the request is.
  void follow(std::shared_ptr<NSProgress> progress) SKEIN_EXCLUDES(_mutex);

  // Bytes; 0 until an operation reports, the total also while nobody knows.
  std::uint64_t completed() const SKEIN_EXCLUDES(_mutex);
  std::uint64_t total() const SKEIN_EXCLUDES(_mutex);

  // Cancels the operation, or the one that is yet to begin.
  void cancel() SKEIN_EXCLUDES(_mutex);

 private:
  std::shared_ptr<NSProgress> followed() const SKEIN_EXCLUDES(_mutex);

  mutable Mutex _mutex;
  std::shared_ptr<NSProgress> _progress SKEIN_GUARDED_BY(_mutex);
  bool _cancelled SKEIN_GUARDED_BY(_mutex) = false;
};

// From its construction to its destruction, what the extension asks of the framework on this
// thread reports to `progress`.
class RequestProgressScope {
 public:
  explicit RequestProgressScope(std::shared_ptr<RequestProgress> progress);
  ~RequestProgressScope();
  RequestProgressScope(const RequestProgressScope&) = delete;
  RequestProgressScope& operator=(const RequestProgressScope&) = delete;

  // The calling thread's; null outside every scope.
  static std::shared_ptr<RequestProgress> current();

 private:
  std::shared_ptr<RequestProgress> _previous;
};

}  // namespace skein
