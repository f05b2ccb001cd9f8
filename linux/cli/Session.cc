#include "linux/cli/Session.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <iostream>

#include "linux/cli/ExitCodes.h"
#include "linux/cli/Output.h"
#include "linux/protocol/UploadConsent.h"
#include "vellum/VLErrors.h"

namespace skein::cli {
namespace {

bool isFolder(const std::string& path) {
  struct stat status {};
  return stat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode);
}

bool uploadsAreSet() {
  const char* text = std::getenv("SKEIN_UPLOADS");
  return text != nullptr && *text != '\0';
}

bool canAsk() { return isatty(STDIN_FILENO) == 1 && isatty(STDERR_FILENO) == 1; }

// Nothing: it is not to be opened.
std::optional<UploadConsent> askAbout(const std::string& path) {
  const std::string cloud = DrivePaths::tops(nullptr).data;
  std::fprintf(stderr,
               "%s was never opened as a drive. Opening it changes nothing in it, and keeps an "
               "index.\nIts documents can also be copied into a cloud below %s, up to 1 GiB (or "
               "without a bound\nwhere the file system shares blocks), so that they can be evicted "
               "and have thumbnails.\nOpen it? y: yes, and copy; o: open it only; anything else: "
               "no. ",
               escaped(path).c_str(), escaped(cloud).c_str());
  std::string answer;
  std::getline(std::cin, answer);
  if (answer == "y" || answer == "yes") return UploadConsent::Given;
  if (answer == "o") return UploadConsent::Refused;
  return std::nullopt;
}

}  // namespace

std::string DriveChoice::folder(NSErrorOut error) const {
  if (!store.empty()) {
    const auto drive = noted();
    return drive && drive->isThere ? drive->path : store;
  }
  const char* home = std::getenv("HOME");
  std::string folder = std::string(home != nullptr ? home : "") + "/Skein";
  struct stat status {};
  if (stat(folder.c_str(), &status) == 0) return folder;
  error.store(NSError::errorWithDomain(
      NSPOSIXErrorDomain, ENOENT,
      {{NSLocalizedDescriptionKey,
        "there is no drive: name its folder with --store DIR or SKEIN_STORE, or make the "
        "folder " +
            folder}}));
  return {};
}

DrivePaths DriveChoice::paths(NSErrorOut error) const {
  const std::string path = folder(error);
  if (path.empty()) return {};
  std::optional<UploadConsent> consent;
  if (canAsk() && !uploadsAreSet() && isFolder(path) && !DrivePaths::isKnown(path)) {
    consent = askAbout(path);
    if (!consent) {
      error.store(vl_errorWithPOSIXCode(ECANCELED, path + " was not opened."));
      return {};
    }
  }
  DrivePaths paths = DrivePaths::forStore(path, error);
  if (!paths.isNew) return paths;
  if (consent) {
    if (NSErrorPtr problem = setUploadConsent(paths.stateDirectory, *consent)) {
      error.store(std::move(problem));
      return {};
    }
    return paths;
  }
  complain(
      paths.store + " is a drive from now on. " +
      (uploadsAreSet()
           ? "Its documents are copied into " + paths.cloudDirectory + ", as SKEIN_UPLOADS says"
           : "Nothing is copied until you agree: \"skein cloud uploads on\" copies "
             "its documents into " +
                 paths.cloudDirectory) +
      "; \"skein forget\" undoes this");
  return paths;
}

std::optional<NotedDrive> DriveChoice::noted() const {
  if (store.empty() || store.find('/') != std::string::npos || isFolder(store)) return std::nullopt;
  for (NotedDrive& drive : notedDrives(DrivePaths::tops(nullptr).state)) {
    if (drive.name == store) return std::move(drive);
  }
  return std::nullopt;
}

DrivePaths DriveChoice::known(NSErrorOut error) const {
  if (const auto drive = noted(); drive && !drive->isThere) {
    DrivePaths paths;
    paths.store = drive->path.empty() ? drive->name : drive->path;
    paths.driveID = drive->name;
    paths.stateDirectory = DrivePaths::tops(nullptr).state + '/' + drive->name;
    paths.hostSocket = paths.stateDirectory + kHostSocketName;
    paths.daemonSocket = paths.stateDirectory + kDaemonSocketName;
    paths.hostLog = paths.stateDirectory + "/skein-host.log";
    paths.daemonLog = paths.stateDirectory + "/vald.log";
    return paths;
  }
  const std::string path = folder(error);
  if (path.empty()) return {};
  if (DrivePaths::isKnown(path)) return DrivePaths::forStore(path, error);
  error.store(vl_errorWithPOSIXCode(
      ENOENT, isFolder(path) ? path + " was never opened as a drive; \"skein drives\" lists those "
                                      "that were"
                             : "The drive's folder " + path + " cannot be opened: " +
                                   std::strerror(ENOENT) + "; \"skein drives\" lists the drives"));
  return {};
}

std::unique_ptr<Session> Session::open(const DriveChoice& drive, NSErrorOut error) {
  const DrivePaths paths = drive.paths(error);
  if (paths.store.empty()) return nullptr;
  return std::unique_ptr<Session>(new Session(paths));
}

Session::Session(const DrivePaths& paths)
    : _loop(RpcLoop::start("skein-io")),
      _executor(std::make_shared<ThreadPool>(2, "skein")),
      _host(makeHostClient(_loop, _executor, hostClientOptions(paths))) {}

bool isWorthAnotherTry(const NSErrorPtr& error, std::chrono::steady_clock::time_point begin) {
  using namespace std::chrono_literals;
  return error && exitCodeFor(error) == kUnreachable &&
         std::chrono::steady_clock::now() - begin < 1s;
}

}  // namespace skein::cli
