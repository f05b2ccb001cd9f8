#pragma once

#include <functional>
#include <string>

#include "platform/foundation/NSError.h"

// Signals that end a command: Ctrl-C, a polite kill, and a closed terminal unless whoever started
// the command has it ignore that (nohup).
//
// A command that asks ends at once, with exit code 128 + signal. One that changes items notes
// the first signal, has skein-host cancel what is under way, and says what was done and what
// was not; the second signal ends it at once. What a command that ends began in skein-host is
// cancelled with its connection. Any thread unless said otherwise.
namespace skein::cli {

// On the main thread, before any other thread begins.
void installInterruption();

// While one lives, signals are noted as said above.
class NotedInterruption {
 public:
  NotedInterruption();
  ~NotedInterruption();
  NotedInterruption(const NotedInterruption&) = delete;
  NotedInterruption& operator=(const NotedInterruption&) = delete;
};

// The signal that was noted; 0 while there was none.
int interruption();
// NSUserCancelledError, in words about the command.
NSErrorPtr interruptedError();

// Calls `then` once when a signal is noted, on a thread of its own; at once when one was. It
// returns soon, and may still run when this has gone. One at a time.
class OnInterruption {
 public:
  explicit OnInterruption(std::function<void()> then);
  ~OnInterruption();
  OnInterruption(const OnInterruption&) = delete;
  OnInterruption& operator=(const OnInterruption&) = delete;
};

// Waits until standard input has something to read, or has ended; false when a signal is noted
// before.
bool waitForInput();

// Whether the terminal's last line is still open; it is ended before the command is.
void setLineIsOpen(bool isOpen);

// A file alone in a folder of its own, both removed when a signal ends the command. One at a
// time. forgetTemporaryFile() when it is gone.
void rememberTemporaryFile(const std::string& folder, const std::string& file);
void forgetTemporaryFile();

}  // namespace skein::cli
