#include "linux/vald/Drive.h"

#include <sys/stat.h>

#include <cerrno>
#include <cstring>
#include <utility>

#include "linux/vald/files/DatabaseFile.h"
#include "linux/vald/files/FileNames.h"

namespace skein::vald {
namespace {

constexpr std::size_t kThreads = 4;
constexpr std::size_t kImportThreads = 2;

// One container that cannot be opened does not close the others.
std::vector<std::string> rootPaths(const std::string& drive,
                                   const std::vector<StoreRoot>& containers, Log& log) {
  std::vector<std::string> paths{drive};
  for (const StoreRoot& container : containers) {
    DirectoryHandle folder;
    if (const int code = DirectoryHandle::openRoot(container.path, folder)) {
      VL_ERROR(log, "[ERROR] the documents folder %@ cannot be opened: %s", container.path,
               std::strerror(code));
      continue;
    }
    paths.push_back(container.path);
  }
  return paths;
}

// Opens what keeps a database; anew when that is damaged.
template <class Open>
auto openAnewWhenDamaged(const std::string& database, Log& log, NSErrorOut error, Open open) {
  NSErrorPtr problem;
  auto opened = open(&problem);
  if (!opened && setAsideWhenDamaged(database, log)) opened = open(&problem);
  if (!opened) error.store(std::move(problem));
  return opened;
}

}  // namespace

Drive::Drive(StoreListener& listener, Log& log)
    : _listener(listener),
      _log(log),
      _threads(std::make_shared<ClosableExecutor>(kThreads, "vald-files")),
      _importThreads(std::make_shared<ClosableExecutor>(kImportThreads, "vald-import")) {}

std::unique_ptr<Drive> Drive::open(DriveOptions options, StoreListener& listener, FileLayer& layer,
                                   Log& log, NSErrorOut error) {
  std::unique_ptr<Drive> drive(new Drive(listener, log));
  drive->_root = options.store.drive.path;
  FileOperationsOptions own;
  own.roots = rootPaths(drive->_root, options.store.containers, log);
  own.stateDirectory = options.stateDirectory;
  own.otherNames = otherNamesOfItem;
  drive->_operations = openAnewWhenDamaged(
      joinPath(options.stateDirectory, "operations.db"), log, error,
      [&](NSErrorOut problem) { return FileOperations::open(own, layer, log, problem); });
  if (!drive->_operations) return nullptr;
  options.cloud.drive = drive->_root;
  drive->_cloud = openAnewWhenDamaged(
      joinPath(options.cloud.folder, "records.db"), log, error, [&](NSErrorOut problem) {
        return Cloud::open(options.cloud, *drive->_operations, log, problem);
      });
  if (!drive->_cloud) return nullptr;
  for (const OperationEntry& entry : drive->_operations->recovered()) {
    if (entry.isCopied() && entry.kind != OperationKind::Import &&
        entry.state == OperationState::Done) {
      options.store.copies.emplace_back(documentPath(nullptr, entry.path),
                                        documentPath(nullptr, entry.destination));
    }
  }
  // The index shares a disk with the journal, and has no room of its own kept.
  options.store.makeRoom = [&journal = drive->_operations->journal(),
                            folder = options.stateDirectory] {
    struct stat status {};
    return stat(folder.c_str(), &status) == 0 && journal.makeRoom(status.st_dev);
  };
  NSErrorPtr problem;
  do {
    drive->_store = FolderStore::openFolder(options.store, *drive, log, &problem);
  } while (!drive->_store && problem->code() == ENOSPC && options.store.makeRoom());
  if (!drive->_store) {
    error.store(std::move(problem));
    return nullptr;
  }

  drive->_files = std::make_unique<Files>(
      FilesParts{*drive->_store, *drive->_operations, drive->_cloud->places(),
                 drive->_cloud->downloader(), drive->_threads, drive->_importThreads,
                 [cloud = drive->_cloud.get()](VLFileObjectID document) {
                   return cloud->whyNotUploaded(document);
                 },
                 [cloud = drive->_cloud.get()](const std::string& path, VLFileObjectID document) {
                   cloud->documentWasEvicted(path, document);
                 },
                 [cloud = drive->_cloud.get()](const std::string& path) {
                   cloud->documentWasDownloaded(path);
                 }});
  // The round that begins now sees these, too; who asks at once shall not see them before.
  std::vector<std::string> recovered;
  for (const OperationEntry& entry : drive->_operations->recovered()) {
    for (const std::string& path : {entry.path, entry.destination}) {
      if (!path.empty()) recovered.push_back(documentPath(nullptr, path));
    }
  }
  if (!recovered.empty()) drive->_store->lookAtPaths(recovered);
  drive->_cloud->start(*drive->_store);
  return drive;
}

Drive::~Drive() { close(); }

void Drive::close() {
  // Who waits for a download is answered by these, so the downloads end first.
  if (_cloud) _cloud->stop();
  _threads->close();
  _importThreads->close();
}

void Drive::containersWillChange(const std::vector<StoreRoot>& containers) {
  if (NSErrorPtr error = _operations->setRoots(rootPaths(_root, containers, _log))) {
    VL_ERROR(_log, "[ERROR] documents of new containers can't be changed: %@",
             error->localizedDescription());
  }
}

void Drive::storeDidChange(const std::vector<StoreChange>& changes) {
  _cloud->storeDidChange(changes);
  _listener.storeDidChange(changes);
}

void Drive::storeDidOverflow(std::optional<VLFileObjectID> folder) {
  _cloud->storeDidOverflow();
  _listener.storeDidOverflow(folder);
}

}  // namespace skein::vald
