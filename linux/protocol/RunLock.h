#pragma once

#include <chrono>
#include <optional>
#include <string>

#include "linux/protocol/FileDescriptor.h"
#include "platform/foundation/NSError.h"

namespace skein {

// Held by the one vald, or the one skein-host, of a drive from before it listens until it has
// ended; the kernel lets go of it with the process, however that ends. A child that is forked holds
// it too.
class RunLock {
 public:
  enum class Outcome : std::uint8_t { Taken, AlreadyRunning, Failed };

  // Takes the lock of the file at `path`, and writes the process's number there for people.
  // Who holds it may be on its way out, or in: as long as nobody accepts on `socketPath`
  // this waits until `patience` is over, and half a second when somebody does.
  Outcome take(const std::string& path, const std::string& socketPath,
               std::chrono::milliseconds patience, NSErrorOut error);

  // Writes the number of the process that goes on with the lock.
  void writeProcessID() const;

 private:
  FileDescriptor _file;
};

}  // namespace skein
