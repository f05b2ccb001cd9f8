#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

#include "base/Mutex.h"
#include "linux/protocol/FileDescriptor.h"
#include "platform/foundation/NSError.h"
#include "platform/log/Log.h"

namespace skein {

// A log that is one file: a line per event, written with one system call, so that lines
// of several threads, and of a predecessor that is just ending, never mix. A line is
//
//   2026-11-24T21:20:11.123456Z NOTICE 4711/4713 the text
//
// with the moment in UTC, the level, process and thread. Bytes of the text that a
// terminal would take for commands, line ends too, stand escaped (\n, \x1b).
class LogFile final : public Log {
 public:
  struct Options {
    std::string path;
    // Every line is written to standard error too.
    bool copyToStandardError = false;
    // From this size on the file is renamed to `path`.1, replacing the one before.
    std::uint64_t rotateAt = 16U << 20;
  };

  // Opens or makes the file (mode 0600). Null with an error that names it.
  static std::shared_ptr<LogFile> open(Options options, NSErrorOut error);

  // Any thread. A line that cannot be written (a full disk) is lost: there is nowhere
  // to report it.
  void write(LogType type, std::string_view line) override SKEIN_EXCLUDES(_mutex);

  // Sends the faults of base/Fault.h here, as lines of level CRIT, from now on. `log`
  // is kept alive by that.
  static void takeFaults(std::shared_ptr<LogFile> log);

 private:
  LogFile(Options options, FileDescriptor file, std::uint64_t size);
  void rotate() SKEIN_REQUIRES(_mutex);

  const Options _options;
  Mutex _mutex;
  FileDescriptor _file SKEIN_GUARDED_BY(_mutex);
  std::uint64_t _size SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein
