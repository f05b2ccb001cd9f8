#include "linux/protocol/ProcessLauncher.h"

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <memory>
#include <optional>
#include <string_view>
#include <thread>

#include "base/Mutex.h"
#include "linux/protocol/FileDescriptor.h"
#include "linux/protocol/SpawnSettings.h"
#include "linux/protocol/UnixSocket.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

using Clock = std::chrono::steady_clock;

// Sockets do not say when they come to be; this is how often one is tried.
constexpr std::chrono::milliseconds kBetweenTries{5};
// How long a program that ended with an error may be the loser of a race: what won it
// must accept by then.
constexpr std::chrono::milliseconds kGraceAfterFailure{300};

bool accepts(const std::string& socketPath, int& code) {
  return static_cast<bool>(connectToUnixSocket(socketPath, code));
}

// The started process, and how it ended once it did. A thread waits for it as long as
// both run, so that it never stays behind as a zombie.
class Child {
 public:
  explicit Child(pid_t pid) : _ending(std::make_shared<Ending>()) {
    std::thread([pid, ending = _ending] {
      int status = 0;
      pid_t reaped = 0;
      do {
        reaped = waitpid(pid, &status, 0);
      } while (reaped < 0 && errno == EINTR);
      MutexLock lock(ending->mutex);
      ending->status = reaped == pid ? status : 0;
      ending->came.notifyAll();
    }).detach();
  }

  // Waits until `moment` or, when it still runs, until it ends; answers the wait status
  // once it has ended.
  std::optional<int> waitUntil(Clock::time_point moment) {
    MutexLock lock(_ending->mutex);
    while (!_ending->status && _ending->came.waitUntil(_ending->mutex, moment)) {
    }
    return _ending->status;
  }

 private:
  struct Ending {
    Mutex mutex;
    CondVar came;
    std::optional<int> status SKEIN_GUARDED_BY(mutex);
  };
  std::shared_ptr<Ending> _ending;
};

int spawn(const std::string& file, const ProgramToStart& program, pid_t& pid) {
  SpawnSettings settings;
  posix_spawn_file_actions_addopen(&settings.actions, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
  posix_spawn_file_actions_addopen(&settings.actions, STDOUT_FILENO, program.logPath.c_str(),
                                   O_WRONLY | O_CREAT | O_APPEND, 0600);
  posix_spawn_file_actions_adddup2(&settings.actions, STDOUT_FILENO, STDERR_FILENO);
  posix_spawn_file_actions_addclosefrom_np(&settings.actions, STDERR_FILENO + 1);
  posix_spawn_file_actions_addchdir_np(&settings.actions, "/");

  std::vector<char*> arguments;
  arguments.push_back(const_cast<char*>(file.c_str()));
  for (const std::string& argument : program.arguments) {
    arguments.push_back(const_cast<char*>(argument.c_str()));
  }
  arguments.push_back(nullptr);
  return posix_spawn(&pid, file.c_str(), &settings.actions, &settings.attributes, arguments.data(),
                     environ);
}

std::string lastLineOf(const std::string& path) {
  const FileDescriptor file(open(path.c_str(), O_RDONLY | O_CLOEXEC));
  if (!file) return {};
  char buffer[2048];
  const off_t size = lseek(file.get(), 0, SEEK_END);
  const ssize_t length = pread(file.get(), buffer, sizeof buffer,
                               std::max<off_t>(0, size - static_cast<off_t>(sizeof buffer)));
  if (length <= 0) return {};
  std::string_view text(buffer, static_cast<std::size_t>(length));
  while (!text.empty() && text.back() == '\n') text.remove_suffix(1);
  return std::string(text.substr(text.rfind('\n') + 1));
}

std::string endingInWords(int status) {
  if (WIFSIGNALED(status)) return "ended by signal " + std::to_string(WTERMSIG(status));
  return "ended with status " + std::to_string(WEXITSTATUS(status));
}

NSErrorPtr failure(const ProgramToStart& program, const std::string& what) {
  std::string text = program.program + " could not be started: " + what + ".";
  if (!program.logPath.empty()) text += " Its log is " + program.logPath + ".";
  return vl_errorDaemonUnreachable(text);
}

}  // namespace

std::string folderOfThisProgram() {
  char path[4096];
  const ssize_t length = readlink("/proc/self/exe", path, sizeof path);
  if (length <= 0) return {};
  const std::string_view file(path, static_cast<std::size_t>(length));
  return std::string(file.substr(0, file.rfind('/')));
}

NSErrorPtr startProgram(const ProgramToStart& program) {
  const Clock::time_point deadline = Clock::now() + program.deadline;
  int code = 0;
  if (accepts(program.socketPath, code)) return nullptr;
  if (code != ENOENT && code != ECONNREFUSED) {
    return failure(program,
                   "its socket " + program.socketPath + " does not accept: " + std::strerror(code));
  }
  const std::string folder = program.folder.empty() ? folderOfThisProgram() : program.folder;
  const std::string file = folder + '/' + program.program;
  if (access(file.c_str(), X_OK) != 0) {
    return failure(program, file + " cannot be run: " + std::strerror(errno));
  }
  pid_t pid = 0;
  if (const int problem = spawn(file, program, pid); problem != 0) {
    return failure(program, file + " cannot be run: " + std::strerror(problem));
  }

  Child child(pid);
  std::optional<int> ended;
  Clock::time_point last = deadline;
  for (;;) {
    if (accepts(program.socketPath, code)) return nullptr;
    const Clock::time_point now = Clock::now();
    if (now >= last) break;
    if (!ended) {
      ended = child.waitUntil(std::min(now + kBetweenTries, last));
      if (ended && *ended != 0) last = std::min(last, Clock::now() + kGraceAfterFailure);
    } else {
      std::this_thread::sleep_for(kBetweenTries);
    }
  }
  if (ended && *ended != 0) {
    const std::string line = lastLineOf(program.logPath);
    return failure(program, "it " + endingInWords(*ended) +
                                (line.empty() ? std::string() : ", saying \"" + line + '"'));
  }
  return failure(program,
                 "it was not ready within " + std::to_string(program.deadline.count()) + " ms");
}

}  // namespace skein
