#pragma once

#include <optional>
#include <string>
#include <vector>

#include "platform/log/Log.h"

namespace skein::vald {

// What `vald --help` documents.
inline constexpr int kExitFailure = 1;
inline constexpr int kExitUsage = 2;

enum class LogLevel : std::uint8_t { Notice, Info, Debug };

struct CommandLine {
  bool help = false;
  bool foreground = false;
  std::string store;
  LogLevel logLevel = LogLevel::Info;
};

// Reads the arguments, without the program's name. nil with `problem` (one line) when they
// make no sense. `store` and `logLevel` start from the environment (SKEIN_STORE,
// SKEIN_LOG), whose values are ignored when they are unknown.
std::optional<CommandLine> parseCommandLine(const std::vector<std::string>& arguments,
                                            std::string& problem);

const char* helpText();

void setLogLevel(Log& log, LogLevel level);

}  // namespace skein::vald
