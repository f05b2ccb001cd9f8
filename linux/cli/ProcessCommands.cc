// skein stop
#include <poll.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstring>
#include <optional>

#include "linux/cli/Commands.h"
#include "linux/cli/ExitCodes.h"
#include "linux/protocol/UnixSocket.h"

namespace skein::cli {
namespace {

using namespace std::chrono_literals;
using Clock = std::chrono::steady_clock;

constexpr auto kDeadline = 4500ms;

struct Program {
  const char* name;
  std::string socket;
};

bool hasEnded(const SocketListener& listener, Clock::time_point deadline) {
  for (;;) {
    const auto left =
        std::chrono::duration_cast<std::chrono::milliseconds>(deadline - Clock::now());
    pollfd ended{listener.handle.get(), POLLIN, 0};
    const int count = poll(&ended, 1, static_cast<int>(std::max(left, 0ms).count()));
    if (count > 0) return true;
    if (count == 0 || errno != EINTR) return false;
  }
}

}  // namespace

// skein-host first: it would start vald again.
int stopProcesses(const DrivePaths& paths, Output& output, bool& any) {
  any = false;
  const std::array<Program, 2> programs{
      {{"skein-host", paths.hostSocket}, {"vald", paths.daemonSocket}}};
  const Clock::time_point deadline = Clock::now() + kDeadline;
  for (const Program& program : programs) {
    const auto listener = listenerOnUnixSocket(program.socket);
    if (!listener) continue;
    any = true;
    const std::string what =
        std::string(program.name) + " (process " + std::to_string(listener->pid) + ')';
    if (syscall(SYS_pidfd_send_signal, listener->handle.get(), SIGTERM, nullptr, 0) != 0 &&
        errno != ESRCH) {
      complain(what + " cannot be told to end: " + std::strerror(errno) + "; end it by hand");
      return kFailure;
    }
    if (!hasEnded(*listener, deadline)) {
      output.flush();
      complain(what +
               " was told to end, but has not; it may be stopped: let it go on with kill "
               "-CONT " +
               std::to_string(listener->pid) + ", or end it with kill -KILL " +
               std::to_string(listener->pid));
      return kUnreachable;
    }
    output.write("stopped " + what + "\n");
  }
  return kSuccess;
}

namespace {

int runStop(const Invocation& invocation) {
  NSErrorPtr error;
  const DrivePaths paths = invocation.drive.known(&error);
  if (paths.store.empty()) return complainAbout(error);
  Output output;
  bool any = false;
  const int code = stopProcesses(paths, output, any);
  if (code == kSuccess && !any) output.write("nothing was running\n");
  return code;
}

}  // namespace

void addProcessCommands(CLI::App& app, Invocation& invocation) {
  auto* stop =
      app.add_subcommand("stop", "End the drive's processes, and wait until they are gone");
  stop->footer("Example: skein stop");
  stop->callback([&invocation] { invocation.run = [&invocation] { return runStop(invocation); }; });
}

}  // namespace skein::cli
