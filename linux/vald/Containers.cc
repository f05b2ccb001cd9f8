#include "linux/vald/Containers.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <system_error>
#include <utility>

#include "linux/vald/files/FileErrors.h"
#include "vellum/VLErrors.h"

namespace skein::vald {
namespace {

// A link is no folder here: the store does not follow links.
bool isFolder(const std::string& path) {
  struct stat status {};
  return lstat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode);
}

// Makes `path`, whose parent exists. 0 or what went wrong.
int makeFolder(const std::string& path) {
  if (mkdir(path.c_str(), 0700) == 0) return 0;
  const int failure = errno;
  return failure == EEXIST && isFolder(path) ? 0 : failure;
}

std::string within(const std::string& folder, const char* name) {
  return folder == "/" ? folder + name : folder + '/' + name;
}

}  // namespace

Containers::Containers(ContainerFolders folders, Log& log)
    : _folders(std::move(folders)), _log(log) {
  refresh();
}

bool Containers::refresh() {
  return keep({lookForApps(), hasDriveFolder(VLUbiquitousDocumentsFolderName),
               hasDriveFolder(VLUbiquitousDesktopFolderName)});
}

bool Containers::refreshDriveFolders() {
  State state;
  {
    MutexLock lock(_mutex);
    state.apps = _state.apps;
  }
  state.hasDocuments = hasDriveFolder(VLUbiquitousDocumentsFolderName);
  state.hasDesktop = hasDriveFolder(VLUbiquitousDesktopFolderName);
  return keep(std::move(state));
}

bool Containers::keep(State state) {
  MutexLock lock(_mutex);
  if (state == _state) return false;
  _state = std::move(state);
  return true;
}

std::vector<VLContainer::Properties> Containers::list() const {
  State state;
  {
    MutexLock lock(_mutex);
    state = _state;
  }
  const auto own = [this](const char* id, const char* folderName, bool exists) {
    VLContainer::Properties container;
    container.containerID = id;
    container.displayName = folderName;
    if (exists) container.documentsURL = NSURL::fileURLWithPath(within(_folders.drive, folderName));
    return container;
  };

  std::vector<VLContainer::Properties> containers;
  VLContainer::Properties drive;
  drive.containerID = VLUbiquitousDefaultContainerID;
  drive.documentsURL = NSURL::fileURLWithPath(_folders.drive);
  drive.displayName = drive.documentsURL->lastPathComponent();
  containers.push_back(std::move(drive));
  containers.push_back(
      own(VLUbiquitousDocumentsContainerID, VLUbiquitousDocumentsFolderName, state.hasDocuments));
  containers.push_back(
      own(VLUbiquitousDesktopContainerID, VLUbiquitousDesktopFolderName, state.hasDesktop));
  for (Known& known : state.apps) {
    VLContainer::Properties container;
    container.containerID = std::move(known.app.containerID);
    if (known.documents) container.documentsURL = NSURL::fileURLWithPath(*known.documents);
    container.displayName = std::move(known.app.displayName);
    container.icon = std::move(known.app.icon);
    container.isIconUndecorated = known.app.isIconUndecorated;
    containers.push_back(std::move(container));
  }
  return containers;
}

VLContainer::Properties Containers::find(const std::string& containerID, bool recreate,
                                         bool& recreated, NSErrorOut error) {
  recreated = false;
  const std::vector<VLContainer::Properties> all = list();
  const auto found = std::find_if(all.begin(), all.end(), [&](const auto& container) {
    return container.containerID == containerID;
  });
  if (found == all.end()) {
    error.store(vlc_errorInvalidParameter("containerID", containerID));
    return {};
  }
  VLContainer::Properties container = *found;
  const bool isDrive = containerID == VLUbiquitousDefaultContainerID;
  std::string folder = _folders.drive;
  if (isAppContainerID(containerID)) {
    folder =
        within(within(_folders.containers, containerID.c_str()), VLUbiquitousDocumentsFolderName);
  } else if (!isDrive) {
    folder = within(_folders.drive, container.displayName.c_str());
  }
  int failure = isFolder(folder) ? 0 : ENOENT;
  if (failure != 0 && recreate && !isDrive) {
    failure = makeFolder(folder.substr(0, folder.rfind('/')));
    if (failure == 0) failure = makeFolder(folder);
    recreated = failure == 0;
  }
  if (failure != 0) {
    error.store(fileError(failure, "There is no folder of the container's at", folder));
    return {};
  }
  container.documentsURL = NSURL::fileURLWithPath(folder);
  return container;
}

std::vector<StoreRoot> Containers::storeRoots() const {
  MutexLock lock(_mutex);
  std::vector<StoreRoot> roots;
  for (const Known& known : _state.apps) {
    if (known.documents) {
      roots.push_back({*known.documents, known.app.containerID, known.app.displayName});
    }
  }
  return roots;
}

bool Containers::hasDriveFolder(const char* name) const {
  return isFolder(within(_folders.drive, name));
}

std::vector<Containers::Known> Containers::lookForApps() const {
  std::vector<Known> apps;
  for (AppContainer& app : appContainersInFolders(_folders.applications)) {
    const std::string folder = within(_folders.containers, app.containerID.c_str());
    const std::string documents = within(folder, VLUbiquitousDocumentsFolderName);
    int failure = makeFolder(folder);
    if (failure == 0) failure = makeFolder(documents);
    Known known{std::move(app), std::nullopt};
    if (failure == 0) {
      known.documents = documents;
    } else {
      VL_ERROR(_log, "[ERROR] can't make the container folder %@: %@", documents,
               std::generic_category().message(failure));
    }
    apps.push_back(std::move(known));
  }
  return apps;
}

}  // namespace skein::vald
