// skein log
#include <fcntl.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <deque>
#include <optional>

#include "linux/cli/Commands.h"
#include "linux/cli/ExitCodes.h"
#include "linux/cli/LogLines.h"
#include "linux/protocol/FileDescriptor.h"

namespace skein::cli {
namespace {

struct LogOptions {
  bool follow = false;
  bool daemon = false;
  std::string section;
  std::string level;
  std::uint64_t lines = 40;
};

// Reads a file line by line, also while it grows and when it is replaced by a new one.
class LineReader {
 public:
  explicit LineReader(std::string path) : _path(std::move(path)) { reopen(); }
  bool isOpen() const { return static_cast<bool>(_file); }

  // Nothing at the end of what is there.
  std::optional<std::string> next() {
    for (;;) {
      if (const auto end = _buffer.find('\n'); end != std::string::npos) {
        std::string line = _buffer.substr(0, end);
        _buffer.erase(0, end + 1);
        return line;
      }
      char bytes[16384];
      const ssize_t count = _file ? read(_file.get(), bytes, sizeof bytes) : 0;
      if (count > 0) {
        _buffer.append(bytes, static_cast<std::size_t>(count));
      } else if (!wasReplaced() || !reopen()) {
        return std::nullopt;
      }
    }
  }

 private:
  bool wasReplaced() const {
    struct stat now {};
    struct stat mine {};
    if (stat(_path.c_str(), &now) != 0) return false;
    return !_file || (fstat(_file.get(), &mine) == 0 && mine.st_ino != now.st_ino);
  }
  bool reopen() {
    FileDescriptor file(open(_path.c_str(), O_RDONLY | O_CLOEXEC));
    if (!file) return false;
    _file = std::move(file);
    _buffer.clear();
    return true;
  }

  const std::string _path;
  FileDescriptor _file;
  std::string _buffer;
};

void print(Output& output, const std::string& line) {
  output.writeName(line);
  output.write("\n");
}

int showLog(const LogOptions& options, const std::string& path) {
  std::optional<SectionFilter> filter;
  if (!options.section.empty()) {
    const auto section = parseSection(options.section);
    if (!section) {
      complain("\"" + options.section +
               "\" is no section; use a number as the log prints it, "
               "such as 1f");
      return kUsage;
    }
    filter.emplace(*section);
  }
  // Before the file is read, so that nothing is missed in between.
  const FileDescriptor changes(inotify_init1(IN_CLOEXEC));
  const std::string folder = path.substr(0, path.rfind('/'));
  if (options.follow &&
      (!changes || inotify_add_watch(changes.get(), folder.c_str(), IN_MODIFY | IN_CREATE) < 0)) {
    complain(path + " cannot be followed: " + std::strerror(errno) + "; read it without -f");
    return kFailure;
  }
  LineReader reader(path);
  if (!reader.isOpen() && !options.follow) {
    complain("there is no log yet at " + path +
             "; it begins with the first command, such as: "
             "skein ls /");
    return kFailure;
  }
  Output output;
  std::deque<std::string> last;
  while (const auto line = reader.next()) {
    if (filter && !filter->wants(*line)) continue;
    last.push_back(*line);
    if (!filter && last.size() > options.lines) last.pop_front();
  }
  for (const std::string& line : last) print(output, line);
  output.flush();
  if (filter && last.empty() && !options.follow) {
    complain("the log has no section " + options.section +
             "; requests are logged while this is on: skein log --level debug");
    return kFailure;
  }
  while (options.follow) {
    char events[4096];
    if (read(changes.get(), events, sizeof events) < 0 && errno != EINTR) {
      complain(path + " cannot be followed any longer: " + std::strerror(errno) +
               "; start again with: skein log -f");
      return kFailure;
    }
    while (const auto line = reader.next()) {
      if (!filter || filter->wants(*line)) print(output, *line);
    }
    output.flush();
  }
  return kSuccess;
}

int runLog(const Invocation& invocation, const LogOptions& options) {
  NSErrorPtr error;
  const DrivePaths paths =
      options.level.empty() ? invocation.drive.known(&error) : invocation.drive.paths(&error);
  if (paths.store.empty()) return complainAbout(error);
  if (!options.level.empty()) {
    const int code = withSession(invocation, [&](HostService& host) {
      const auto [problem] = await<>(
          [&](auto reply) { host.setDebugLog(options.level == "debug", std::move(reply)); });
      return problem ? complainAbout(problem) : kSuccess;
    });
    if (code != kSuccess || (!options.follow && options.section.empty())) return code;
  }
  return showLog(options, options.daemon ? paths.daemonLog : paths.hostLog);
}

}  // namespace

void addLogCommand(CLI::App& app, Invocation& invocation) {
  auto options = std::make_shared<LogOptions>();
  auto* log = app.add_subcommand("log", "Show the log of skein-host, request by request");
  log->add_flag("-f,--follow", options->follow, "Go on with lines as they are written");
  log->add_option("--section", options->section, "The lines of one request, by its number");
  log->add_option("-n,--lines", options->lines, "The last so many lines (40)");
  log->add_option("--level", options->level, "From now on log requests too, or no longer")
      ->check(CLI::IsMember({"debug", "info"}));
  log->add_flag("--vald", options->daemon, "The log of vald instead");
  log->footer("Example: skein log --section 1f");
  log->callback([&invocation, options] {
    invocation.run = [&invocation, options] { return runLog(invocation, *options); };
  });
}

}  // namespace skein::cli
