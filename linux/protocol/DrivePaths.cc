#include "linux/protocol/DrivePaths.h"

#include <fcntl.h>
#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <memory>

#include "linux/protocol/DriveIdentity.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

// The variable's value when it is an absolute path; others are to be ignored.
std::string folderFromEnvironment(const char* variable) {
  const char* value = std::getenv(variable);
  return value != nullptr && value[0] == '/' ? value : std::string();
}

std::string homeFolder() {
  std::string home = folderFromEnvironment("HOME");
  if (home.empty()) {
    passwd entry{};
    passwd* found = nullptr;
    char buffer[4096];
    if (getpwuid_r(geteuid(), &entry, buffer, sizeof buffer, &found) == 0 && found != nullptr) {
      home = found->pw_dir;
    }
  }
  return home;
}

bool isFolder(const std::string& path) {
  struct stat status {};
  return stat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode);
}

NSErrorPtr makeFolder(const std::string& path, mode_t mode) {
  if (mkdir(path.c_str(), mode) == 0 || errno == EEXIST) return nullptr;
  return pathFailure(errno, "The folder " + path + " cannot be made");
}

NSErrorPtr makeFoldersAbove(const std::string& path) {
  for (std::size_t end = path.find('/', 1); end != std::string::npos;
       end = path.find('/', end + 1)) {
    const std::string above = path.substr(0, end);
    if (isFolder(above)) continue;
    if (NSErrorPtr error = makeFolder(above, 0700)) return error;
  }
  return nullptr;
}

// A folder that nobody else may enter: made when it is missing, refused when it belongs
// to somebody else or is no folder (a link is none), closed to others when it is open.
NSErrorPtr makePrivateFolder(const std::string& path) {
  if (NSErrorPtr error = makeFoldersAbove(path)) return error;
  if (NSErrorPtr error = makeFolder(path, 0700)) return error;
  struct stat status {};
  if (lstat(path.c_str(), &status) != 0) return pathFailure(errno, path + " cannot be looked at");
  if (!S_ISDIR(status.st_mode)) return pathFailure(ENOTDIR, path + " has to be a folder");
  if (status.st_uid != geteuid()) {
    return pathFailure(EACCES, path + " belongs to another user (number " +
                                   std::to_string(status.st_uid) + "); set XDG_STATE_HOME and " +
                                   "XDG_DATA_HOME to folders of your own");
  }
  if ((status.st_mode & 077) != 0 && chmod(path.c_str(), 0700) != 0) {
    return pathFailure(errno, path + " cannot be closed to other users");
  }
  return nullptr;
}

NSErrorPtr resolveStore(const std::string& store, std::string& resolved) {
  if (store.empty()) {
    return vl_errorWithPOSIXCode(EINVAL,
                                 "No drive was named: give --store FOLDER, or set SKEIN_STORE.");
  }
  const std::unique_ptr<char, decltype(&std::free)> real(realpath(store.c_str(), nullptr),
                                                         &std::free);
  if (real == nullptr) {
    return pathFailure(errno, "The drive's folder " + store + " cannot be opened");
  }
  if (!isFolder(real.get())) {
    return pathFailure(ENOTDIR, "The drive " + store + " has to be a folder");
  }
  resolved = real.get();
  return nullptr;
}

NSErrorPtr findTops(DriveTops& tops) {
  const std::string home = homeFolder();
  std::string state = folderFromEnvironment("XDG_STATE_HOME");
  if (state.empty() && !home.empty()) state = home + "/.local/state";
  std::string data = folderFromEnvironment("XDG_DATA_HOME");
  if (data.empty() && !home.empty()) data = home + "/.local/share";
  if (state.empty() || data.empty()) {
    return vl_errorWithPOSIXCode(ENOENT,
                                 "There is no home folder to keep the drive's state in: set HOME.");
  }
  tops = {state + "/skein", data + "/skein"};
  return nullptr;
}

// A drive within the folder of the states would be its own contents.
NSErrorPtr refuseOwnFolder(const std::string& store, const std::string& stateTop) {
  struct stat own {};
  if (stat(stateTop.c_str(), &own) != 0) return nullptr;
  for (std::string above = store; !above.empty(); above.resize(above.rfind('/'))) {
    struct stat status {};
    if (stat(above.c_str(), &status) != 0 || status.st_dev != own.st_dev ||
        status.st_ino != own.st_ino) {
      continue;
    }
    return vl_errorWithPOSIXCode(
        EINVAL, store + " cannot be a drive: the drives' own state is kept in " + stateTop +
                    "; choose a folder of documents.");
  }
  return nullptr;
}

NSErrorPtr fill(DrivePaths& paths, const std::string& store) {
  std::string resolved;
  if (NSErrorPtr error = resolveStore(store, resolved)) return error;
  DriveTops tops;
  if (NSErrorPtr error = findTops(tops)) return error;
  const std::string& stateTop = tops.state;
  const std::string& dataTop = tops.data;
  if (NSErrorPtr error = makePrivateFolder(stateTop)) return error;
  if (NSErrorPtr error = refuseOwnFolder(resolved, stateTop)) return error;
  NSErrorPtr problem;
  DriveIdentity identity = identityOfDrive(resolved, stateTop, dataTop, &problem);
  if (problem) return problem;

  paths.driveID = std::move(identity.name);
  paths.stateDirectory = stateTop + '/' + paths.driveID;
  paths.containersDirectory = dataTop + '/' + paths.driveID + "/containers";
  paths.cloudDirectory = dataTop + '/' + paths.driveID + "/cloud";
  paths.daemonSocket = paths.stateDirectory + kDaemonSocketName;
  paths.hostSocket = paths.stateDirectory + kHostSocketName;
  paths.daemonLock = paths.stateDirectory + kDaemonLockName;
  paths.hostLock = paths.stateDirectory + kHostLockName;
  paths.database = paths.stateDirectory + "/index.sqlite";
  paths.daemonLog = paths.stateDirectory + "/vald.log";
  paths.hostLog = paths.stateDirectory + "/skein-host.log";
  for (const std::string& folder :
       {paths.stateDirectory, paths.containersDirectory, paths.cloudDirectory}) {
    if (NSErrorPtr error = makePrivateFolder(folder)) return error;
  }
  paths.store = std::move(identity.path);
  paths.isNew = identity.isNew;
  return nullptr;
}

}  // namespace

DrivePaths DrivePaths::forStore(const std::string& store, NSErrorOut error) {
  DrivePaths paths;
  if (NSErrorPtr problem = fill(paths, store)) {
    error.store(std::move(problem));
    paths.store.clear();
  }
  return paths;
}

bool DrivePaths::isKnown(const std::string& store) {
  std::string resolved;
  DriveTops tops;
  return resolveStore(store, resolved) == nullptr && findTops(tops) == nullptr &&
         isKnownDrive(resolved, tops.state);
}

DriveTops DrivePaths::tops(NSErrorOut error) {
  DriveTops tops;
  if (NSErrorPtr problem = findTops(tops)) error.store(std::move(problem));
  return tops;
}

}  // namespace skein
