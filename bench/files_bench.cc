// File operations beside what the system needs for the same with the same durability:
// imports beside cp and sync, renames, moves and tags beside the bare calls with fsync.
// Takes a folder to work in (its file system is what is measured) and the large file's GiB.
#include <fcntl.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <functional>
#include <string>
#include <vector>

#include "linux/vald/files/FileOperations.h"

namespace skein::vald {
namespace {

constexpr int kRounds = 3;
constexpr int kCalls = 1000;
constexpr int kFolders = 100;
constexpr int kFilesEach = 100;

class StderrLog : public Log {
 public:
  void write(LogType, std::string_view line) override {
    std::fprintf(stderr, "%.*s\n", static_cast<int>(line.size()), line.data());
  }
};

[[noreturn]] void stop(const std::string& why) {
  std::fprintf(stderr, "files_bench: %s\n", why.c_str());
  std::exit(2);
}
void must(bool fine, const std::string& what) {
  if (!fine) stop(what + " failed");
}
void must(const NSErrorPtr& error) {
  if (error) stop(error->localizedDescription());
}
void shell(const std::string& command) { must(std::system(command.c_str()) == 0, command); }

double milliseconds(const std::function<void()>& work) {
  const auto start = std::chrono::steady_clock::now();
  work();
  return std::chrono::duration<double, std::milli>(std::chrono::steady_clock::now() - start)
      .count();
}

void fill(const std::string& path, std::uint64_t bytes) {
  std::vector<char> block(std::size_t{1} << 20);
  std::uint64_t seed = bytes + std::hash<std::string>{}(path);
  FileDescriptor file(::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644));
  while (bytes > 0) {
    const std::size_t count = std::min<std::uint64_t>(bytes, block.size());
    for (std::size_t at = 0; at < count; at += 8) {
      seed = seed * 6364136223846793005U + 1442695040888963407U;
      std::copy_n(reinterpret_cast<const char*>(&seed), std::min<std::size_t>(8, count - at),
                  block.data() + at);
    }
    must(::write(file.get(), block.data(), count) == static_cast<ssize_t>(count), "write");
    bytes -= count;
  }
}

void syncFolder(const std::string& path) {
  const FileDescriptor folder(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  must(::fsync(folder.get()) == 0, "fsync");
}

long residentKiB() {
  struct rusage usage {};
  ::getrusage(RUSAGE_SELF, &usage);
  return usage.ru_maxrss;
}

class Bench {
 public:
  explicit Bench(const std::string& base) : _top(base + "/skein-files-bench-XXXXXX") {
    must(::mkdtemp(_top.data()) != nullptr, "mkdtemp in " + base);
    for (const char* folder : {"/store", "/state", "/source", "/plain"}) {
      std::filesystem::create_directory(_top + folder);
    }
    FileOperationsOptions options;
    options.roots = {_top + "/store"};
    options.stateDirectory = _top + "/state";
    NSErrorPtr error;
    _operations = FileOperations::open(options, _files, _log, &error);
    must(error);
  }
  ~Bench() { std::filesystem::remove_all(_top); }

  int run(std::uint64_t gibibytes) {
    std::printf("%-34s %12s %12s %7s %5s\n", "", "ours", "plain", "ratio", "bar");
    importTree();
    importLarge(gibibytes);
    renames();
    moves();
    tags();
    return _missed ? 1 : 0;
  }

 private:
  // Alternates the two, so that both meet the same machine; the best round of each counts.
  void compare(const char* what, double bar, const std::function<void(int)>& ours,
               const std::function<void(int)>& plain) {
    double best = 1e300;
    double bestPlain = 1e300;
    for (int round = 0; round < kRounds; ++round) {
      shell("sync -f " + _top);
      bestPlain = std::min(bestPlain, milliseconds([&] { plain(round); }));
      shell("sync -f " + _top);
      best = std::min(best, milliseconds([&] { ours(round); }));
    }
    report(what, bar, best, bestPlain);
  }

  void report(const char* what, double bar, double ours, double plain) {
    const double ratio = ours / plain;
    _missed = _missed || ratio > bar;
    std::printf("%-34s %9.1f ms %9.1f ms %7.2f %5.1f%s\n", what, ours, plain, ratio, bar,
                ratio > bar ? "  missed" : "");
    std::fflush(stdout);
  }

  void importTree() {
    for (int folder = 0; folder < kFolders; ++folder) {
      const std::string path = source("tree/") + std::to_string(folder);
      std::filesystem::create_directories(path);
      for (int file = 0; file < kFilesEach; ++file) fill(path + "/f" + std::to_string(file), 4096);
    }
    compare(
        "import of 10,000 files of 4 KiB", 2.0, [&](int round) { import("tree", round); },
        [&](int round) {
          const std::string to = plain("tree" + std::to_string(round));
          shell("cp -r " + source("tree") + " " + to + " && sync -f " + to);
        });
  }

  void importLarge(std::uint64_t gibibytes) {
    fill(source("large"), gibibytes << 30);
    const long before = residentKiB();
    const std::string what = "import of one file of " + std::to_string(gibibytes) + " GiB";
    compare(
        what.c_str(), 2.0,
        [&](int round) {
          import("large", round);
          std::filesystem::remove(store("large" + std::to_string(round)));
        },
        [&](int) {
          const std::string to = plain("large");
          shell("cp " + source("large") + " " + to + " && sync " + to + " " + plain(""));
          std::filesystem::remove(to);
        });
    std::printf("  memory grew by %ld KiB\n", residentKiB() - before);
  }

  void import(const std::string& name, int round) {
    must(
        _operations->importDocument(source(name), _top + "/store", name + std::to_string(round), {})
            .error);
  }

  // Short turns, so that both meet the same load; the median turn of each counts.
  void compareCalls(const char* what, const std::function<void(const std::string&)>& ours,
                    const std::function<void(const std::string&)>& plain) {
    constexpr double kBar = 3.0;
    constexpr int kTurn = 20;
    std::vector<double> turns;
    std::vector<double> plainTurns;
    for (int first = 0; first < kCalls; first += kTurn) {
      const auto turn = [&](const std::function<void(const std::string&)>& call) {
        return milliseconds([&] {
          for (int at = first; at < first + kTurn; ++at) call("f" + std::to_string(at));
        });
      };
      plainTurns.push_back(turn(plain));
      turns.push_back(turn(ours));
    }
    const auto thousand = [](std::vector<double>& all) {
      std::sort(all.begin(), all.end());
      return all[all.size() / 2] * kCalls / kTurn;
    };
    report(what, kBar, thousand(turns), thousand(plainTurns));
  }

  void makeFiles() {
    for (const std::string& folder : {store("set"), plain("set")}) {
      std::filesystem::remove_all(folder);
      std::filesystem::create_directories(folder + "/to");
      for (int file = 0; file < kCalls; ++file) fill(folder + "/f" + std::to_string(file), 16);
    }
    shell("sync -f " + _top);
  }

  void renames() {
    makeFiles();
    const std::string set = plain("set");
    compareCalls(
        "1,000 renames",
        [&](const std::string& name) {
          must(_operations->rename(store("set/") + name, "new-" + name, {}).error);
        },
        [&](const std::string& name) {
          must(::rename((set + '/' + name).c_str(), (set + "/new-" + name).c_str()) == 0, "rename");
          syncFolder(set);
        });
  }

  void moves() {
    makeFiles();
    const std::string set = plain("set");
    compareCalls(
        "1,000 moves",
        [&](const std::string& name) {
          must(_operations->move(store("set/") + name, store("set/to"), {}, false, {}).error);
        },
        [&](const std::string& name) {
          must(::rename((set + '/' + name).c_str(), (set + "/to/" + name).c_str()) == 0, "rename");
          syncFolder(set + "/to");
          syncFolder(set);
        });
  }

  void tags() {
    makeFiles();
    compareCalls(
        "1,000 tag writes",
        [&](const std::string& name) {
          must(_operations->setTags(store("set/") + name, {"red", "blue"}).error);
        },
        [&](const std::string& name) {
          const FileDescriptor file(::open((plain("set/") + name).c_str(), O_RDONLY | O_CLOEXEC));
          must(::fsetxattr(file.get(), kTagsAttribute, "red,blue", 8, 0) == 0, "setxattr");
          must(::fsync(file.get()) == 0, "fsync");
        });
  }

  std::string store(const std::string& name) const { return _top + "/store/" + name; }
  std::string plain(const std::string& name) const { return _top + "/plain/" + name; }
  std::string source(const std::string& name) const { return _top + "/source/" + name; }

  std::string _top;
  FileLayer _files;
  StderrLog _log;
  std::unique_ptr<FileOperations> _operations;
  bool _missed = false;
};

}  // namespace
}  // namespace skein::vald

int main(int argc, char** argv) {
  const std::string base = argc > 1 ? argv[1] : "/var/tmp";
  const int gibibytes = argc > 2 ? std::atoi(argv[2]) : 1;
  if (argc > 3 || gibibytes < 1) {
    std::fprintf(stderr, "Usage: files_bench [FOLDER [GIB]]\n");
    return 2;
  }
  return skein::vald::Bench(base).run(static_cast<std::uint64_t>(gibibytes));
}
