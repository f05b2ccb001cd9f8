// skein-host: carries the extension of one drive. Reads the arguments and wires the parts;
// everything else is theirs.
#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>
#include <string_view>

#include "base/ThreadPool.h"
#include "extension/VLFileProviderExtension.h"
#include "linux/framework/LocalFramework.h"
#include "linux/host/HostFileRequests.h"
#include "linux/host/HostRequests.h"
#include "linux/host/LocalListeners.h"
#include "linux/host/NSExtensionMain.h"
#include "linux/host/ServiceRequests.h"
#include "linux/host/ThumbnailStream.h"
#include "linux/protocol/HostServer.h"
#include "linux/protocol/LogFile.h"
#include "linux/protocol/ProcessLauncher.h"
#include "linux/protocol/RunLock.h"
#include "linux/protocol/StandardDescriptors.h"
#include "support/Environment.h"

namespace skein {
namespace {

constexpr char kHelp[] =
    R"(Usage: skein-host --store DIR [--foreground] [--log-level LEVEL] [--attributes FILE]

Carries the File Provider extension of the drive over DIR, for the commands of skein,
which starts it when it is not running. It starts vald, the drive's daemon, in its turn.

  --store DIR         the drive's folder; SKEIN_STORE otherwise
  --foreground        stay in the foreground, and log to standard error too
  --log-level LEVEL   notice, info (the usual one) or debug; SKEIN_LOG otherwise
  --attributes FILE   the extension's attributes, instead of those installed with it
  --help              this text

Example: skein-host --store ~/Documents --foreground --log-level debug

Exit codes: 0 ended as asked, or another skein-host serves the drive already; 1 failure;
2 usage; 3 the extension cannot be instantiated.
)";

constexpr std::chrono::milliseconds kPatienceWithPredecessor{3000};
constexpr int kExitFailure = 1;
constexpr int kExitUsage = 2;
constexpr int kExitExtension = 3;

struct Arguments {
  std::string store;
  std::string logLevel = "info";
  std::string attributes;
  bool foreground = false;
};

int fail(int code, const std::string& text) {
  std::fprintf(stderr, "skein-host: %s\n", text.c_str());
  return code;
}

bool isLogLevel(std::string_view level) {
  return level == "notice" || level == "info" || level == "debug";
}

// Empty when they make sense; else what is wrong.
std::string parse(int argc, char** argv, Arguments& arguments, bool& help) {
  if (const char* store = std::getenv("SKEIN_STORE")) arguments.store = store;
  if (const char* level = std::getenv("SKEIN_LOG"); level != nullptr && isLogLevel(level)) {
    arguments.logLevel = level;
  }
  for (int i = 1; i < argc; ++i) {
    const std::string_view argument = argv[i];
    const auto value = [&](std::string& into) {
      if (i + 1 >= argc) return false;
      into = argv[++i];
      return true;
    };
    bool complete = true;
    if (argument == "--help" || argument == "-h") {
      help = true;
    } else if (argument == "--foreground") {
      arguments.foreground = true;
    } else if (argument == "--store") {
      complete = value(arguments.store);
    } else if (argument == "--log-level") {
      complete = value(arguments.logLevel);
    } else if (argument == "--attributes") {
      complete = value(arguments.attributes);
    } else {
      return "there is no argument " + std::string(argument) + "; see skein-host --help";
    }
    if (!complete) return std::string(argument) + " needs a value; see skein-host --help";
  }
  if (!isLogLevel(arguments.logLevel)) {
    return "--log-level is notice, info or debug, not " + arguments.logLevel;
  }
  if (!help && arguments.store.empty()) return "name the drive's folder with --store DIR";
  return {};
}

std::string attributesPath() {
  const std::string folder = folderOfThisProgram();
  std::string beside = folder + "/extension.attributes";
  if (access(beside.c_str(), R_OK) == 0) return beside;
  return folder + "/../share/skein/extension.attributes";
}

// Goes on in a child; the first process ends with status 0 once the child serves, or 1.
// Answers where the child says that it does; nothing, with errno, when there is no child.
FileDescriptor leaveForeground() {
  int ends[2];
  if (pipe2(ends, O_CLOEXEC) != 0) return FileDescriptor();
  const pid_t child = fork();
  if (child < 0) {
    const int code = errno;
    close(ends[0]);
    close(ends[1]);
    errno = code;
    return FileDescriptor();
  }
  if (child > 0) {
    close(ends[1]);
    char ready = 0;
    ssize_t got = 0;
    do {
      got = read(ends[0], &ready, 1);
    } while (got < 0 && errno == EINTR);
    _exit(got == 1 ? ready : kExitFailure);
  }
  close(ends[0]);
  setsid();
  return FileDescriptor(ends[1]);
}

void report(const FileDescriptor& parent, int code) {
  const char byte = static_cast<char>(code);
  if (!parent) return;
  // Said all that there was to say to whoever started it.
  if (code == 0) releaseStandardDescriptors();
  [[maybe_unused]] const ssize_t written = write(parent.get(), &byte, 1);
}

int serve(const Arguments& arguments, const DrivePaths& paths, const FileDescriptor& parent,
          const sigset_t& endSignals) {
  NSErrorPtr error;
  const auto log = LogFile::open({paths.hostLog, arguments.foreground}, &error);
  if (!log) return fail(kExitFailure, error->localizedDescription());
  LogFile::takeFaults(log);
  log->setEnabled(LogType::Info, arguments.logLevel != "notice");
  log->setEnabled(LogType::Debug, arguments.logLevel == "debug");

  const std::shared_ptr<Executor> executor = std::make_shared<ThreadPool>(4, "host");
  // Deadlines have threads of their own, however many of the pool's wait.
  const std::shared_ptr<Timers> timers =
      std::make_shared<SteadyTimers>(std::make_shared<ThreadPool>(2, "deadlines"));
  const std::shared_ptr<RpcLoop> loop = RpcLoop::start("host-io");
  NSNotificationCenter notificationCenter;
  LocalFramework framework(loop, executor, notificationCenter, *log,
                           LocalFramework::optionsFor(paths));
  const DaemonProxies daemon = [client = framework.client()](auto errorHandler) {
    return client->remoteObjectProxyWithErrorHandler(std::move(errorHandler));
  };

  const auto host = std::make_shared<FileProviderHost>(
      HostTools{executor, timers}, std::make_unique<WorkingSetWatch>(daemon, timers), *log);
  VLLogSections logSections(executor);
  RootURL rootURL;
  LocalListeners xpcListeners(executor);
  Environment environment{*log,
                          executor,
                          notificationCenter,
                          *host,
                          framework.accounts(),
                          framework.containers(),
                          framework.daemonConnection(),
                          framework.documents(),
                          framework.queryItems(),
                          logSections,
                          rootURL,
                          framework.fileOperations(),
                          framework.fileManager(),
                          framework.operations(),
                          framework.cloud(),
                          framework.systemThumbnails(),
                          framework.remoteDefaults(),
                          framework.downloads(),
                          framework.bundles(),
                          framework.sharingOperations(),
                          framework.resourceValues(),
                          xpcListeners,
                          *log};

  const NSExtensionPrincipalClasses classes{
      {"VLFileProviderExtension",
       [&environment](std::shared_ptr<const NSExtensionAttributes> given) {
         return VLFileProviderExtension::init(std::move(given), environment);
       }}};
  if (!NSExtensionMain(arguments.attributes.empty() ? attributesPath() : arguments.attributes,
                       classes, *host, &error)) {
    VL_ERROR(*log, "[ERROR] %s", error->localizedDescription());
    return fail(kExitExtension, error->localizedDescription());
  }
  const auto drive = std::make_shared<DriveRequests>(host, daemon, framework.containers());
  const auto requests =
      std::make_shared<HostRequests>(drive, std::make_unique<HostFileRequests>(drive), *log);
  const auto services = std::make_shared<ServiceRequests>(
      host, [drive](HostTarget target, Reply<std::string, NSErrorPtr> reply) {
        drive->findIdentifier(std::move(target), std::move(reply));
      });
  auto server = HostServer::listen(loop, executor, requests, services, paths.hostSocket, *log,
                                   &error, [] { kill(getpid(), SIGTERM); });
  // At once, as at the end below: what was made above refers to each other.
  if (!server) std::_Exit(fail(kExitFailure, error->localizedDescription()));
  VL_NOTICE(*log, "[NOTICE] serving %s", paths.store);
  report(parent, 0);

  int signal = 0;
  while (sigwait(&endSignals, &signal) != 0) {
  }
  VL_NOTICE(*log, "[NOTICE] ending, as signal %d asked for it", signal);
  server.reset();
  // The process keeps nothing that has to be saved, and a thread may be waiting for a vald
  // that does not answer: the end does not wait for it.
  std::_Exit(EXIT_SUCCESS);
}

}  // namespace
}  // namespace skein

int main(int argc, char** argv) {
  using namespace skein;
  openStandardDescriptors();
  Arguments arguments;
  bool help = false;
  if (const std::string problem = parse(argc, argv, arguments, help); !problem.empty()) {
    return fail(kExitUsage, problem);
  }
  if (help) {
    std::fputs(kHelp, stdout);
    return 0;
  }
  ThumbnailStream::keepMemoryForPictures();
  // Before there are threads: they inherit it, so that main alone takes these.
  std::signal(SIGPIPE, SIG_IGN);
  sigset_t endSignals;
  sigemptyset(&endSignals);
  for (const int signal : {SIGTERM, SIGINT, SIGHUP}) sigaddset(&endSignals, signal);
  pthread_sigmask(SIG_BLOCK, &endSignals, nullptr);

  NSErrorPtr error;
  const DrivePaths paths = DrivePaths::forStore(arguments.store, &error);
  if (paths.store.empty()) return fail(kExitFailure, error->localizedDescription());
  FileDescriptor parent;
  if (!arguments.foreground && !(parent = leaveForeground())) {
    return fail(kExitFailure, std::string("it cannot go to the background, try --foreground: ") +
                                  std::strerror(errno));
  }
  RunLock lock;
  switch (lock.take(paths.hostLock, paths.hostSocket, kPatienceWithPredecessor, &error)) {
    case RunLock::Outcome::AlreadyRunning: report(parent, 0); return 0;
    case RunLock::Outcome::Failed: return fail(kExitFailure, error->localizedDescription());
    case RunLock::Outcome::Taken: break;
  }
  const int code = serve(arguments, paths, parent, endSignals);
  report(parent, code);
  return code;
}
