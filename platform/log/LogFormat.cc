#include "platform/log/LogFormat.h"

#include <cstdio>

namespace skein {

std::string renderLog(std::string_view format, std::span<const LogArgument> arguments) {
  std::string line;
  line.reserve(format.size() + 64);
  for (const LogArgument& argument : arguments) {
    const std::size_t start = format.find('%');
    line += format.substr(0, start);
    const auto [conversion, length] = logConversionAt(format.substr(start));
    char digits[320];  // the largest double has 309 digits before its point
    switch (conversion) {
      case LogConversion::Signed:
        line += std::to_string(static_cast<std::int64_t>(argument.bits));
        break;
      case LogConversion::Unsigned: line += std::to_string(argument.bits); break;
      case LogConversion::Hex:
        std::snprintf(digits, sizeof digits, "%llx",
                      static_cast<unsigned long long>(argument.bits));
        line += digits;
        break;
      case LogConversion::Double:
        std::snprintf(digits, sizeof digits, "%.2f", argument.real);
        line += digits;
        break;
      case LogConversion::Object:
      case LogConversion::String:
      case LogConversion::None: line += argument.text; break;
    }
    format.remove_prefix(start + length);
  }
  line += format;
  return line;
}

}  // namespace skein
