#pragma once

#include <memory>

#include "linux/framework/DriveState.h"
#include "linux/framework/SyncCall.h"
#include "linux/protocol/DaemonClient.h"
#include "linux/protocol/DrivePaths.h"
#include "platform/cloudkit/CloudKit.h"
#include "platform/launchservices/LSBundleProxy.h"
#include "platform/log/Log.h"
#include "platform/quicklook/QLThumbnailStoreRetrievalOperation.h"
#include "vellum/VLAccount.h"
#include "vellum/VLContainer.h"
#include "vellum/VLDaemonConnection.h"
#include "vellum/VLDocuments.h"
#include "vellum/VLFileOperations.h"
#include "vellum/VLResourceValues.h"
#include "vellum/VLSharingOperations.h"
#include "vellum/VLThumbnailTransfer.h"

namespace skein {

// The Vellum framework's roles on this system, all over one connection to vald. Any
// thread. Wired once, in main:
//
//   LocalFramework framework(loop, executor, notificationCenter, log,
//                            LocalFramework::optionsFor(paths));
//   Environment environment{log, executor, notificationCenter, providerManager,
//                           framework.accounts(), framework.containers(), ...};
class LocalFramework {
 public:
  // The center and the log have to outlive the framework and the work on the executor.
  // Nothing is sent until something is asked.
  LocalFramework(std::shared_ptr<RpcLoop> loop, std::shared_ptr<Executor> executor,
                 NSNotificationCenter& notificationCenter, Log& log, DaemonClient::Options options);
  // To reach the drive's vald, and to start it.
  static DaemonClient::Options optionsFor(const DrivePaths& paths);
  ~LocalFramework();
  LocalFramework(const LocalFramework&) = delete;
  LocalFramework& operator=(const LocalFramework&) = delete;

  VLAccounts& accounts() { return *_accounts; }
  VLContainers& containers() { return *_containers; }
  VLDaemonConnection& daemonConnection() { return *_connection; }
  VLDocuments& documents() { return *_documents; }
  VLQueryItemLookup& queryItems() { return *_queryItems; }
  VLFileOperations& fileOperations() { return *_fileOperations; }
  VLFileManager& fileManager() { return *_fileManager; }
  VLOperations& operations() { return *_operations; }
  CKContainers& cloud() { return *_cloud; }
  QLThumbnailStoreRetrievalOperation& systemThumbnails() { return *_systemThumbnails; }
  VLRemoteUserDefaults& remoteDefaults() { return *_remoteDefaults; }
  VLDownloads& downloads() { return *_downloads; }
  LSBundles& bundles() { return *_bundles; }
  VLSharingOperations& sharingOperations() { return *_sharingOperations; }
  VLResourceValues& resourceValues() { return *_resourceValues; }

  // vald with what only this host has.
  const std::shared_ptr<DaemonClient>& client() const { return _access.client; }

 private:
  const DaemonAccess _access;
  const std::shared_ptr<DriveState> _state;
  const std::unique_ptr<VLAccounts> _accounts;
  const std::unique_ptr<VLContainers> _containers;
  const std::unique_ptr<VLDaemonConnection> _connection;
  const std::unique_ptr<VLDocuments> _documents;
  const std::unique_ptr<VLQueryItemLookup> _queryItems;
  const std::unique_ptr<VLFileOperations> _fileOperations;
  const std::unique_ptr<VLFileManager> _fileManager;
  const std::unique_ptr<VLOperations> _operations;
  const std::unique_ptr<CKContainers> _cloud;
  const std::unique_ptr<QLThumbnailStoreRetrievalOperation> _systemThumbnails;
  const std::unique_ptr<VLRemoteUserDefaults> _remoteDefaults;
  const std::unique_ptr<VLDownloads> _downloads;
  const std::unique_ptr<LSBundles> _bundles;
  const std::unique_ptr<VLSharingOperations> _sharingOperations;
  const std::unique_ptr<VLResourceValues> _resourceValues;
};

}  // namespace skein
