#include "base/Fault.h"

#include <cstdio>
#include <cstdlib>
#include <utility>

#include "base/Mutex.h"

namespace skein {
namespace {

Mutex handlerMutex;
FaultHandler currentHandler SKEIN_GUARDED_BY(handlerMutex);

}  // namespace

FaultHandler setFaultHandler(FaultHandler handler) {
  MutexLock lock(handlerMutex);
  return std::exchange(currentHandler, std::move(handler));
}

void reportFault(std::string_view text) {
  FaultHandler handler;
  {
    MutexLock lock(handlerMutex);
    handler = currentHandler;
  }
  if (handler) {
    handler(text);
    return;
  }
  std::fprintf(stderr, "fault: %.*s\n", static_cast<int>(text.size()), text.data());
#ifndef NDEBUG
  std::abort();
#endif
}

}  // namespace skein
