#pragma once

#include <string>
#include <utility>
#include <vector>

#include "base/Mutex.h"
#include "platform/log/Log.h"

namespace skein {

using Lines = std::vector<std::string>;

// What happened, in one ordered list: calls to the framework, log lines, answers. Tests
// compare whole transcripts where order and exact text matter. Any thread.
class Transcript {
 public:
  void add(std::string line) SKEIN_EXCLUDES(_mutex) {
    MutexLock lock(_mutex);
    _lines.push_back(std::move(line));
  }
  // Everything since the last take().
  Lines take() SKEIN_EXCLUDES(_mutex) {
    MutexLock lock(_mutex);
    return std::exchange(_lines, {});
  }
  // The same without the log's lines.
  Lines takeCalls() {
    Lines lines = take();
    std::erase_if(lines, [](const std::string& line) { return line.starts_with("["); });
    return lines;
  }

 private:
  Mutex _mutex;
  Lines _lines SKEIN_GUARDED_BY(_mutex);
};

// The log, into a transcript. Every level is on at first; a line whose tag is not its
// level's fails the test.
class LogCapture final : public Log {
 public:
  // `mark` stands before each line in the transcript.
  explicit LogCapture(Transcript& transcript, std::string mark = "")
      : _transcript(transcript), _mark(std::move(mark)) {
    setEnabled(LogType::Debug, true);
  }
  void write(LogType type, std::string_view line) override;

 private:
  Transcript& _transcript;
  const std::string _mark;
};

}  // namespace skein
