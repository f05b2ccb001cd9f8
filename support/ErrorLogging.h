#pragma once

#include "platform/foundation/NSError.h"
#include "platform/log/Log.h"

namespace skein {

// Ends a method that fails through an optional error out-argument: logs the error with
// the method's full name and whether the caller will see it, then stores it.
inline void vl_reportError(Log& log, const char* method, NSErrorOut out, const NSErrorPtr& error) {
  VL_ERROR(log, "[ERROR] %s: %s error: %@", method,
           out.passed() ? "(passed to caller)" : "(ignored by caller)", error);
  out.store(error);
}

}  // namespace skein
