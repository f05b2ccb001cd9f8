#pragma once

#include <chrono>

namespace skein {

// A moment, in nanoseconds since 1970 (UTC).
using NSDate = std::chrono::sys_time<std::chrono::nanoseconds>;

// Later than any moment the system meets; compares equal after crossing a process.
constexpr NSDate NSDateDistantFuture() { return NSDate::max(); }

}  // namespace skein
