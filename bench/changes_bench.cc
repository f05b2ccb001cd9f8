// Changes through the whole chain (a client, skein-host with the extension, vald, the disk)
// beside the plain system calls with the same durability, and the cost of the calls between
// the processes: that of the same request where nothing is to be changed (the name, the folder,
// the tags that the item has), which sends all the messages and writes nothing. Takes a folder to
// work in, whose file system is what is measured. Exits 1 when a bar is missed.
#include <fcntl.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <sys/types.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <functional>
#include <future>
#include <string>
#include <vector>

#include "base/ThreadPool.h"
#include "linux/protocol/DrivePaths.h"
#include "linux/protocol/FileDescriptor.h"
#include "linux/protocol/HostClient.h"
#include "linux/protocol/HostFiles.h"

namespace skein {
namespace {

constexpr int kCalls = 1000;
constexpr int kTurn = 20;
constexpr double kBar = 3.0;

[[noreturn]] void stop(const std::string& why) {
  std::fprintf(stderr, "changes_bench: %s\n", why.c_str());
  std::exit(2);
}
void must(bool fine, const std::string& what) {
  if (!fine) stop(what + " failed");
}
void must(const NSErrorPtr& error) {
  if (error) stop(error->localizedDescription());
}

void syncFolder(const std::string& path) {
  const FileDescriptor folder(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  must(::fsync(folder.get()) == 0, "fsync of " + path);
}

std::string fileName(int number) { return "f" + std::to_string(number); }

// Files in a folder of the drive, which clients see, and as many outside it.
class Bench {
 public:
  explicit Bench(std::string top)
      : _top(std::move(top)), _store(_top + "/store"), _plain(_top + "/plain") {
    std::filesystem::create_directory(_store);
    std::filesystem::create_directory(_plain);
    for (const char* name : {"RUNTIME_DIR", "STATE_HOME", "DATA_HOME"}) {
      const std::string folder = _top + '/' + name;
      must(::mkdir(folder.c_str(), 0700) == 0, "mkdir " + folder);
      ::setenv((std::string("XDG_") + name).c_str(), folder.c_str(), 1);
    }
    NSErrorPtr error;
    const DrivePaths paths = DrivePaths::forStore(_store, &error);
    must(error);
    SocketClient::Options options{"skein-host", paths.hostSocket, std::nullopt};
    options.program = ProgramToStart{"skein-host",
                                     {"--store", paths.store},
                                     paths.hostSocket,
                                     paths.hostLog,
                                     folderOfThisProgram() + "/../bin"};
    _host = makeHostClient(_loop, _executor, std::move(options));
  }
  ~Bench() {
    std::promise<HostStatus> answer;
    _host->status(
        [&](HostStatus status, const NSErrorPtr&) { answer.set_value(std::move(status)); });
    const HostStatus status = answer.get_future().get();
    for (const std::int64_t process : {status.processID, status.daemon.processID}) {
      if (process > 0) ::kill(static_cast<pid_t>(process), SIGTERM);
    }
    _host.reset();
    std::filesystem::remove_all(_top);
  }

  int run() {
    std::printf("%-20s %10s %10s %10s   %s\n", "", "chain", "calls", "plain",
                "(chain - calls) / plain, at most 3.0");
    renames();
    moves();
    tags();
    return _missed ? 1 : 0;
  }

 private:
  using Call = std::function<void(const std::string& name)>;

  HostFiles& files() { return _host->files(); }

  // Asks and waits; the reply's last value is an error.
  void ask(const std::function<void(HostFiles::ItemReply)>& send) {
    std::promise<NSErrorPtr> answer;
    send([&](const HostItem&, NSErrorPtr error) { answer.set_value(std::move(error)); });
    must(answer.get_future().get());
  }
  static HostTarget inSet(const std::string& name) { return HostTarget::path("/set/" + name); }

  void makeFiles() {
    for (const std::string& folder : {_store + "/set", _plain + "/set"}) {
      std::filesystem::remove_all(folder);
      std::filesystem::create_directories(folder + "/to");
      for (int number = 0; number < kCalls; ++number) {
        const std::string path = folder + '/' + fileName(number);
        const FileDescriptor file(::open(path.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0644));
        must(::write(file.get(), "0123456789abcdef", 16) == 16, "write " + path);
      }
    }
    must(std::system(("sync -f " + _top).c_str()) == 0, "sync");
    // By now each is in the index: the last one was made last.
    while (!isThere(inSet(fileName(kCalls - 1))) || !isThere(HostTarget::path("/set/to"))) {
    }
    for (int number = 0; number < kCalls; ++number) must(isThere(inSet(fileName(number))), "find");
  }
  bool isThere(const HostTarget& target) {
    std::promise<bool> answer;
    _host->item(target, [&](const HostItem&, const NSErrorPtr& error) {
      answer.set_value(error == nullptr);
    });
    return answer.get_future().get();
  }

  // In short turns, so that all meet the same load; the median turn of each counts.
  void compare(const char* what, const Call& nothing, const Call& chain, const Call& plain) {
    std::vector<double> chainTurns;
    std::vector<double> callTurns;
    std::vector<double> plainTurns;
    for (int first = 0; first < kCalls; first += kTurn) {
      const auto turn = [&](const Call& call) {
        const auto start = std::chrono::steady_clock::now();
        for (int at = first; at < first + kTurn; ++at) call(fileName(at));
        return std::chrono::duration<double, std::milli>(std::chrono::steady_clock::now() - start)
            .count();
      };
      callTurns.push_back(turn(nothing));
      plainTurns.push_back(turn(plain));
      chainTurns.push_back(turn(chain));
    }
    const auto thousand = [](std::vector<double>& turns) {
      std::sort(turns.begin(), turns.end());
      return turns[turns.size() / 2] * kCalls / kTurn;
    };
    const double all = thousand(chainTurns);
    const double calls = thousand(callTurns);
    const double bare = thousand(plainTurns);
    const double ratio = (all - calls) / bare;
    _missed = _missed || ratio > kBar;
    std::printf("%-20s %7.1f ms %7.1f ms %7.1f ms   %.2f%s\n", what, all, calls, bare, ratio,
                ratio > kBar ? "  missed" : "");
    std::fflush(stdout);
  }

  void renames() {
    makeFiles();
    const std::string set = _plain + "/set";
    compare(
        "1,000 renames",
        [&](const std::string& name) {
          ask([&](auto reply) { files().rename(inSet(name), name, "bench", std::move(reply)); });
        },
        [&](const std::string& name) {
          ask([&](auto reply) {
            files().rename(inSet(name), "new-" + name, "bench", std::move(reply));
          });
        },
        [&](const std::string& name) {
          must(::rename((set + '/' + name).c_str(), (set + "/new-" + name).c_str()) == 0, "rename");
          syncFolder(set);
        });
  }

  void moves() {
    makeFiles();
    const std::string set = _plain + "/set";
    compare(
        "1,000 moves",
        [&](const std::string& name) {
          ask([&](auto reply) {
            files().reparent(inSet(name), HostTarget::path("/set"), std::nullopt, "bench",
                             std::move(reply));
          });
        },
        [&](const std::string& name) {
          ask([&](auto reply) {
            files().reparent(inSet(name), inSet("to"), std::nullopt, "bench", std::move(reply));
          });
        },
        [&](const std::string& name) {
          must(::rename((set + '/' + name).c_str(), (set + "/to/" + name).c_str()) == 0, "rename");
          syncFolder(set + "/to");
          syncFolder(set);
        });
  }

  void tags() {
    makeFiles();
    compare(
        "1,000 tag writes",
        [&](const std::string& name) {
          ask([&](auto reply) { files().setTags(inSet(name), {}, std::move(reply)); });
        },
        [&](const std::string& name) {
          ask([&](auto reply) { files().setTags(inSet(name), {"red", "blue"}, std::move(reply)); });
        },
        [&](const std::string& name) {
          const std::string path = _plain + "/set/" + name;
          const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
          must(::fsetxattr(file.get(), "user.xdg.tags", "red,blue", 8, 0) == 0, "setxattr");
          must(::fsync(file.get()) == 0, "fsync");
        });
  }

  const std::string _top;
  const std::string _store;
  const std::string _plain;
  const std::shared_ptr<RpcLoop> _loop = RpcLoop::start("bench-io");
  const std::shared_ptr<Executor> _executor = std::make_shared<ThreadPool>(2, "bench");
  std::shared_ptr<HostService> _host;
  bool _missed = false;
};

}  // namespace
}  // namespace skein

int main(int argc, char** argv) {
  if (argc > 2) {
    std::fprintf(stderr, "Usage: changes_bench [FOLDER]\n");
    return 2;
  }
  std::string top = std::string(argc > 1 ? argv[1] : "/var/tmp") + "/skein-changes-bench-XXXXXX";
  if (::mkdtemp(top.data()) == nullptr) {
    std::perror("changes_bench: mkdtemp");
    return 2;
  }
  return skein::Bench(top).run();
}
