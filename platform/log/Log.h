// The unified log: one line per event, formatted only when its level is enabled, its
// arguments checked against the format when compiled.
#pragma once

#include <atomic>
#include <cstdint>
#include <string_view>

#include "platform/log/LogFormat.h"

namespace skein {

// The levels, with the values that the log's readers know them by.
enum class LogType : std::uint8_t {
  Default = 0x00,
  Info = 0x01,
  Debug = 0x02,
  Fault = 0x11,
  Error = 0x90,
};

// A handle that lines go to. Any thread; lines of different threads never mix.
class Log {
 public:
  virtual ~Log() = default;

  bool enabled(LogType type) const {
    return (_enabled.load(std::memory_order_relaxed) & bit(type)) != 0;
  }
  void setEnabled(LogType type, bool enabled) {
    if (enabled) {
      _enabled.fetch_or(bit(type), std::memory_order_relaxed);
    } else {
      _enabled.fetch_and(static_cast<std::uint8_t>(~bit(type)), std::memory_order_relaxed);
    }
  }

  // Writes one line, without its line end. Called only for enabled levels.
  virtual void write(LogType type, std::string_view line) = 0;

 private:
  static constexpr std::uint8_t bit(LogType type) {
    switch (type) {
      case LogType::Default: return 1;
      case LogType::Info: return 2;
      case LogType::Debug: return 4;
      case LogType::Fault: return 8;
      case LogType::Error: return 16;
    }
    return 0;
  }

  // Debug is off until somebody asks for it.
  std::atomic<std::uint8_t> _enabled{1 | 2 | 8 | 16};
};

}  // namespace skein

// VL_DEBUG(log, "[DEBUG] ┏%llx asked url for %@", section, identifier): `log` is a
// Log&. The arguments are evaluated only when the level is enabled.
#define SKEIN_LOG(log, type, ...)                            \
  do {                                                       \
    ::skein::Log& skeinLog = (log);                          \
    if (skeinLog.enabled(type)) {                            \
      skeinLog.write(type, ::skein::formatLog(__VA_ARGS__)); \
    }                                                        \
  } while (false)
#define VL_DEBUG(log, ...) SKEIN_LOG(log, ::skein::LogType::Debug, __VA_ARGS__)
#define VL_INFO(log, ...) SKEIN_LOG(log, ::skein::LogType::Info, __VA_ARGS__)
#define VL_NOTICE(log, ...) SKEIN_LOG(log, ::skein::LogType::Default, __VA_ARGS__)
#define VL_ERROR(log, ...) SKEIN_LOG(log, ::skein::LogType::Error, __VA_ARGS__)
#define VL_CRIT(log, ...) SKEIN_LOG(log, ::skein::LogType::Fault, __VA_ARGS__)

// Logs a failed internal assertion; execution continues.
#define VL_ASSERT(log, condition)                                           \
  do {                                                                      \
    if (!(condition)) VL_CRIT(log, "[CRIT] Assertion failed: " #condition); \
  } while (false)
