#include "linux/vald/Drive.h"

#include <utility>

namespace skein::vald {
namespace {

constexpr std::size_t kThreads = 4;
constexpr std::size_t kImportThreads = 2;

std::vector<std::string> rootPaths(const std::string& drive,
                                   const std::vector<StoreRoot>& containers) {
  std::vector<std::string> paths{drive};
  for (const StoreRoot& container : containers) paths.push_back(container.path);
  return paths;
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
  own.roots = rootPaths(drive->_root, options.store.containers);
  own.stateDirectory = options.stateDirectory;
  own.otherNames = otherNamesOfItem;
  drive->_operations = FileOperations::open(std::move(own), layer, log, error);
  if (!drive->_operations) return nullptr;
  options.cloud.drive = drive->_root;
  drive->_cloud = Cloud::open(std::move(options.cloud), *drive->_operations, log, error);
  if (!drive->_cloud) return nullptr;
  drive->_store = FolderStore::openFolder(std::move(options.store), *drive, log, error);
  if (!drive->_store) return nullptr;

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
  if (NSErrorPtr error = _operations->setRoots(rootPaths(_root, containers))) {
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
