// A drive of the test's own, served by the real programs: a store, and folders for
// everything that they keep. What was started is gone when the test ends.
#pragma once

#include <sys/types.h>

#include <chrono>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "linux/protocol/FileDescriptor.h"

namespace skein {

using Arguments = std::vector<std::string>;

// A program that runs beside the test.
class Process {
 public:
  Process(const std::string& program, const Arguments& arguments, const Arguments& environment);
  // Kills it if it still runs.
  ~Process();
  Process(const Process&) = delete;
  Process& operator=(const Process&) = delete;

  pid_t pid() const { return _pid; }
  // The next line of its output; nothing at its end, or when the deadline passed.
  std::optional<std::string> readLine(std::chrono::milliseconds deadline);
  // Everything up to its end, and how it ended: its exit code, or 128 + signal. Fails the
  // test at the deadline.
  int finish(std::chrono::milliseconds deadline);

  std::string output;  // what readLine() has not taken
  std::string errors;

 private:
  bool readSome(std::chrono::steady_clock::time_point deadline);

  pid_t _pid = -1;
  FileDescriptor _output;
  FileDescriptor _errors;
};

struct Result {
  int code = -1;
  std::string output;
  std::string errors;
  std::chrono::milliseconds time{0};  // that it took; for messages, not for tests

  std::vector<std::string> lines() const;
};

class Drive {
 public:
  Drive();
  ~Drive();

  const std::string& store() const { return _store; }
  void write(const std::string& path, const std::string& contents) const;

  // Runs `skein ARGUMENTS` to its end.
  Result run(const Arguments& arguments) const;
  // The names in a folder; none, and a failed test, when it cannot be listed.
  std::vector<std::string> list(const std::string& path) const;
  std::unique_ptr<Process> start(const Arguments& arguments) const;
  // Runs a line of sh(1), where `skein` is this drive's, from the folder for such things.
  Result shell(const std::string& line) const;
  // A folder outside the store, for what a test brings in.
  const std::string& home() const { return _home; }
  // Where the drive's processes keep what is theirs.
  std::string state() const { return _folder + "/state"; }
  // The drive's processes; 0 when they do not run.
  pid_t daemon() const { return processAt(socketOf("vald")); }
  pid_t host() const { return processAt(socketOf("skein-host")); }
  // Where vald or skein-host listens; empty when it never did.
  std::string socketOf(const std::string& program) const;

 private:
  static Result finish(Process& process);
  // Of every drive whose state is here: a test may open a second one.
  std::vector<std::string> socketsOf(const std::string& program) const;
  // The process that listens there; 0 when there is none.
  static pid_t processAt(const std::string& path);

  std::string _folder;
  std::string _store;
  std::string _home;
  Arguments _environment;
};

// Sends a signal; fails the test for what is no process of its own (0 and -1 mean many).
void sendSignal(pid_t pid, int signal);

// Waits until the process is gone; false at the deadline.
bool waitUntilGone(pid_t pid, std::chrono::milliseconds deadline);

}  // namespace skein
