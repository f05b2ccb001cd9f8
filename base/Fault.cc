#include "base/Fault.h"

#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <string>
#include <utility>

#include "base/Mutex.h"

namespace skein {
namespace {

Mutex handlerMutex;
FaultHandler currentHandler SKEIN_GUARDED_BY(handlerMutex);

[[noreturn]] void reportAndEnd() {
  static std::atomic_flag isReporting = ATOMIC_FLAG_INIT;
  if (isReporting.test_and_set()) std::abort();  // the report itself ended so
  std::string cause = "the process ends: std::terminate()";
  if (const std::exception_ptr exception = std::current_exception()) {
    try {
      std::rethrow_exception(exception);
    } catch (const std::exception& error) {
      cause = std::string("the process ends at an exception that nobody caught: ") + error.what();
    } catch (...) {
      cause = "the process ends at an exception of an unknown kind";
    }
  }
  reportFault(cause);
  std::abort();
}

}  // namespace

void reportUncaughtExceptions() { std::set_terminate(reportAndEnd); }

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
