#pragma once

#include <string>

#include "linux/protocol/LocalFiles.h"

namespace skein {

// Says whose request this thread is serving, until the scope ends; scopes nest. Whoever
// starts an operation of the extension's makes one. The framework's file operations take the
// origin when they are called, and have it again while their completion runs, so that what a
// completion starts has the same one.
class RequestOriginScope {
 public:
  explicit RequestOriginScope(RequestOrigin origin);
  ~RequestOriginScope();
  RequestOriginScope(const RequestOriginScope&) = delete;
  RequestOriginScope& operator=(const RequestOriginScope&) = delete;

  // The calling thread's; empty outside every scope.
  static RequestOrigin current();

 private:
  const RequestOrigin _outer;
};

}  // namespace skein
