#include "linux/framework/LocalFramework.h"

#include <utility>

#include "linux/desktop/DesktopEntries.h"
#include "linux/desktop/InstalledThumbnailers.h"
#include "linux/framework/LocalBundles.h"
#include "linux/framework/LocalCloudKit.h"
#include "linux/framework/LocalDefaults.h"
#include "linux/framework/LocalDocuments.h"
#include "linux/framework/LocalDownloads.h"
#include "linux/framework/LocalFileManager.h"
#include "linux/framework/LocalFileOperations.h"
#include "linux/framework/LocalOperations.h"
#include "linux/framework/LocalQueryItemLookup.h"
#include "linux/framework/LocalResourceValues.h"
#include "linux/framework/LocalSharingOperations.h"

namespace skein {
namespace {

class LocalAccounts final : public VLAccounts {
 public:
  explicit LocalAccounts(std::shared_ptr<DriveState> state) : _state(std::move(state)) {}

  void startAccountTokenChangeObserverIfNeeded() override { _state->postAccountChanges(); }
  std::shared_ptr<const VLAccount> currentCachedLoggedInAccountWithError(
      NSErrorOut error) override {
    return _state->account(error);
  }

 private:
  const std::shared_ptr<DriveState> _state;
};

class LocalContainers final : public VLContainers {
 public:
  explicit LocalContainers(std::shared_ptr<DriveState> state) : _state(std::move(state)) {}

  VLContainersByID allContainersByContainerID() override { return *_state->containers(); }
  VLContainersByID allContainers() override {
    _state->postContainerChanges();
    return *_state->containers();
  }

 private:
  const std::shared_ptr<DriveState> _state;
};

class LocalDaemonConnection final : public VLDaemonConnection {
 public:
  explicit LocalDaemonConnection(std::shared_ptr<DaemonClient> client)
      : _client(std::move(client)) {}

  std::shared_ptr<VLDaemon> remoteObjectProxyWithErrorHandler(
      std::function<void(NSErrorPtr)> errorHandler) override {
    return _client->remoteObjectProxyWithErrorHandler(std::move(errorHandler));
  }

 private:
  const std::shared_ptr<DaemonClient> _client;
};

}  // namespace

LocalFramework::LocalFramework(std::shared_ptr<RpcLoop> loop, std::shared_ptr<Executor> executor,
                               NSNotificationCenter& notificationCenter, Log& log,
                               DaemonClient::Options options)
    : _access{loop, executor, std::make_shared<DaemonClient>(loop, executor, std::move(options))},
      _state(std::make_shared<DriveState>(_access, notificationCenter)),
      _accounts(std::make_unique<LocalAccounts>(_state)),
      _containers(std::make_unique<LocalContainers>(_state)),
      _connection(std::make_unique<LocalDaemonConnection>(_access.client)),
      _documents(std::make_unique<LocalDocuments>(_access, _state)),
      _queryItems(std::make_unique<LocalQueryItemLookup>(_access)),
      _fileOperations(std::make_unique<LocalFileOperations>(_access, _state)),
      _fileManager(std::make_unique<LocalFileManager>(_access, log)),
      _operations(std::make_unique<LocalOperations>(_access)),
      _cloud(std::make_unique<LocalCloudKit>(_access)),
      _systemThumbnails(
          std::make_unique<InstalledThumbnailers>(InstalledThumbnailers::installedFolders())),
      _remoteDefaults(std::make_unique<LocalDefaults>(LocalDefaults::userPath())),
      _downloads(std::make_unique<LocalDownloads>(_access, log)),
      _bundles(std::make_unique<LocalBundles>(applicationFolders())),
      _sharingOperations(std::make_unique<LocalSharingOperations>(_access)),
      _resourceValues(std::make_unique<LocalResourceValues>(_access)) {
  _state->attach();
}

DaemonClient::Options LocalFramework::optionsFor(const DrivePaths& paths) {
  DaemonClient::Options options;
  options.socketPath = paths.daemonSocket;
  options.program = daemonProgram(paths.store, paths.daemonSocket, paths.daemonLog);
  return options;
}

LocalFramework::~LocalFramework() = default;

}  // namespace skein
