#pragma once

#include <memory>

#include "base/Executor.h"
#include "platform/cloudkit/CloudKit.h"
#include "platform/fileprovider/NSFileProviderManager.h"
#include "platform/foundation/NSNotificationCenter.h"
#include "platform/launchservices/LSBundleProxy.h"
#include "platform/log/Log.h"
#include "platform/quicklook/QLThumbnailStoreRetrievalOperation.h"
#include "platform/xpc/NSXPCListener.h"
#include "support/RootURL.h"
#include "support/VLLogSection.h"
#include "vellum/VLAccount.h"
#include "vellum/VLContainer.h"
#include "vellum/VLDaemonConnection.h"
#include "vellum/VLDocuments.h"
#include "vellum/VLFileOperations.h"
#include "vellum/VLResourceValues.h"
#include "vellum/VLSharingOperations.h"
#include "vellum/VLThumbnailTransfer.h"

namespace skein {

// The world as the extension meets it: each role by reference, wired once by the
// process's main (or by a test) and outliving everything that is made with it. What the
// process keeps once (section numbers, the root URL) is here too, so that each
// environment starts fresh.
struct Environment {
  Log& log;  // vlc_default_log
  std::shared_ptr<Executor> executor;
  NSNotificationCenter& notificationCenter;
  NSFileProviderManager& providerManager;  // defaultManager
  VLAccounts& accounts;
  VLContainers& containers;
  VLDaemonConnection& daemonConnection;  // defaultConnection
  VLDocuments& documents;
  VLQueryItemLookup& queryItems;
  VLLogSections& logSections;
  RootURL& rootURL;
  VLFileOperations& fileOperations;
  VLFileManager& fileManager;  // NSFileManager's defaultManager
  VLOperations& operations;
  CKContainers& cloud;
  QLThumbnailStoreRetrievalOperation& systemThumbnails;
  VLRemoteUserDefaults& remoteDefaults;  // sharedDefaults
  VLDownloads& downloads;
  LSBundles& bundles;
  VLSharingOperations& sharingOperations;
  VLResourceValues& resourceValues;
  NSXPCListeners& xpcListeners;
  Log& fileProviderLog;  // fp_current_or_default_log
};

}  // namespace skein
