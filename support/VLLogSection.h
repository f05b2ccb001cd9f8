// Log sections: the numbered scopes that pick one request's lines out of the log.
#pragma once

#include <cstdint>
#include <memory>
#include <utility>

#include "base/SerialQueue.h"
#include "platform/log/Log.h"

namespace skein {

// The level of a section, which the parity of its number carries: odd is debug, even
// is info. 0 is no section.
enum class VLLogSectionLevel : std::uint8_t { Debug = 0, Info = 1 };

// Hands out section numbers: strictly increasing in a process, never twice. Any thread.
class VLLogSections {
 public:
  explicit VLLogSections(std::shared_ptr<Executor> executor)
      : _queue("create-log-section", std::move(executor)) {}

  // The next number of the level's parity; one of the wrong parity is skipped for good.
  // Numbers are drawn whether or not anything is logged.
  std::uint64_t create(VLLogSectionLevel level);

 private:
  SerialQueue _queue;
  std::uint64_t _last = 0;  // only on _queue
};

// Logs the section's closing line, when its level is enabled. 0 logs nothing.
void vlc_closeLogSection(Log& log, std::uint64_t section);

// One open section: closes when it goes out of scope. Moved into a completion, it
// closes when that is done.
class VLLogSection {
 public:
  VLLogSection(Log& log, VLLogSections& sections,
               VLLogSectionLevel level = VLLogSectionLevel::Debug)
      : _log(&log), _number(sections.create(level)) {}
  ~VLLogSection() { close(); }
  VLLogSection(VLLogSection&& other) noexcept
      : _log(other._log), _number(std::exchange(other._number, 0)) {}
  VLLogSection& operator=(VLLogSection&&) = delete;

  std::uint64_t number() const { return _number; }

  // Closes it now; closing again does nothing.
  void close() { vlc_closeLogSection(*_log, std::exchange(_number, 0)); }

 private:
  Log* _log;
  std::uint64_t _number;
};

}  // namespace skein
