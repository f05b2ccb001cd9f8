#pragma once

#include <memory>
#include <string>
#include <vector>

#include "linux/protocol/DrivePaths.h"
#include "linux/vald/Cloud.h"
#include "linux/vald/Files.h"
#include "linux/vald/FolderStore.h"
#include "linux/vald/files/FileOperations.h"

namespace skein::vald {

struct DriveOptions {
  StoreOptions store;
  std::string stateDirectory;
  Cloud::Options cloud;
};

// All that stands behind one drive: its store, its cloud, and what is done to its documents.
// Opening it first ends what a crash cut off, so that nothing is asked of a drive that is
// between two states.
class Drive final : private StoreListener {
 public:
  // Null with an error. `listener`, `layer` and `log` outlive it; the listener is told from
  // here on, on the store's writer thread.
  static std::unique_ptr<Drive> open(DriveOptions options, StoreListener& listener,
                                     FileLayer& layer, Log& log, NSErrorOut error);
  // Ends what is under way, and waits for it. Nobody asks any more.
  ~Drive() override;

  FolderStore& store() { return *_store; }
  LocalFiles& files() { return *_files; }
  Cloud& cloud() { return *_cloud; }
  FileOperations& operations() { return *_operations; }

  // Before the store hears of the containers.
  void containersWillChange(const std::vector<StoreRoot>& containers);
  // What is posted from now on is not done. Not on a thread of the drive's.
  void close();

 private:
  Drive(StoreListener& listener, Log& log);

  void storeDidChange(const std::vector<StoreChange>& changes) override;
  void storeDidOverflow(std::optional<VLFileObjectID> folder) override;

  StoreListener& _listener;
  Log& _log;
  std::string _root;
  const std::shared_ptr<ClosableExecutor> _threads;
  const std::shared_ptr<ClosableExecutor> _importThreads;
  std::unique_ptr<FileOperations> _operations;
  std::unique_ptr<Cloud> _cloud;
  std::unique_ptr<FolderStore> _store;
  std::unique_ptr<Files> _files;
};

}  // namespace skein::vald
