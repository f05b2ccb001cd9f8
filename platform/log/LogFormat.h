// Log lines with the platform's conversions: %@ (any object, nil prints as "(null)"),
// %s %d %ld %lld %lu %llu %llx %.2f. A format that does not fit its arguments does
// not compile.
#pragma once

#include <concepts>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <type_traits>

#include "platform/log/Description.h"

namespace skein {

enum class LogConversion { None, Object, String, Signed, Unsigned, Hex, Double };

// The conversion at the head of `text` (which begins with '%') and its length; None
// for anything that this log does not know.
struct LogConversionAt {
  LogConversion conversion;
  std::size_t length;
};
constexpr LogConversionAt logConversionAt(std::string_view text) {
  constexpr struct {
    std::string_view text;
    LogConversion conversion;
  } kKnown[] = {
      {"%@", LogConversion::Object},     {"%s", LogConversion::String},
      {"%d", LogConversion::Signed},     {"%ld", LogConversion::Signed},
      {"%lld", LogConversion::Signed},   {"%lu", LogConversion::Unsigned},
      {"%llu", LogConversion::Unsigned}, {"%llx", LogConversion::Hex},
      {"%.2f", LogConversion::Double},
  };
  for (const auto& known : kKnown) {
    if (text.starts_with(known.text)) return {known.conversion, known.text.size()};
  }
  return {LogConversion::None, 0};
}

template <class T>
constexpr bool logConversionFits(LogConversion conversion) {
  using Plain = std::remove_cvref_t<T>;
  switch (conversion) {
    case LogConversion::Object: return !std::is_arithmetic_v<Plain>;
    case LogConversion::String: return std::convertible_to<Plain, std::string_view>;
    case LogConversion::Signed: return std::signed_integral<Plain>;
    case LogConversion::Unsigned:
    case LogConversion::Hex: return std::unsigned_integral<Plain>;
    case LogConversion::Double: return std::same_as<Plain, double>;
    case LogConversion::None: return false;
  }
  return false;
}

// Not constexpr on purpose: reaching it while a format is checked fails to compile.
void logFormatDoesNotFitItsArguments();

template <class... Args>
class BasicLogFormat {
 public:
  consteval BasicLogFormat(const char* format) : _format(format) {
    std::string_view rest = _format;
    (check<Args>(rest), ...);
    if (rest.find('%') != std::string_view::npos) logFormatDoesNotFitItsArguments();
  }
  constexpr std::string_view text() const { return _format; }

 private:
  template <class T>
  static constexpr void check(std::string_view& rest) {
    const std::size_t start = rest.find('%');
    if (start == std::string_view::npos) {
      logFormatDoesNotFitItsArguments();
      return;
    }
    const auto [conversion, length] = logConversionAt(rest.substr(start));
    if (!logConversionFits<T>(conversion)) logFormatDoesNotFitItsArguments();
    rest = rest.substr(start + length);
  }

  std::string_view _format;
};
template <class... Args>
using LogFormat = BasicLogFormat<std::type_identity_t<Args>...>;

// One argument, type-erased: a rendered object or string, or a number.
struct LogArgument {
  std::string text;
  std::uint64_t bits = 0;
  double real = 0;
};

std::string renderLog(std::string_view format, std::span<const LogArgument> arguments);

template <class T>
LogArgument logArgument(const T& value) {
  if constexpr (std::is_floating_point_v<T>) {
    return {{}, 0, value};
  } else if constexpr (std::is_integral_v<T>) {
    return {{}, static_cast<std::uint64_t>(value), 0};
  } else {
    return {description(value), 0, 0};
  }
}

template <class... Args>
std::string formatLog(LogFormat<Args...> format, const Args&... args) {
  const LogArgument arguments[] = {logArgument(args)..., LogArgument{}};
  return renderLog(format.text(), std::span(arguments, sizeof...(args)));
}

}  // namespace skein
