#include "linux/cli/Output.h"

#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>

#include "linux/cli/ExitCodes.h"

namespace skein::cli {
namespace {

constexpr std::size_t kFlushAt = std::size_t{64} * 1024;

// The length of the UTF-8 sequence at the head of `text`; 0 when there is none.
std::size_t sequenceLength(std::string_view text) {
  const auto byte = [&](std::size_t i) { return static_cast<unsigned char>(text[i]); };
  const unsigned char first = byte(0);
  if (first < 0x80) return 1;
  std::size_t length = 0;
  std::uint32_t lowest = 0;
  std::uint32_t code = 0;
  if ((first & 0xe0) == 0xc0) {
    length = 2, lowest = 0x80, code = first & 0x1fU;
  } else if ((first & 0xf0) == 0xe0) {
    length = 3, lowest = 0x800, code = first & 0x0fU;
  } else if ((first & 0xf8) == 0xf0) {
    length = 4, lowest = 0x10000, code = first & 0x07U;
  }
  if (length == 0 || text.size() < length) return 0;
  for (std::size_t i = 1; i < length; ++i) {
    if ((byte(i) & 0xc0) != 0x80) return 0;
    code = (code << 6) | (byte(i) & 0x3fU);
  }
  if (code < lowest || code > 0x10ffff || (code >= 0xd800 && code < 0xe000)) return 0;
  return length;
}

// C1 controls, and the marks that turn the direction of what follows.
bool isInvisible(std::string_view sequence) {
  if (sequence.size() == 2 && sequence[0] == '\xc2') {
    return static_cast<unsigned char>(sequence[1]) < 0xa0;
  }
  if (sequence.size() != 3 || sequence[0] != '\xe2') return false;
  const auto second = static_cast<unsigned char>(sequence[1]);
  const auto third = static_cast<unsigned char>(sequence[2]);
  return (second == 0x80 &&
          ((third >= 0x8e && third <= 0x8f) || (third >= 0xa8 && third <= 0xae))) ||
         (second == 0x81 && third >= 0xa6 && third <= 0xa9);
}

void appendHex(std::string& text, unsigned char byte) {
  constexpr char kDigits[] = "0123456789abcdef";
  text += kDigits[byte >> 4];
  text += kDigits[byte & 15];
}

bool coloursWanted() {
  const char* no = std::getenv("NO_COLOR");
  const char* terminal = std::getenv("TERM");
  return isatty(STDOUT_FILENO) == 1 && (no == nullptr || *no == '\0') &&
         (terminal == nullptr || std::strcmp(terminal, "dumb") != 0);
}

std::tm local(NSDate date, bool utc) {
  const std::time_t seconds =
      std::chrono::floor<std::chrono::seconds>(date).time_since_epoch().count();
  std::tm parts{};
  if (utc) {
    gmtime_r(&seconds, &parts);
  } else {
    localtime_r(&seconds, &parts);
  }
  return parts;
}

}  // namespace

Output::Output() : _isTerminal(isatty(STDOUT_FILENO) == 1), _hasColours(coloursWanted()) {}

void Output::write(std::string_view text) {
  _buffer += text;
  if (_buffer.size() >= kFlushAt) flush();
}

void Output::writeName(std::string_view name, bool folder) {
  if (!_isTerminal) {
    write(name);
    return;
  }
  if (folder && _hasColours) write("\x1b[1;34m");
  write(escaped(name));
  if (folder && _hasColours) write("\x1b[0m");
}

void Output::writeField(std::string_view name, std::string_view value) {
  constexpr std::size_t kLabel = 12;
  std::string label(name);
  label.resize(std::max(label.size() + 1, kLabel), ' ');
  write(label);
  writeName(value);
  write("\n");
}

void Output::flush() {
  std::string_view rest = _buffer;
  while (!rest.empty()) {
    const ssize_t written = ::write(STDOUT_FILENO, rest.data(), rest.size());
    if (written < 0 && errno == EINTR) continue;
    if (written < 0) {
      // Whoever read this has seen enough; a full disk, in contrast, is worth a word.
      if (errno != EPIPE)
        complain(std::string("the output cannot be written: ") + std::strerror(errno));
      std::_Exit(errno == EPIPE ? kSuccess : kFailure);
    }
    rest.remove_prefix(static_cast<std::size_t>(written));
  }
  _buffer.clear();
}

std::string escaped(std::string_view text) {
  std::string result;
  result.reserve(text.size());
  while (!text.empty()) {
    const std::size_t length = sequenceLength(text);
    const auto byte = static_cast<unsigned char>(text[0]);
    if (byte == '\n') {
      result += "\\n";
    } else if (byte == '\t') {
      result += "\\t";
    } else if (byte == '\\') {
      result += "\\\\";
    } else if (length == 0 || byte < 0x20 || byte == 0x7f || isInvisible(text.substr(0, length))) {
      for (std::size_t i = 0; i < std::max<std::size_t>(length, 1); ++i) {
        result += "\\x";
        appendHex(result, static_cast<unsigned char>(text[i]));
      }
    } else {
      result += text.substr(0, length);
    }
    text.remove_prefix(std::max<std::size_t>(length, 1));
  }
  return result;
}

bool isUTF8(std::string_view text) {
  while (!text.empty()) {
    const std::size_t length = sequenceLength(text);
    if (length == 0) return false;
    text.remove_prefix(length);
  }
  return true;
}

std::string jsonString(std::string_view text) {
  std::string result = "\"";
  while (!text.empty()) {
    const std::size_t length = sequenceLength(text);
    const auto byte = static_cast<unsigned char>(text[0]);
    if (length == 0) {
      result += "\xef\xbf\xbd";
    } else if (byte == '"' || byte == '\\') {
      result += '\\';
      result += text[0];
    } else if (byte < 0x20 || byte == 0x7f) {
      result += "\\u00";
      appendHex(result, byte);
    } else {
      result += text.substr(0, length);
    }
    text.remove_prefix(std::max<std::size_t>(length, 1));
  }
  return result + '"';
}

std::string jsonBytes(std::string_view key, std::string_view text) {
  if (isUTF8(text)) return {};
  return ",\"" + std::string(key) + "Bytes\":\"" + base64(text) + '"';
}

std::string base64(std::string_view bytes) {
  constexpr char kAlphabet[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
  std::string result;
  for (std::size_t i = 0; i < bytes.size(); i += 3) {
    std::uint32_t group = 0;
    const std::size_t present = std::min<std::size_t>(3, bytes.size() - i);
    for (std::size_t j = 0; j < 3; ++j) {
      group = (group << 8) | (j < present ? static_cast<unsigned char>(bytes[i + j]) : 0U);
    }
    for (std::size_t j = 0; j < 4; ++j) {
      result += j <= present ? kAlphabet[(group >> (18 - 6 * j)) & 63] : '=';
    }
  }
  return result;
}

std::string hexadecimal(std::string_view bytes) {
  std::string result;
  for (const char c : bytes) appendHex(result, static_cast<unsigned char>(c));
  return result;
}

std::optional<std::string> bytesOfHexadecimal(std::string_view digits) {
  if (digits.size() % 2 != 0) return std::nullopt;
  const auto value = [](char c) {
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    return -1;
  };
  std::string bytes;
  for (std::size_t i = 0; i < digits.size(); i += 2) {
    const int high = value(digits[i]);
    const int low = value(digits[i + 1]);
    if (high < 0 || low < 0) return std::nullopt;
    bytes += static_cast<char>(high * 16 + low);
  }
  return bytes;
}

std::string localDate(const std::optional<NSDate>& date) {
  if (!date) return "-";
  const std::tm parts = local(*date, false);
  std::array<char, 32> text{};
  std::strftime(text.data(), text.size(), "%Y-%m-%d %H:%M", &parts);
  return text.data();
}

std::string isoDate(NSDate date) {
  const std::tm parts = local(date, true);
  const auto seconds = std::chrono::floor<std::chrono::seconds>(date);
  std::array<char, 32> head{};
  std::strftime(head.data(), head.size(), "%Y-%m-%dT%H:%M:%S", &parts);
  std::array<char, 64> text{};
  std::snprintf(text.data(), text.size(), "%s.%09lldZ", head.data(),
                static_cast<long long>((date - seconds).count()));
  return text.data();
}

void complain(const std::string& text) {
  // A log is shown on terminals, too.
  const std::string line = "skein: " + escaped(text) + '\n';
  [[maybe_unused]] const ssize_t written = ::write(STDERR_FILENO, line.data(), line.size());
}

int complainAbout(const NSErrorPtr& error) {
  complain(textFor(error));
  return exitCodeFor(error);
}

}  // namespace skein::cli
