#include "linux/framework/SyncCall.h"

#include <string>

#include "base/Fault.h"
#include "vellum/VLErrors.h"

namespace skein {

NSErrorPtr errorIfMayNotWait(const DaemonAccess& access) {
  if (!access.loop->isCurrent()) return nullptr;
  reportFault("a synchronous call to vald on the thread that reads vald's answers");
  return vl_errorDaemonUnreachable("vald cannot be asked from the thread that reads its answers.");
}

NSErrorPtr waitedTooLong(std::chrono::milliseconds limit) {
  return vl_errorDaemonUnreachable(
      "vald is still at work after " +
      std::to_string(duration_cast<std::chrono::seconds>(limit).count()) +
      " s; the disk may be busy. Look again before trying again.");
}

}  // namespace skein
