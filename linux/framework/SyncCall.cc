#include "linux/framework/SyncCall.h"

#include "base/Fault.h"
#include "vellum/VLErrors.h"

namespace skein {

NSErrorPtr errorIfMayNotWait(const DaemonAccess& access) {
  if (!access.loop->isCurrent()) return nullptr;
  reportFault("a synchronous call to vald on the thread that reads vald's answers");
  return vl_errorDaemonUnreachable("vald cannot be asked from the thread that reads its answers.");
}

}  // namespace skein
