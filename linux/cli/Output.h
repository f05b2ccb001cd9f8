#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/foundation/NSDate.h"
#include "platform/foundation/NSError.h"

namespace skein::cli {

// Standard output, for people on a terminal and for programs off it. Bytes that a terminal
// would take for commands, line ends too, are escaped on a terminal alone: off it every
// name is written as it is. Gathers lines; a failed write (a reader that has gone) ends the
// program quietly.
class Output {
 public:
  Output();
  ~Output() { flush(); }
  Output(const Output&) = delete;
  Output& operator=(const Output&) = delete;

  bool isTerminal() const { return _isTerminal; }
  // On a terminal, unless NO_COLOR says no.
  bool hasColours() const { return _hasColours; }

  void write(std::string_view text);
  // A name or path, as said above; `folder` ones are coloured.
  void writeName(std::string_view name, bool folder = false);
  // A line of its own: what the value is, and the value.
  void writeField(std::string_view name, std::string_view value);
  void flush();

 private:
  const bool _isTerminal;
  const bool _hasColours;
  std::string _buffer;
};

// For terminals: control characters and bytes that are no UTF-8 as \n, \t, \\ or \xHH.
std::string escaped(std::string_view text);
bool isUTF8(std::string_view text);

// A JSON string. What is not UTF-8 is replaced by U+FFFD; then jsonBytes() has it whole.
std::string jsonString(std::string_view text);
// `,"KEYBytes":"base64"` when `text` is no UTF-8; else nothing.
std::string jsonBytes(std::string_view key, std::string_view text);
std::string base64(std::string_view bytes);

// Hexadecimal digits and back.
std::string hexadecimal(std::string_view bytes);
std::optional<std::string> bytesOfHexadecimal(std::string_view digits);

// "2026-11-24 22:05" in local time, for people; and with everything in UTC, for programs.
std::string localDate(const std::optional<NSDate>& date);
std::string isoDate(NSDate date);

// "skein: TEXT" on standard error, escaped.
void complain(const std::string& text);
// complain() about an error, and its exit code.
int complainAbout(const NSErrorPtr& error);

}  // namespace skein::cli
