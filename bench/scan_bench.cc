// The store beside `find`: first scan, restart, pages, memory. Makes its own trees. Exits 1
// when a bar is missed.
//
//   scan_bench [FOLDERS FILES-PER-FOLDER FLAT-FILES]     9000 111 100000
//
// Processor time stands beside the clock's, since the clock also counts what else the
// machine does.
#include <fcntl.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "linux/vald/FolderStore.h"

namespace skein::vald {
namespace {

using namespace std::chrono_literals;
using Clock = std::chrono::steady_clock;

double secondsSince(Clock::time_point start) {
  return std::chrono::duration<double>(Clock::now() - start).count();
}

class ErrorLog final : public Log {
 public:
  void write(LogType, std::string_view line) override {
    std::fprintf(stderr, "%.*s\n", static_cast<int>(line.size()), line.data());
  }
};

class NoListener final : public StoreListener {
 public:
  void storeDidChange(const std::vector<StoreChange>&) override {}
  void storeDidOverflow(std::optional<VLFileObjectID>) override {}
};

void fill(const std::string& folder, int files) {
  std::filesystem::create_directories(folder);
  for (int i = 0; i < files; ++i) {
    char name[64];
    std::snprintf(name, sizeof name, "/document-%06d.txt", i * 7919 % 1'000'000);
    const int file = ::open((folder + name).c_str(), O_CREAT | O_WRONLY | O_CLOEXEC, 0600);
    if (file >= 0) ::close(file);
  }
}

double timed(const std::string& command) {
  const auto start = Clock::now();
  if (std::system(command.c_str()) != 0) std::fprintf(stderr, "failed: %s\n", command.c_str());
  return secondsSince(start);
}

double processorSeconds(int who) {
  rusage usage{};
  getrusage(who, &usage);
  const auto seconds = [](const timeval& time) {
    return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_usec) / 1e6;
  };
  return seconds(usage.ru_utime) + seconds(usage.ru_stime);
}

// Whether every figure so far kept its bar.
bool allKept = true;

void bar(const char* what, double figure, double most) {
  if (figure <= most) return;
  allKept = false;
  std::printf("  MISSED: %s is %.2f, at most %.2f is allowed\n", what, figure, most);
}

double bestOf(int times, const std::string& command) {
  double best = timed(command);
  for (int i = 1; i < times; ++i) best = std::min(best, timed(command));
  return best;
}

// Of this process now, in MB.
double residentMegabytes() {
  std::ifstream file("/proc/self/statm");
  double total = 0;
  double resident = 0;
  file >> total >> resident;
  return resident * static_cast<double>(sysconf(_SC_PAGESIZE)) / 1e6;
}

double peakMegabytes() {
  rusage usage{};
  getrusage(RUSAGE_SELF, &usage);
  return static_cast<double>(usage.ru_maxrss) / 1e3;
}

struct Opened {
  std::unique_ptr<Store> store;
  double firstListing = 0;
  double settled = 0;
};

Opened openTimed(const StoreOptions& options, StoreListener& listener, Log& log) {
  Opened opened;
  NSErrorPtr error;
  const auto start = Clock::now();
  opened.store = Store::open(options, listener, log, &error);
  if (!opened.store) {
    std::fprintf(stderr, "%s\n", error->localizedDescription().c_str());
    std::exit(1);
  }
  opened.store->listFolder(std::nullopt, SortOrder::Name, 0, 200, &error);
  opened.firstListing = secondsSince(start);
  if (!opened.store->settle(10min)) std::fprintf(stderr, "never settled\n");
  opened.settled = secondsSince(start);
  return opened;
}

void listPages(Store& store, VLFileObjectID folder, SortOrder order, const char* name,
               double baseline) {
  std::vector<double> pages;
  std::uint64_t offset = 0;
  std::size_t items = 0;
  const auto start = Clock::now();
  do {
    const auto page = Clock::now();
    const Page result = store.listFolder(folder, order, offset, 200, nullptr);
    pages.push_back(secondsSince(page) * 1e3);
    items += result.items.size();
    offset = result.nextOffset;
  } while (offset != 0);
  const double total = secondsSince(start);
  const auto median = [&](std::size_t from, std::size_t to) {
    std::vector<double> some(pages.begin() + static_cast<long>(from),
                             pages.begin() + static_cast<long>(to));
    std::sort(some.begin(), some.end());
    return some[some.size() / 2];
  };
  const std::size_t tenth = std::max<std::size_t>(1, pages.size() / 10);
  std::printf(
      "by %s: %zu items in %zu pages: %.3f s, find|sort %.3f s, ratio %.2f; page at the "
      "start %.3f ms, at the end %.3f ms, ratio %.2f\n",
      name, items, pages.size(), total, baseline, total / baseline, median(0, tenth),
      median(pages.size() - tenth, pages.size()),
      median(pages.size() - tenth, pages.size()) / median(0, tenth));
  bar("all pages over find|sort", total / baseline, 1.5);
  bar("the last pages over the first",
      median(pages.size() - tenth, pages.size()) / median(0, tenth), 1.5);
}

int run(int folders, int files, int flat) {
  const char* place = std::getenv("TMPDIR");
  std::string base = std::string(place != nullptr ? place : "/tmp") + "/skein-scan-bench-XXXXXX";
  if (mkdtemp(base.data()) == nullptr) return 1;
  ErrorLog log;
  NoListener listener;

  StoreOptions options;
  options.drive.path = base + "/tree";
  options.databasePath = base + "/tree.db";
  const int areas = std::max(1, folders / 100);
  for (int area = 0; area < areas; ++area) {
    for (int folder = 0; folder < folders / areas; ++folder) {
      fill(options.drive.path + "/area-" + std::to_string(area) + "/folder-" +
               std::to_string(folder),
           files);
    }
  }
  const std::string find = "find " + options.drive.path + " -printf '%f %s %T@\\n' > /dev/null";
  timed(find);
  const double walkBefore = processorSeconds(RUSAGE_CHILDREN);
  const double walk = bestOf(3, find);
  const double walkProcessor = (processorSeconds(RUSAGE_CHILDREN) - walkBefore) / 3;
  {
    const double before = processorSeconds(RUSAGE_SELF);
    Opened first = openTimed(options, listener, log);
    std::printf(
        "first scan of %d files in %d folders: %.2f s, find %.2f s, ratio %.2f; root "
        "listed after %.3f s; resident %.0f MB, peak %.0f MB; index %.0f MB\n",
        folders * files, folders, first.settled, walk, first.settled / walk, first.firstListing,
        residentMegabytes(), peakMegabytes(),
        static_cast<double>(std::filesystem::file_size(options.databasePath)) / 1e6);
    std::printf("  processor time %.2f s, find %.2f s, ratio %.2f\n",
                processorSeconds(RUSAGE_SELF) - before, walkProcessor,
                (processorSeconds(RUSAGE_SELF) - before) / walkProcessor);
    bar("first scan over find", first.settled / walk, 2.5);
    bar("the root's listing during the scan, in seconds", first.firstListing, 1.0);
    bar("peak memory in MB", peakMegabytes(), 300);
    std::fflush(stdout);
  }
  {
    Opened again = openTimed(options, listener, log);
    std::printf(
        "restart, nothing changed: root listed after %.3f s; verified after %.2f s, find "
        "%.2f s, ratio %.2f; resident %.0f MB\n",
        again.firstListing, again.settled, walk, again.settled / walk, residentMegabytes());
    bar("the first listing after a restart, in seconds", again.firstListing, 0.5);
    std::fflush(stdout);
  }

  options.drive.path = base + "/flat";
  options.databasePath = base + "/flat.db";
  fill(options.drive.path + "/folder", flat);
  const double sorted = bestOf(5, "find " + options.drive.path +
                                      "/folder -maxdepth 1 -printf '%f %s %T@\\n' | sort > "
                                      "/dev/null");
  Opened wide = openTimed(options, listener, log);
  const auto folder = wide.store->itemAtPath(options.drive.path + "/folder", false, nullptr);
  for (int i = 0; i < 3; ++i) {
    listPages(*wide.store, folder->fileObjectID(), SortOrder::Name, "name", sorted);
    listPages(*wide.store, folder->fileObjectID(), SortOrder::Date, "date", sorted);
  }
  wide.store.reset();
  std::filesystem::remove_all(base);
  return allKept ? 0 : 1;
}

}  // namespace
}  // namespace skein::vald

int main(int argc, char** argv) {
  const auto argument = [&](int index, int otherwise) {
    return argc > index ? std::max(1, std::atoi(argv[index])) : otherwise;
  };
  return skein::vald::run(argument(1, 9000), argument(2, 111), argument(3, 100'000));
}
