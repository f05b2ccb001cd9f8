#include "linux/protocol/LogFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <utility>

#include "base/Fault.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

int openAppending(const std::string& path) {
  return ::open(path.c_str(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600);
}

const char* levelName(LogType type) {
  switch (type) {
    case LogType::Default: return "NOTICE";
    case LogType::Info: return "INFO";
    case LogType::Debug: return "DEBUG";
    case LogType::Fault: return "CRIT";
    case LogType::Error: return "ERROR";
  }
  return "NOTICE";
}

void appendEscaped(std::string& line, std::string_view text) {
  for (const char c : text) {
    const auto byte = static_cast<unsigned char>(c);
    if (c == '\n') {
      line += "\\n";
    } else if ((byte < 0x20 && c != '\t') || byte == 0x7f) {
      char escaped[5];
      std::snprintf(escaped, sizeof escaped, "\\x%02x", byte);
      line += escaped;
    } else {
      line += c;
    }
  }
}

std::string lineFor(LogType type, std::string_view text) {
  thread_local const auto thread = static_cast<long>(syscall(SYS_gettid));
  timespec now{};
  clock_gettime(CLOCK_REALTIME, &now);
  tm date{};
  gmtime_r(&now.tv_sec, &date);
  char head[96];
  const int length = std::snprintf(
      head, sizeof head, "%04d-%02d-%02dT%02d:%02d:%02d.%06ldZ %s %ld/%ld ", date.tm_year + 1900,
      date.tm_mon + 1, date.tm_mday, date.tm_hour, date.tm_min, date.tm_sec, now.tv_nsec / 1000,
      levelName(type), static_cast<long>(getpid()), thread);
  std::string line(head, static_cast<std::size_t>(length));
  line.reserve(line.size() + text.size() + 1);
  appendEscaped(line, text);
  line += '\n';
  return line;
}

}  // namespace

std::shared_ptr<LogFile> LogFile::open(Options options, NSErrorOut error) {
  FileDescriptor file(openAppending(options.path));
  struct stat status {};
  if (!file || fstat(file.get(), &status) != 0) {
    const int code = errno;
    error.store(vl_errorWithPOSIXCode(
        code, "The log " + options.path + " cannot be opened: " + std::strerror(code) + "."));
    return nullptr;
  }
  return std::shared_ptr<LogFile>(
      new LogFile(std::move(options), std::move(file), static_cast<std::uint64_t>(status.st_size)));
}

LogFile::LogFile(Options options, FileDescriptor file, std::uint64_t size)
    : _options(std::move(options)), _file(std::move(file)), _size(size) {}

void LogFile::write(LogType type, std::string_view text) {
  const std::string line = lineFor(type, text);
  MutexLock lock(_mutex);
  if (_size > 0 && _size + line.size() > _options.rotateAt) rotate();
  const ssize_t written = ::write(_file.get(), line.data(), line.size());
  if (written > 0) _size += static_cast<std::uint64_t>(written);
  if (_options.copyToStandardError) {
    // Whether anybody reads standard error is not this log's business.
    [[maybe_unused]] const ssize_t copied = ::write(STDERR_FILENO, line.data(), line.size());
  }
}

void LogFile::rotate() {
  // When the new file cannot be made, the old one goes on growing: better than no log.
  if (std::rename(_options.path.c_str(), (_options.path + ".1").c_str()) != 0) return;
  FileDescriptor fresh(openAppending(_options.path));
  if (!fresh) return;
  _file = std::move(fresh);
  _size = 0;
}

void LogFile::takeFaults(std::shared_ptr<LogFile> log) {
  setFaultHandler([log = std::move(log)](std::string_view text) {
    log->write(LogType::Fault, "[CRIT] " + std::string(text));
  });
  reportUncaughtExceptions();
}

}  // namespace skein
