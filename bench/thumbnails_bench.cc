// A batch of 1,000 thumbnails from two zones through the whole drive (host, extension, socket,
// vald), beside reading the same pictures with nothing in between, in the same run; and how
// soon a cancelled batch ends. Exits 1 when a bar is missed.
#include <fcntl.h>
#include <sys/inotify.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <future>
#include <memory>
#include <string>
#include <vector>

#include "base/ThreadPool.h"
#include "extension/VLFileProviderExtension.h"
#include "linux/framework/LocalFramework.h"
#include "linux/host/LocalListeners.h"
#include "linux/host/ThumbnailRequests.h"
#include "linux/host/ThumbnailStream.h"
#include "linux/protocol/DaemonServer.h"
#include "linux/vald/Daemon.h"
#include "linux/vald/Drive.h"
#include "linux/vald/DriveListener.h"
#include "linux/vald/cloud/RecordFetches.h"
#include "linux/vald/shares/Shares.h"

namespace skein {
namespace {

namespace fs = std::filesystem;
using Clock = std::chrono::steady_clock;
using namespace std::chrono_literals;

constexpr std::size_t kItems = 1000;
constexpr std::size_t kPictureBytes = 120'000;
constexpr int kRounds = 9;
constexpr double kMostTimesTheBaseline = 2.0;
constexpr double kLongestEnd = 100;  // ms

class NoLog final : public Log {
 public:
  void write(LogType type, std::string_view line) override {
    if (type == LogType::Error || type == LogType::Fault) {
      std::fprintf(stderr, "%.*s\n", static_cast<int>(line.size()), line.data());
    }
  }
};

double milliseconds(Clock::duration time) {
  return std::chrono::duration<double, std::milli>(time).count();
}

double median(std::vector<double> times) {
  std::sort(times.begin(), times.end());
  return times[times.size() / 2];
}

class Folder {
 public:
  Folder() {
    // Each record is made durable: in memory ($TMPDIR) that takes no time.
    std::string name = fs::temp_directory_path() / "skein-thumbnails-bench-XXXXXX";
    if (mkdtemp(name.data()) == nullptr) std::abort();
    path = name;
    for (const char* below : {"drive", "state", "cloud", "pictures", "containers"}) {
      fs::create_directory(path / below);
    }
  }
  ~Folder() { fs::remove_all(path); }
  fs::path path;
};

// vald's core over a drive of 1,000 documents, with a record and a picture for each.
class Vald {
 public:
  explicit Vald(const fs::path& top) : _top(top) {
    for (std::size_t at = 0; at < kItems; ++at) {
      std::ofstream(top / "drive" / (std::to_string(at) + ".txt")) << at;
    }
    NSErrorPtr error;
    DriveOptions options;
    options.store.databasePath = top / "state/index.sqlite";
    options.store.drive.path = top / "drive";
    options.stateDirectory = top / "state";
    options.cloud.folder = top / "cloud";
    options.cloud.policy.uploads = LocalCloudStatus::Uploads::Off;
    drive = Drive::open(std::move(options), listener, layer, log, &error);
    if (!drive || !drive->store().settle(60s)) std::abort();
    addRecords();
    shareRecords = std::move(*vald::ShareRecords::open(top / "state/shares.sqlite"));
    shares = std::make_shared<vald::Shares>(
        vald::SharesParts{executor, drive->store(), *shareRecords, sharedItems, accounts(),
                          containers, log, (top / "drive").string()});
    fetches = std::make_unique<vald::RecordFetches>(vald::RecordFetches::Parts{
        executor, drive->cloud().records(), drive->cloud().conditions(), clock, faults});
    daemon = std::make_shared<vald::Daemon>(vald::DaemonParts{
        executor, executor, drive->store(), senders, accounts(), containers, subscribers,
        drive->files(), *fetches, *shares, drive->cloud(), faults, log, (top / "drive").string(),
        [] {}, [](const std::vector<vald::StoreRoot>&) {}});
    server = DaemonServer::listen(loop, executor, daemon, socket(), log, &error);
    if (!server) std::abort();
  }

  std::string socket() const { return _top / "socket"; }
  std::string picture(std::size_t at) const { return _top / "pictures" / std::to_string(at); }

  using Drive = vald::Drive;
  using DriveOptions = vald::DriveOptions;
  const fs::path _top;
  std::vector<std::string> identifiers;
  NoLog log;
  std::shared_ptr<Executor> executor = std::make_shared<ThreadPool>(4, "vald");
  std::shared_ptr<RpcLoop> loop = RpcLoop::start("vald-io");
  vald::ItemUpdateSenders senders{executor};
  vald::DriveListener listener{senders};
  vald::EventSubscribers subscribers{executor};
  vald::FileLayer layer;
  vald::FaultInjector faults{false};
  vald::SystemCloudClock clock;
  vald::SharedItems sharedItems;
  vald::Containers containers{{(_top / "drive").string(), (_top / "containers").string(), {}}, log};
  std::unique_ptr<Drive> drive;
  std::unique_ptr<vald::RecordFetches> fetches;

 private:
  vald::Accounts& accounts() {
    if (!_accounts) _accounts = std::make_unique<vald::Accounts>(drive->store(), "bench", log);
    return *_accounts;
  }

  void addRecords() {
    const std::string bytes(kPictureBytes, 'p');
    auto& records = drive->cloud().records();
    for (std::size_t at = 0; at < kItems; ++at) {
      const std::string path = _top / "drive" / (std::to_string(at) + ".txt");
      const auto item = drive->store().itemAtPath(path, false, nullptr);
      if (!item) std::abort();
      std::ofstream(picture(at), std::ios::binary) << bytes;
      vald::CloudRecord record;
      record.document = item->fileObjectID();
      if (at % 2 == 1) record.zone = {"trip", "ada"};
      record.contents.size = 1;
      if (!records.put(record, {}, vald::CloudContents::Hold())) std::abort();
      records.setThumbnail(record.document, record.contents.hash, picture(at));
      identifiers.push_back(item->itemIdentifier());
    }
  }

  std::unique_ptr<vald::ShareRecords> shareRecords;
  std::unique_ptr<vald::Accounts> _accounts;
  std::shared_ptr<vald::Shares> shares;
  std::shared_ptr<vald::Daemon> daemon;
  std::unique_ptr<DaemonServer> server;
};

// skein-host's side.
class Host {
 public:
  explicit Host(const std::string& socket) {
    DaemonClient::Options options;
    options.socketPath = socket;
    framework = std::make_unique<LocalFramework>(loop, executor, center, log, options);
    const DaemonProxies proxies = [client = framework->client()](auto errorHandler) {
      return client->remoteObjectProxyWithErrorHandler(std::move(errorHandler));
    };
    host = std::make_shared<FileProviderHost>(HostTools{executor, timers}, nullptr, log);
    environment = std::make_unique<Environment>(Environment{log,
                                                            executor,
                                                            center,
                                                            *host,
                                                            framework->accounts(),
                                                            framework->containers(),
                                                            framework->daemonConnection(),
                                                            framework->documents(),
                                                            framework->queryItems(),
                                                            sections,
                                                            rootURL,
                                                            framework->fileOperations(),
                                                            framework->fileManager(),
                                                            framework->operations(),
                                                            framework->cloud(),
                                                            framework->systemThumbnails(),
                                                            framework->remoteDefaults(),
                                                            framework->downloads(),
                                                            framework->bundles(),
                                                            framework->sharingOperations(),
                                                            framework->resourceValues(),
                                                            listeners,
                                                            log});
    extension =
        VLFileProviderExtension::init(std::make_shared<NSExtensionAttributes>(), *environment);
    host->setExtension(extension);
    drive = std::make_shared<DriveRequests>(host, proxies, framework->containers());
    thumbnails = std::make_unique<ThumbnailRequests>(drive);
  }

  NoLog log;
  std::shared_ptr<Executor> executor = std::make_shared<ThreadPool>(4, "host");
  std::shared_ptr<Timers> timers = std::make_shared<SteadyTimers>(executor);
  std::shared_ptr<RpcLoop> loop = RpcLoop::start("host-io");
  NSNotificationCenter center;
  VLLogSections sections{executor};
  RootURL rootURL;
  LocalListeners listeners{executor};
  std::unique_ptr<LocalFramework> framework;
  std::shared_ptr<FileProviderHost> host;
  std::unique_ptr<Environment> environment;
  std::shared_ptr<VLFileProviderExtension> extension;
  std::shared_ptr<DriveRequests> drive;
  std::unique_ptr<ThumbnailRequests> thumbnails;
};

// The whole batch, as a client of the host takes it out; the bytes that came.
std::size_t runBatch(Host& host, const std::vector<std::string>& identifiers) {
  std::vector<HostTarget> targets;
  targets.reserve(identifiers.size());
  for (const std::string& id : identifiers) targets.push_back(HostTarget::identifier(id));
  std::promise<std::shared_ptr<HostThumbnailBatch>> begun;
  host.thumbnails->fetchThumbnails(
      targets, {120, 120}, [&](std::shared_ptr<HostThumbnailBatch> batch, const NSErrorPtr&) {
        begun.set_value(std::move(batch));
      });
  const auto batch = begun.get_future().get();
  std::size_t bytes = 0;
  for (bool isLast = false; batch && !isLast;) {
    std::promise<HostThumbnailStep> next;
    batch->next(
        [&](HostThumbnailStep step, const NSErrorPtr&) { next.set_value(std::move(step)); });
    const HostThumbnailStep step = next.get_future().get();
    for (const auto& thumbnail : step.thumbnails) {
      bytes += thumbnail.data ? thumbnail.data->length() : 0;
    }
    isLast = step.finished;
  }
  return bytes;
}

// The baseline: every picture's file into memory, one after the other.
std::size_t readPictures(const Vald& vald) {
  std::size_t bytes = 0;
  for (std::size_t at = 0; at < kItems; ++at) {
    const int file = open(vald.picture(at).c_str(), O_RDONLY | O_CLOEXEC);
    std::vector<char> data(kPictureBytes);
    bytes += static_cast<std::size_t>(std::max<ssize_t>(read(file, data.data(), data.size()), 0));
    close(file);
  }
  return bytes;
}

// Counts what is opened in a folder: its files, not itself.
class OpenCounter {
 public:
  explicit OpenCounter(const std::string& folder)
      : _events(inotify_init1(IN_NONBLOCK | IN_CLOEXEC)) {
    if (inotify_add_watch(_events, folder.c_str(), IN_OPEN) < 0) std::abort();
  }
  ~OpenCounter() { close(_events); }
  int count() const {
    int opened = 0;
    alignas(inotify_event) char buffer[64 * 1024];
    for (ssize_t got = 0; (got = read(_events, buffer, sizeof buffer)) > 0;) {
      for (ssize_t at = 0; at < got;) {
        const auto* event = reinterpret_cast<const inotify_event*>(buffer + at);
        opened += event->len > 0 ? 1 : 0;
        at += static_cast<ssize_t>(sizeof(inotify_event) + event->len);
      }
    }
    return opened;
  }

 private:
  const int _events;
};

// How long after the last thumbnail, in ms, a batch that is cancelled in its middle ends; how
// often it ended goes to `ends`.
double cancelInTheMiddle(Host& host, const std::vector<std::string>& identifiers, int& ends) {
  std::atomic<int> came{0};
  std::atomic<int> ended{0};
  std::atomic<Clock::rep> last{0};
  std::promise<void> half;
  std::promise<Clock::time_point> end;
  const auto progress = host.extension->fetchThumbnailsForItemIdentifiersWithType(
      identifiers, {120, 120},
      [&](auto&&...) {
        last = Clock::now().time_since_epoch().count();
        if (++came == static_cast<int>(kItems / 2)) half.set_value();
      },
      [&](const NSErrorPtr&) {
        if (++ended == 1) end.set_value(Clock::now());
      });
  half.get_future().wait();
  progress->cancel();
  const auto moment = end.get_future().get();
  // A second end would come now: everything that is posted has run once this has.
  runBatch(host, {identifiers.front()});
  ends = ended;
  return milliseconds(moment.time_since_epoch() - Clock::duration(last.load()));
}

int run() {
  ThumbnailStream::keepMemoryForPictures();  // as skein-host does
  const Folder folder;
  Vald vald(folder.path);
  Host host(vald.socket());
  const std::size_t expected = kItems * kPictureBytes;
  if (readPictures(vald) != expected || runBatch(host, vald.identifiers) != expected) {
    std::printf("not every picture came\n");
    return 1;
  }

  const OpenCounter opens(folder.path / "drive");
  const auto resolutions = vald.fetches->resolutions();
  const auto fetches = vald.fetches->fetches();
  std::vector<double> read;
  std::vector<double> batch;
  for (int round = 0; round < kRounds; ++round) {
    auto begin = Clock::now();
    readPictures(vald);
    read.push_back(milliseconds(Clock::now() - begin));
    begin = Clock::now();
    runBatch(host, vald.identifiers);
    batch.push_back(milliseconds(Clock::now() - begin));
  }
  const double ratio = median(batch) / median(read);
  const auto asked = vald.fetches->resolutions() - resolutions;
  const auto fetched = vald.fetches->fetches() - fetches;
  const int opened = opens.count();
  std::printf("%zu thumbnails of %zu kB in two zones, median of %d\n", kItems, kPictureBytes / 1000,
              kRounds);
  std::printf("  batch through the drive   %7.1f ms\n", median(batch));
  std::printf("  reading the same files    %7.1f ms   ratio %.2f (at most %.1f)\n", median(read),
              ratio, kMostTimesTheBaseline);
  std::printf("  per batch: %.1f resolutions, %.1f fetches; files opened in the store: %d\n",
              static_cast<double>(asked) / kRounds, static_cast<double>(fetched) / kRounds, opened);

  std::vector<double> delays;
  bool isOnce = true;
  for (int round = 0; round < kRounds; ++round) {
    int ends = 0;
    delays.push_back(cancelInTheMiddle(host, vald.identifiers, ends));
    isOnce = isOnce && ends == 1;
  }
  const double slowest = *std::max_element(delays.begin(), delays.end());
  std::printf("cancelled in its middle: ends %.2f ms after the last thumbnail (at most %.0f), %s\n",
              slowest, kLongestEnd, isOnce ? "once each time" : "NOT ONCE");
  const bool isGood = ratio <= kMostTimesTheBaseline && slowest <= kLongestEnd && isOnce &&
                      asked == kRounds && fetched == 2 * kRounds && opened == 0;
  return isGood ? 0 : 1;
}

}  // namespace
}  // namespace skein

int main() { return skein::run(); }
