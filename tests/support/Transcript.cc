#include "tests/support/Transcript.h"

#include <gtest/gtest.h>

namespace skein {
namespace {

std::string_view tagOf(LogType type) {
  switch (type) {
    case LogType::Default: return "[NOTICE] ";
    case LogType::Info: return "[INFO] ";
    case LogType::Debug: return "[DEBUG] ";
    case LogType::Fault: return "[CRIT] ";
    case LogType::Error: return "[ERROR] ";
  }
  return "[?] ";
}

}  // namespace

void LogCapture::write(LogType type, std::string_view line) {
  EXPECT_TRUE(line.starts_with(tagOf(type))) << line;
  _transcript.add(_mark + std::string(line));
}

}  // namespace skein
