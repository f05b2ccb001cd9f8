#include "tests/integration/Drive.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <spawn.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <stdexcept>
#include <utility>

#include "linux/protocol/UnixSocket.h"

namespace skein {
namespace {

using SteadyClock = std::chrono::steady_clock;

int millisecondsUntil(SteadyClock::time_point deadline) {
  const auto left =
      std::chrono::duration_cast<std::chrono::milliseconds>(deadline - SteadyClock::now());
  return static_cast<int>(std::max<std::int64_t>(left.count(), 0));
}

std::vector<char*> pointers(const std::string* first, const Arguments& rest) {
  std::vector<char*> result;
  if (first != nullptr) result.push_back(const_cast<char*>(first->c_str()));
  for (const std::string& one : rest) result.push_back(const_cast<char*>(one.c_str()));
  result.push_back(nullptr);
  return result;
}

}  // namespace

Process::Process(const std::string& program, const Arguments& arguments,
                 const Arguments& environment) {
  int out[2];
  int err[2];
  if (pipe2(out, O_CLOEXEC) != 0 || pipe2(err, O_CLOEXEC) != 0) throw std::runtime_error("pipe");
  _output = FileDescriptor(out[0]);
  _errors = FileDescriptor(err[0]);
  const FileDescriptor outEnd(out[1]);
  const FileDescriptor errEnd(err[1]);
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
  posix_spawn_file_actions_adddup2(&actions, outEnd.get(), STDOUT_FILENO);
  posix_spawn_file_actions_adddup2(&actions, errEnd.get(), STDERR_FILENO);
  const int problem =
      posix_spawn(&_pid, program.c_str(), &actions, nullptr, pointers(&program, arguments).data(),
                  pointers(nullptr, environment).data());
  posix_spawn_file_actions_destroy(&actions);
  if (problem != 0) throw std::runtime_error(program + " cannot be started");
}

Process::~Process() {
  if (_pid < 0) return;
  kill(_pid, SIGKILL);
  waitpid(_pid, nullptr, 0);
}

bool Process::readSome(SteadyClock::time_point deadline) {
  while (_output || _errors) {
    pollfd ends[2] = {{_output.get(), POLLIN, 0}, {_errors.get(), POLLIN, 0}};
    const int count = poll(ends, 2, millisecondsUntil(deadline));
    if (count < 0 && errno == EINTR) continue;
    if (count <= 0) return false;
    const auto take = [](const pollfd& end, FileDescriptor& from, std::string& into) {
      if (end.revents == 0) return false;
      char bytes[65536];
      const ssize_t got = read(end.fd, bytes, sizeof bytes);
      if (got > 0) into.append(bytes, static_cast<std::size_t>(got));
      if (got == 0) from.reset();
      return got > 0;
    };
    const bool some = take(ends[0], _output, output);
    if (take(ends[1], _errors, errors) || some) return true;
  }
  return false;
}

std::optional<std::string> Process::readLine(std::chrono::milliseconds deadline) {
  const auto end = SteadyClock::now() + deadline;
  for (;;) {
    if (const auto at = output.find('\n'); at != std::string::npos) {
      std::string line = output.substr(0, at);
      output.erase(0, at + 1);
      return line;
    }
    if (!readSome(end)) return std::nullopt;
  }
}

int Process::finish(std::chrono::milliseconds deadline) {
  const auto end = SteadyClock::now() + deadline;
  while (readSome(end)) {
  }
  const FileDescriptor handle(static_cast<int>(syscall(SYS_pidfd_open, _pid, 0)));
  pollfd ended{handle.get(), POLLIN, 0};
  if (poll(&ended, 1, millisecondsUntil(end)) <= 0) {
    ADD_FAILURE() << "the process did not end; its errors so far: " << errors;
    return -1;
  }
  int status = 0;
  waitpid(std::exchange(_pid, -1), &status, 0);
  return WIFSIGNALED(status) ? 128 + WTERMSIG(status) : WEXITSTATUS(status);
}

std::vector<std::string> Result::lines() const {
  std::vector<std::string> result;
  for (std::size_t at = 0; at < output.size();) {
    const std::size_t end = std::min(output.find('\n', at), output.size());
    result.push_back(output.substr(at, end - at));
    at = end + 1;
  }
  return result;
}

std::vector<std::string> Drive::list(const std::string& path) const {
  const Result result = run({"ls", path});
  EXPECT_EQ(result.code, 0) << result.errors;
  return result.lines();
}

Drive::Drive() {
  std::string name = testing::TempDir() + "skein-drive-XXXXXX";
  if (mkdtemp(name.data()) == nullptr) throw std::runtime_error("mkdtemp");
  _folder = name;
  _store = _folder + "/store";
  _home = _folder + "/home";
  for (const char* part : {"store", "run", "state", "data", "home"}) {
    std::filesystem::create_directory(_folder + '/' + part);
  }
  chmod((_folder + "/state").c_str(), 0700);
  _environment = {"HOME=" + _home, "XDG_RUNTIME_DIR=" + _folder + "/run",
                  "XDG_STATE_HOME=" + _folder + "/state", "XDG_DATA_HOME=" + _folder + "/data",
                  "XDG_DATA_DIRS=" + _folder + "/none", "SKEIN_STORE=" + _store,
                  "PATH=" + std::string(SKEIN_BIN_DIR) + ":/usr/bin:/bin", "TMPDIR=" + _home,
                  "SKEIN_ALLOW_FAULTS=1",
                  // Nobody is asked; what a test says of uploads takes its place.
                  "SKEIN_UPLOADS=1024", "LANG=C.UTF-8"};
}

Drive::~Drive() {
  // Not asked to end: what hangs must go too.
  for (const char* program : {"skein-host", "vald"}) {
    for (const std::string& socket : socketsOf(program)) {
      const pid_t pid = processAt(socket);
      if (pid > 0) kill(pid, SIGKILL);
      if (pid > 0) waitUntilGone(pid, std::chrono::seconds(5));
    }
  }
  if (std::getenv("SKEIN_KEEP") == nullptr) std::filesystem::remove_all(_folder);
}

void Drive::write(const std::string& path, const std::string& contents) const {
  std::ofstream(_store + path, std::ios::binary) << contents;
}

std::unique_ptr<Process> Drive::start(const Arguments& arguments) const {
  return std::make_unique<Process>(SKEIN_BIN_DIR "/skein", arguments, _environment);
}

Result Drive::finish(Process& process) {
  const auto begin = SteadyClock::now();
  Result result;
  result.code = process.finish(std::chrono::seconds(60));
  result.output = process.output;
  result.errors = process.errors;
  result.time = std::chrono::duration_cast<std::chrono::milliseconds>(SteadyClock::now() - begin);
  return result;
}

Result Drive::run(const Arguments& arguments) const { return finish(*start(arguments)); }

Result Drive::shell(const std::string& line) const {
  Process process("/bin/sh", {"-c", "cd \"$HOME\" && " + line}, _environment);
  return finish(process);
}

std::vector<std::string> Drive::socketsOf(const std::string& program) const {
  std::vector<std::string> sockets;
  std::error_code none;
  for (const auto& drive : std::filesystem::directory_iterator(state() + "/skein", none)) {
    const auto path = drive.path() / (program + ".socket");
    if (std::filesystem::is_socket(path, none)) sockets.push_back(path);
  }
  return sockets;
}

std::string Drive::socketOf(const std::string& program) const {
  const auto sockets = socketsOf(program);
  return sockets.empty() ? std::string() : sockets.front();
}

pid_t Drive::processAt(const std::string& path) {
  if (path.empty()) return 0;
  int code = 0;
  const FileDescriptor socket = connectToUnixSocket(path, code);
  ucred peer{};
  socklen_t length = sizeof peer;
  if (socket && getsockopt(socket.get(), SOL_SOCKET, SO_PEERCRED, &peer, &length) == 0) {
    return peer.pid;
  }
  return 0;
}

void sendSignal(pid_t pid, int signal) {
  if (pid <= 0 || kill(pid, signal) != 0) ADD_FAILURE() << "no process for signal " << signal;
}

bool waitUntilGone(pid_t pid, std::chrono::milliseconds deadline) {
  const FileDescriptor handle(static_cast<int>(syscall(SYS_pidfd_open, pid, 0)));
  if (!handle) return errno == ESRCH;
  pollfd ended{handle.get(), POLLIN, 0};
  return poll(&ended, 1, static_cast<int>(deadline.count())) > 0;
}

}  // namespace skein
