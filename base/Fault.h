// Faults are broken promises of this code itself: a completion called twice or
// never, a queue that waits for itself. They are reported and execution goes on;
// a debug build stops at them.
#pragma once

#include <functional>
#include <string_view>

namespace skein {

using FaultHandler = std::function<void(std::string_view text)>;

// Replaces where faults go (standard error at first) and returns the previous
// handler. Called once by main, and by tests that expect a fault. Any thread.
FaultHandler setFaultHandler(FaultHandler handler);

// From now on the process does not end without a word at an exception that nobody caught: its
// text goes to the fault handler first. For main, once.
void reportUncaughtExceptions();

// Reports a fault on the calling thread. Aborts in a debug build unless a handler
// was set.
void reportFault(std::string_view text);

}  // namespace skein
