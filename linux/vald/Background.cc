#include "linux/vald/Background.h"

#include <fcntl.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <string_view>

#include "linux/protocol/StandardDescriptors.h"
#include "linux/vald/CommandLine.h"

namespace skein::vald {
namespace {

// What the new process reports; anything else is the message of a failure.
constexpr std::string_view kReady("\0", 1);

void writeAll(int descriptor, std::string_view text) {
  while (!text.empty()) {
    const ssize_t written = write(descriptor, text.data(), text.size());
    if (written < 0 && errno == EINTR) continue;
    if (written <= 0) return;  // the first process is gone: nobody waits for the report
    text.remove_prefix(static_cast<std::size_t>(written));
  }
}

[[noreturn]] void waitForReport(int descriptor, const std::string& log) {
  std::string report;
  std::array<char, 1024> buffer{};
  for (;;) {
    const ssize_t count = read(descriptor, buffer.data(), buffer.size());
    if (count < 0 && errno == EINTR) continue;
    if (count <= 0) break;
    report.append(buffer.data(), static_cast<std::size_t>(count));
    if (report == kReady) _exit(EXIT_SUCCESS);
  }
  if (report.empty()) report = "it ended while it started; see " + log;
  std::fprintf(stderr, "vald: %s\n", report.c_str());
  std::fflush(stderr);
  _exit(kExitFailure);
}

[[noreturn]] void cannotEnter() {
  std::perror("vald: it cannot go to the background, try --foreground");
  std::exit(kExitFailure);
}

}  // namespace

Background Background::enter(const std::string& log) {
  std::array<int, 2> ends{};
  if (pipe2(ends.data(), O_CLOEXEC) != 0) cannotEnter();
  FileDescriptor reading(ends[0]);
  FileDescriptor writing(ends[1]);
  const pid_t child = fork();
  if (child < 0) cannotEnter();
  if (child > 0) {
    writing.reset();
    waitForReport(reading.get(), log);
  }

  setsid();
  if (chdir("/") != 0) cannotEnter();
  releaseStandardDescriptors();
  return Background(std::move(writing));
}

void Background::isReady() {
  if (!_entered) return;
  writeAll(_report.get(), kReady);
  _report.reset();
}

void Background::failed(const std::string& message) {
  if (_entered) {
    writeAll(_report.get(), message);
    _report.reset();
  } else {
    std::fprintf(stderr, "vald: %s\n", message.c_str());
  }
}

}  // namespace skein::vald
