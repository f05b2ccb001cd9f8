// vald: the daemon of one drive.
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <memory>
#include <string>
#include <string_view>
#include <system_error>
#include <utility>
#include <vector>

#include "linux/desktop/DesktopEntries.h"
#include "linux/protocol/DaemonServer.h"
#include "linux/protocol/Deadlines.h"
#include "linux/protocol/DrivePaths.h"
#include "linux/protocol/LeftOutNote.h"
#include "linux/protocol/LogFile.h"
#include "linux/protocol/RpcLoop.h"
#include "linux/protocol/RunLock.h"
#include "linux/protocol/StandardDescriptors.h"
#include "linux/protocol/UploadConsent.h"
#include "linux/vald/Accounts.h"
#include "linux/vald/ApplicationsWatcher.h"
#include "linux/vald/Background.h"
#include "linux/vald/ClosableExecutor.h"
#include "linux/vald/CommandLine.h"
#include "linux/vald/Containers.h"
#include "linux/vald/Daemon.h"
#include "linux/vald/Drive.h"
#include "linux/vald/DriveListener.h"
#include "linux/vald/EventSubscribers.h"
#include "linux/vald/FaultInjector.h"
#include "linux/vald/FolderLock.h"
#include "linux/vald/ItemUpdateSenders.h"
#include "linux/vald/MovedDrive.h"
#include "linux/vald/Store.h"
#include "linux/vald/cloud/RecordFetches.h"
#include "linux/vald/files/DatabaseFile.h"
#include "linux/vald/files/FileNames.h"
#include "linux/vald/files/OwnFolders.h"
#include "linux/vald/scan/FolderReader.h"
#include "linux/vald/shares/Shares.h"
#include "linux/vald/shares/SharingStore.h"

namespace skein::vald {
namespace {

constexpr std::size_t kWorkers = 4;
constexpr std::chrono::milliseconds kQuietApplications{300};
constexpr std::chrono::milliseconds kPatienceWithPredecessor{3000};
// One whose state was moved away is about to end. Two of these are over before whoever starts this
// process has waited for too long.
constexpr std::chrono::milliseconds kPatienceWithOtherState{1200};
static_assert(2 * kPatienceWithOtherState < deadlines::kProgramStart);
// What clients have to read what was answered last.
constexpr std::chrono::milliseconds kLastReply{200};

// As many descriptors as the system lets it have: clients and folders each cost
// some.
void raiseDescriptorLimit() {
  rlimit limit{};
  if (getrlimit(RLIMIT_NOFILE, &limit) != 0 || limit.rlim_cur == limit.rlim_max) return;
  limit.rlim_cur = limit.rlim_max;
  setrlimit(RLIMIT_NOFILE, &limit);
}

// Blocks the signals that end the process in order, in this thread and those it
// starts.
sigset_t takeEndingSignals() {
  sigset_t signals;
  sigemptyset(&signals);
  for (const int signal : {SIGTERM, SIGINT, SIGHUP}) sigaddset(&signals, signal);
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);
  std::signal(SIGPIPE, SIG_IGN);
  return signals;
}

bool faultsAreAllowed() {
  const char* value = std::getenv("SKEIN_ALLOW_FAULTS");
  return value != nullptr && std::string_view(value) == "1";
}

// What this system writes by itself: every drive's state and cloud, and the desktop's
// thumbnails, since those of documents are put there.
std::vector<std::string> ownFoldersOf(const DrivePaths& paths) {
  std::vector<std::string> folders{parentOfPath(paths.stateDirectory),
                                   parentOfPath(parentOfPath(paths.cloudDirectory))};
  if (std::string thumbnails = DesktopThumbnails::userFolder(); !thumbnails.empty()) {
    // They are told by their inode, so it has to be there before it is written to.
    std::error_code ignored;
    std::filesystem::create_directories(thumbnails, ignored);
    folders.push_back(std::move(thumbnails));
  }
  return folders;
}

// Where a file manager puts what it trashes from the drive: into the user's own trash, or that of
// the drive's volume. The trashes within the drive are the drive's.
std::vector<std::string> desktopTrashes(const DrivePaths& paths) {
  const std::string data = parentOfPath(parentOfPath(parentOfPath(paths.cloudDirectory)));
  std::string volume = paths.store;
  struct stat drive {};
  struct stat above {};
  if (stat(volume.c_str(), &drive) == 0) {
    while (!volume.empty() && stat((volume + "/..").c_str(), &above) == 0 &&
           above.st_dev == drive.st_dev) {
      volume = parentOfPath(volume);
    }
  }
  const std::string user = std::to_string(geteuid());
  return {joinPath(data, "Trash"), volume + "/.Trash-" + user, volume + "/.Trash/" + user};
}

// Anew when the database is damaged, which may show only when it is read.
Outcome<std::unique_ptr<ShareRecords>> openShares(const std::string& path, Log& log) {
  {
    auto records = ShareRecords::open(path);
    if (records && (*records)->shares() && (*records)->zones() && (*records)->untold()) {
      return records;
    }
  }
  setAsideWhenDamaged(path, log);
  return ShareRecords::open(path);
}

// What is so now, beside what was so at the start.
std::vector<std::string> notesOf(const DrivePaths& paths, std::vector<std::string> notes,
                                 const Containers& containers, Drive& drive) {
  for (const std::string& folder : {paths.stateDirectory, paths.cloudDirectory}) {
    for (std::string& note : notesOfDatabasesSetAside(folder)) notes.push_back(std::move(note));
  }
  for (const StoreRoot& root : containers.storeRoots()) {
    int code = 0;
    if (findRoot(root.path, code)) continue;
    notes.push_back("the documents folder " + root.path + " of " + root.displayName +
                    " cannot be opened: " + std::strerror(code));
  }
  if (std::string problem = drive.cloud().thumbnailProblem(); !problem.empty()) {
    notes.push_back("no thumbnails are drawn: " + problem);
  }
  return notes;
}

// Serves until a signal comes. The exit status.
int serve(const DrivePaths& paths, Background& background, Log& log) {
  const sigset_t signals = takeEndingSignals();
  raiseDescriptorLimit();
  const auto fail = [&](const NSErrorPtr& error) {
    VL_ERROR(log, "[ERROR] vald can't serve %@: %@", paths.store, error->localizedDescription());
    background.failed(error->localizedDescription());
    return kExitFailure;
  };

  const auto ownFolders = ownFoldersOf(paths);
  setOwnFolders(ownFolders);
  std::vector<std::string> notes;
  for (const std::string& folder : foldersBelow(paths.store, ownFolders)) {
    notes.push_back(noteOfLeftOut(folder));
  }
  const auto executor = std::make_shared<ClosableExecutor>(kWorkers, "vald");
  const auto slowExecutor = std::make_shared<ClosableExecutor>(1, "vald-slow");
  const ContainerFolders containerFolders{paths.store, paths.containersDirectory,
                                          applicationFolders()};
  ItemUpdateSenders senders(executor);
  DriveListener listener(senders);
  EventSubscribers subscribers(executor);
  Containers containers(containerFolders, log);

  NSErrorPtr error = followMovedDrive(paths.stateDirectory, paths.cloudDirectory, paths.store);
  if (error) VL_ERROR(log, "[ERROR] %@", error->localizedDescription());
  error = nullptr;
  StoreOptions options;
  options.databasePath = paths.database;
  options.drive.path = paths.store;
  options.containers = containers.storeRoots();
  const bool mayFail = faultsAreAllowed();
  Cloud::Options cloud;
  cloud.folder = paths.cloudDirectory;
  cloud.policy = UploadPolicy::fromEnvironment();
  cloud.mayUpload = [state = paths.stateDirectory] {
    return uploadConsentOf(state) == UploadConsent::Given;
  };
  cloud.allowsConditions = mayFail;
  cloud.desktopThumbnails = DesktopThumbnails::userFolder();
  cloud.drives = parentOfPath(parentOfPath(paths.cloudDirectory));
  cloud.trashes = desktopTrashes(paths);
  FileLayer layer;
  SharedItems sharedItems;
  SharingListener sharingListener(sharedItems, listener);
  auto records = openShares(paths.stateDirectory + "/shares.sqlite", log);
  if (!records) return fail(records.error());
  const std::unique_ptr<Drive> drive =
      Drive::open({std::move(options), paths.stateDirectory, std::move(cloud)}, sharingListener,
                  layer, log, &error);
  if (!drive) return fail(error);
  SharingStore store(drive->store(), sharingListener, sharedItems);

  Accounts accounts(store, loginName(), log);
  const auto shares = std::make_shared<Shares>(
      SharesParts{executor, store, **records, sharedItems, accounts, containers, log, paths.store,
                  [&drive](const std::string& path, std::uint64_t document) {
                    drive->operations().writeHint(path, document);
                  }});
  sharingListener.setCoverageHandler([weak = std::weak_ptr(shares)](VLFileObjectID folder) {
    if (const auto changed = weak.lock()) changed->coverageDidChange(folder);
  });
  if (NSErrorPtr unreadable = shares->load()) {
    executor->close();
    return fail(unreadable);
  }
  std::atomic<bool> wasToldToStop{false};
  const auto stop = [&wasToldToStop] {
    wasToldToStop.store(true);
    kill(getpid(), SIGTERM);
  };
  const auto faults = std::make_shared<FaultInjector>(mayFail);
  SystemCloudClock clock;
  RecordFetches recordFetches({executor, drive->cloud().records(), drive->cloud().conditions(),
                               clock, *faults, [&shares] { return shares->attachedZoneFinder(); }});
  auto daemon = std::make_shared<Daemon>(DaemonParts{
      executor, slowExecutor, store, senders, accounts, containers, subscribers, drive->files(),
      recordFetches, *shares, drive->cloud(), *faults, log, paths.store, stop,
      [&drive](const std::vector<StoreRoot>& roots) { drive->containersWillChange(roots); },
      [&] { return notesOf(paths, notes, containers, *drive); }});
  listener.setAfterFolderChange([weak = std::weak_ptr<Daemon>(daemon)] {
    if (const auto changed = weak.lock()) changed->refreshDriveFolders();
  });

  const auto loop = RpcLoop::start("vald-io");
  auto server = DaemonServer::listen(loop, executor, daemon, paths.daemonSocket, log, &error,
                                     faults, [] { kill(getpid(), SIGTERM); });
  if (!server) {
    executor->close();
    slowExecutor->close();
    drive->close();
    return fail(error);
  }
  {
    const ApplicationsWatcher watcher(
        containerFolders.applications, kQuietApplications,
        [&daemon] { daemon->refreshContainers(); }, log);
    VL_NOTICE(log, "[NOTICE] vald serves %@", paths.store);
    background.isReady();

    int signal = 0;
    sigwait(&signals, &signal);
    if (wasToldToStop.load()) {
      VL_NOTICE(log, "[NOTICE] vald ends as it was told to");
    } else {
      VL_NOTICE(log, "[NOTICE] vald ends after signal %d", signal);
    }
  }

  // From the outside in: no more calls come, those that came are answered, and with the
  // last work done nothing asks the store any more, which then closes its index.
  server->finish(kLastReply);
  server.reset();
  executor->close();
  slowExecutor->close();
  drive->close();
  return EXIT_SUCCESS;
}

int run(const std::vector<std::string>& arguments) {
  std::string problem;
  const auto line = parseCommandLine(arguments, problem);
  if (!line) {
    std::fprintf(stderr, "vald: %s; \"vald --help\" tells more\n", problem.c_str());
    return kExitUsage;
  }
  if (line->help) {
    std::fputs(helpText(), stdout);
    return EXIT_SUCCESS;
  }

  NSErrorPtr error;
  const DrivePaths paths = DrivePaths::forStore(line->store, &error);
  RunLock lock;
  if (!paths.store.empty()) {
    const auto outcome =
        lock.take(paths.daemonLock, paths.daemonSocket, kPatienceWithPredecessor, &error);
    if (outcome == RunLock::Outcome::AlreadyRunning) {
      std::fprintf(stderr, "vald: another vald serves the drive %s already\n", paths.store.c_str());
      return EXIT_SUCCESS;
    }
  }
  if (error) {
    std::fprintf(stderr, "vald: %s\n", error->localizedDescription().c_str());
    return kExitFailure;
  }

  Background background = line->foreground ? Background() : Background::enter(paths.daemonLog);
  lock.writeProcessID();
  // Who set how much is uploaded was not asked, but has said so.
  if (UploadPolicy::isSet() &&
      UploadPolicy::fromEnvironment().uploads != LocalCloudStatus::Uploads::Off) {
    setUploadConsent(paths.stateDirectory, UploadConsent::Given);
  }
  // The lock above is the state's. What is served may be reached by another state, too. Taken by
  // the process that goes on, since the system names who holds them.
  FolderLock cloudLock;
  FolderLock driveLock;
  error = cloudLock.take(paths.cloudDirectory, kPatienceWithOtherState);
  if (!error) error = driveLock.take(paths.store, kPatienceWithOtherState);
  const auto log = error ? nullptr : LogFile::open({paths.daemonLog, line->foreground}, &error);
  if (!log) {
    background.failed(error->localizedDescription());
    return kExitFailure;
  }
  setLogLevel(*log, line->logLevel);
  LogFile::takeFaults(log);
  return serve(paths, background, *log);
}

}  // namespace
}  // namespace skein::vald

int main(int argc, char** argv) {
  skein::openStandardDescriptors();
  return skein::vald::run(std::vector<std::string>(argv + 1, argv + argc));
}
