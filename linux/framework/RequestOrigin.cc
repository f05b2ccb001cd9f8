#include "linux/framework/RequestOrigin.h"

#include <utility>

namespace skein {
namespace {

RequestOrigin& originOfThread() {
  thread_local RequestOrigin origin;
  return origin;
}

}  // namespace

RequestOriginScope::RequestOriginScope(RequestOrigin origin)
    : _outer(std::exchange(originOfThread(), std::move(origin))) {}

RequestOriginScope::~RequestOriginScope() { originOfThread() = _outer; }

RequestOrigin RequestOriginScope::current() { return originOfThread(); }

}  // namespace skein
