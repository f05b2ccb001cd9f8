// skein stop
#include <poll.h>
#include <sys/socket.h>
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
#include "linux/protocol/FileDescriptor.h"
#include "linux/protocol/UnixSocket.h"

namespace skein::cli {
namespace {

using namespace std::chrono_literals;
using Clock = std::chrono::steady_clock;

constexpr auto kDeadline = 4500ms;

// The process that listens on the socket, held so that its number cannot become another's.
struct Listener {
  pid_t pid = 0;
  FileDescriptor handle;
};

// The kernel tells who listens, whether or not that process is able to answer.
std::optional<Listener> listenerOn(const std::string& socketPath) {
  int code = 0;
  const FileDescriptor socket = connectToUnixSocket(socketPath, code);
  if (!socket) return std::nullopt;
  ucred peer{};
  socklen_t length = sizeof peer;
  if (getsockopt(socket.get(), SOL_SOCKET, SO_PEERCRED, &peer, &length) != 0) return std::nullopt;
  Listener listener{peer.pid,
                    FileDescriptor(static_cast<int>(syscall(SYS_pidfd_open, peer.pid, 0)))};
  if (!listener.handle) return std::nullopt;
  return listener;
}

bool hasEnded(const Listener& listener, Clock::time_point deadline) {
  for (;;) {
    const auto left =
        std::chrono::duration_cast<std::chrono::milliseconds>(deadline - Clock::now());
    pollfd ended{listener.handle.get(), POLLIN, 0};
    const int count = poll(&ended, 1, static_cast<int>(std::max(left, 0ms).count()));
    if (count > 0) return true;
    if (count == 0 || errno != EINTR) return false;
  }
}

// skein-host first: it would start vald again.
int runStop(const Invocation& invocation) {
  NSErrorPtr error;
  const DrivePaths paths = invocation.drive.paths(&error);
  if (paths.store.empty()) return complainAbout(error);
  struct Program {
    const char* name;
    const std::string& socket;
  };
  const std::array<Program, 2> programs{
      {{"skein-host", paths.hostSocket}, {"vald", paths.daemonSocket}}};
  const Clock::time_point deadline = Clock::now() + kDeadline;
  Output output;
  bool any = false;
  for (const Program& program : programs) {
    const auto listener = listenerOn(program.socket);
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
  if (!any) output.write("nothing was running\n");
  return kSuccess;
}

}  // namespace

void addProcessCommands(CLI::App& app, Invocation& invocation) {
  auto* stop =
      app.add_subcommand("stop", "End the drive's processes, and wait until they are gone");
  stop->footer("Example: skein stop");
  stop->callback([&invocation] { invocation.run = [&invocation] { return runStop(invocation); }; });
}

}  // namespace skein::cli
