// What an item's services cost a client process, with the real programs on a drive of this
// program's own: a service's round trip beside the transport's, and rounds of endpoint,
// connect, request and close from several processes, with what skein-host holds before and
// after. Exits 1 when a bar is missed.
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <future>
#include <string>
#include <vector>

#include "base/ThreadPool.h"
#include "linux/client/SkeinServices.h"
#include "linux/protocol/DrivePaths.h"
#include "linux/protocol/SocketClient.h"
#include "linux/protocol/host.capnp.h"

namespace skein {
namespace {

using Clock = std::chrono::steady_clock;

constexpr int kCalls = 2000;
constexpr int kProcesses = 4;
constexpr int kRounds = 1000;
constexpr double kMostRatio = 3;

double median(std::vector<double> times) {
  std::nth_element(times.begin(), times.begin() + static_cast<long>(times.size() / 2), times.end());
  return times[times.size() / 2];
}
template <class Run>
double timed(Run run) {
  const auto start = Clock::now();
  run();
  return std::chrono::duration<double, std::micro>(Clock::now() - start).count();
}

// A message that skein-host answers on the thread that reads it.
void callHost(SocketClient& socket) {
  std::promise<void> done;
  socket.send(
      [&](capnp::Capability::Client host) {
        return host.castAs<wire::Host>().servicesRequest().send().then(
            [&](auto&&) -> Task { return [&] { done.set_value(); }; });
      },
      [&](const NSErrorPtr&) { std::abort(); });
  done.get_future().wait();
}

// One client process: endpoint, connect, request, close. Answers how many were served.
int serveRounds(const std::string& store, int rounds) {
  NSErrorPtr error;
  const auto services = SkeinServices::open(store, &error);
  int served = 0;
  for (int i = 0; i < rounds; ++i) {
    const auto sharing = services->sharing("/letter.txt", &error);
    if (!sharing) continue;
    const auto [shared, item, problem] = awaitReply<bool, NSFileProviderItemPtr>(
        [&](auto reply) { sharing->fetchSharingInfo(std::move(reply)); });
    if (!problem) ++served;
  }
  return served;
}

struct Holdings {
  std::size_t descriptors = 0;
  long kilobytes = 0;
};
Holdings holdingsOf(pid_t process) {
  Holdings holdings;
  const std::string folder = "/proc/" + std::to_string(process);
  const std::filesystem::directory_iterator open(folder + "/fd");
  holdings.descriptors = static_cast<std::size_t>(std::distance(begin(open), end(open)));
  std::ifstream status(folder + "/status");
  for (std::string line; std::getline(status, line);) {
    if (line.starts_with("VmRSS:")) holdings.kilobytes = std::atol(line.c_str() + 6);
  }
  return holdings;
}

// The number of served rounds of all processes together.
int runProcesses(const std::string& program, const std::string& store, int rounds) {
  std::vector<FILE*> processes;
  for (int i = 0; i < kProcesses; ++i) {
    const std::string line =
        program + " --rounds " + std::to_string(rounds / kProcesses) + " '" + store + "'";
    processes.push_back(popen(line.c_str(), "r"));
  }
  int served = 0;
  for (FILE* process : processes) {
    int count = 0;
    if (fscanf(process, "%d", &count) == 1) served += count;
    pclose(process);
  }
  return served;
}

pid_t hostProcess(const DrivePaths& paths) {
  for (const auto& entry : std::filesystem::directory_iterator("/proc")) {
    const std::string name = entry.path().filename();
    if (name.find_first_not_of("0123456789") != std::string::npos) continue;
    std::ifstream file(entry.path() / "cmdline");
    const std::string line((std::istreambuf_iterator<char>(file)), {});
    if (line.find("skein-host") != std::string::npos &&
        line.find(paths.store) != std::string::npos) {
      return static_cast<pid_t>(std::atol(name.c_str()));
    }
  }
  return -1;
}

int run(const std::string& program) {
  std::string folder = "/tmp/skein-services-bench-XXXXXX";
  if (mkdtemp(folder.data()) == nullptr) return 1;
  for (const char* part : {"store", "run", "state", "data"}) {
    std::filesystem::create_directory(folder + '/' + part);
  }
  std::filesystem::permissions(folder + "/run", std::filesystem::perms::owner_all);
  setenv("XDG_RUNTIME_DIR", (folder + "/run").c_str(), 1);
  setenv("XDG_STATE_HOME", (folder + "/state").c_str(), 1);
  setenv("XDG_DATA_HOME", (folder + "/data").c_str(), 1);
  const std::string bin = std::filesystem::path(program).parent_path().parent_path() / "bin";
  setenv("PATH", (bin + ":" + std::getenv("PATH")).c_str(), 1);
  const std::string store = folder + "/store";
  std::ofstream(store + "/letter.txt") << "hello";

  NSErrorPtr error;
  const auto services = SkeinServices::open(store, &error);
  const auto collaboration = services->collaboration("/letter.txt", &error);
  const auto sharing = services->sharing("/letter.txt", &error);
  if (!collaboration || !sharing) {
    std::fprintf(stderr, "services_bench: %s\n", error->localizedDescription().c_str());
    return 1;
  }
  const DrivePaths paths = DrivePaths::forStore(store, &error);
  SocketClient socket(RpcLoop::start("bench-io"), std::make_shared<ThreadPool>(2, "bench"),
                      {"skein-host", paths.hostSocket, std::nullopt, std::chrono::seconds(4)});
  const auto askVersion = [&] {
    awaitReply<std::uint64_t, std::uint64_t>([&](auto reply) {
      collaboration->fetchVersionAndCapabilitiesWithCompletionHandler(std::move(reply));
    });
  };
  const auto askShared = [&] {
    awaitReply<bool, NSFileProviderItemPtr>(
        [&](auto reply) { sharing->fetchSharingInfo(std::move(reply)); });
  };
  // In turns, so that what else the machine does counts for all of them.
  std::vector<double> bare, version, shared;
  for (int i = 0; i < kCalls + 100; ++i) {
    const double one = timed([&] { callHost(socket); });
    const double two = timed(askVersion);
    const double three = timed(askShared);
    if (i < 100) continue;  // warm
    bare.push_back(one);
    version.push_back(two);
    shared.push_back(three);
  }
  const double ratio = median(version) / median(bare);
  std::printf("medians of %d, in microseconds\n", kCalls);
  std::printf("transport             %8.1f\n", median(bare));
  std::printf("service               %8.1f   ratio %.2f (at most %.0f)\n", median(version), ratio,
              kMostRatio);
  std::printf("service that asks vald %7.1f   ratio %.2f\n", median(shared),
              median(shared) / median(bare));

  const pid_t host = hostProcess(paths);
  runProcesses(program, store, 200);  // warm
  const Holdings before = holdingsOf(host);
  const auto start = Clock::now();
  const int served = runProcesses(program, store, kRounds);
  const double seconds = std::chrono::duration<double>(Clock::now() - start).count();
  // Whoever is gone is noticed soon, by messages of others too.
  Holdings after = holdingsOf(host);
  for (int i = 0; i < 1000 && after.descriptors > before.descriptors; ++i) {
    askVersion();
    after = holdingsOf(host);
  }
  std::printf("%d of %d rounds by %d processes in %.1f s\n", served, kRounds, kProcesses, seconds);
  std::printf(
      "skein-host            %5zu descriptors before, %zu after; %ld kB before, %ld after\n",
      before.descriptors, after.descriptors, before.kilobytes, after.kilobytes);
  const bool isBack = after.descriptors <= before.descriptors &&
                      after.kilobytes <= before.kilobytes + before.kilobytes / 10;
  std::system((bin + "/skein --store '" + store + "' stop >/dev/null").c_str());
  std::filesystem::remove_all(folder);
  return ratio <= kMostRatio && served == kRounds && isBack ? 0 : 1;
}

}  // namespace
}  // namespace skein

int main(int argc, char** argv) {
  if (argc == 4 && std::string(argv[1]) == "--rounds") {
    std::printf("%d\n", skein::serveRounds(argv[3], std::atoi(argv[2])));
    return 0;
  }
  return skein::run(std::filesystem::read_symlink("/proc/self/exe"));
}
