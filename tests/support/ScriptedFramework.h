// The framework's and the platform's roles, as a test writes them: each answers from
// public fields and records in the transcript what it is asked to do. A new role is one
// more class here (or in a file of its own, as the daemon) and one more member below.
#pragma once

#include <map>
#include <set>
#include <string>

#include "platform/fileprovider/NSFileProviderManager.h"
#include "tests/support/HeldCalls.h"
#include "tests/support/ScriptedCloud.h"
#include "tests/support/ScriptedDaemon.h"
#include "tests/support/ScriptedFiles.h"
#include "tests/support/ScriptedSharing.h"
#include "tests/support/ScriptedXPC.h"
#include "tests/support/Transcript.h"
#include "vellum/VLAccount.h"
#include "vellum/VLContainer.h"
#include "vellum/VLDocuments.h"

namespace skein {

class ScriptedAccounts final : public VLAccounts {
 public:
  explicit ScriptedAccounts(Transcript& transcript) : _transcript(transcript) {}
  void startAccountTokenChangeObserverIfNeeded() override {
    _transcript.add("accounts: observe");
    if (observed) observed();
  }
  std::shared_ptr<const VLAccount> currentCachedLoggedInAccountWithError(NSErrorOut out) override {
    if (error) out.store(error);
    return account;
  }

  // Back to how it begins: somebody is logged in.
  void logIn() {
    account = std::make_shared<VLAccount>("kim", "kim's files");
    error = nullptr;
  }

  std::shared_ptr<const VLAccount> account = std::make_shared<VLAccount>("kim", "kim's files");
  NSErrorPtr error;
  std::function<void()> observed;  // called when changes are asked to be observed

 private:
  Transcript& _transcript;
};

class ScriptedContainers final : public VLContainers {
 public:
  explicit ScriptedContainers(Transcript& transcript) : _transcript(transcript) {}
  VLContainersByID allContainersByContainerID() override {
    _transcript.add("containers: table");
    return table;
  }
  VLContainersByID allContainers() override {
    _transcript.add("containers: all");
    return table;
  }
  void add(const std::string& containerID, NSURLPtr documentsURL) {
    table[containerID] = std::make_shared<VLContainer>(
        VLContainer::Properties{containerID, std::move(documentsURL), containerID, std::nullopt});
  }

  VLContainersByID table;

 private:
  Transcript& _transcript;
};

// What lies under /store is in the synced location.
class ScriptedDocuments final : public VLDocuments {
 public:
  explicit ScriptedDocuments(Transcript& transcript) : _transcript(transcript) {}
  NSURLPtr vl_documentURLFromFileObjectID(const VLFileObjectID& id, NSErrorOut out) override;
  bool vl_isInSyncedLocation(const NSURLPtr& url) override;
  bool vl_isExternalDocumentReference(const NSURLPtr& url) override;
  NSURLPtr vl_URLByResolvingExternalDocumentReferenceWithError(const NSURLPtr& url,
                                                               NSErrorOut out) override;
  void vl_addPhysicalProperty(const NSURLPtr& url) override;
  std::optional<std::string> vl_containerIDIfIsDocumentsContainerURL(const NSURLPtr& url) override;

  std::map<VLFileObjectID, NSURLPtr> urls;
  std::map<std::string, NSURLPtr> references;       // by path; a null target does not resolve
  std::map<std::string, std::string> containerIDs;  // by path
  NSErrorPtr error;                                 // of what does not resolve

 private:
  Transcript& _transcript;
};

class ScriptedQueryItems final : public VLQueryItemLookup {
 public:
  explicit ScriptedQueryItems(Transcript& transcript) : _transcript(transcript) {}
  VLQueryItemPtr askDaemonQueryItemForURL(const NSURLPtr& url, bool andFakeFSEvent,
                                          NSErrorOut out) override;
  VLQueryItemPtr containerItemForContainer(const std::shared_ptr<const VLContainer>& container,
                                           bool forceScan) override;

  std::map<std::string, VLQueryItemPtr> items;           // by path
  std::map<std::string, VLQueryItemPtr> containerItems;  // by container identifier
  NSErrorPtr error;                                      // stored with every answer, when set

 private:
  Transcript& _transcript;
};

class ScriptedProviderManager final : public NSFileProviderManager {
 public:
  ScriptedProviderManager(Transcript& transcript, CallLedger& ledger)
      : signals(ledger), _transcript(transcript) {}
  void signalEnumeratorForContainerItemIdentifier(const NSFileProviderItemIdentifier& identifier,
                                                  Completion<NSErrorPtr> completion) override {
    _transcript.add("manager: signal " + identifier);
    auto shared = std::move(completion).share();
    signals.hold([shared](NSErrorPtr error) { (*shared)(std::move(error)); },
                 [shared](NSErrorPtr error) { (*shared)(std::move(error)); });
  }

  HeldCalls<NSErrorPtr> signals;

 private:
  Transcript& _transcript;
};

struct ScriptedFramework {
  explicit ScriptedFramework(Transcript& transcript)
      : accounts(transcript),
        containers(transcript),
        daemon(transcript, ledger),
        documents(transcript),
        queryItems(transcript),
        manager(transcript, ledger),
        fileOperations(transcript, ledger),
        fileManager(transcript),
        operations(transcript),
        cloud(transcript),
        transfer(transcript, ledger),
        bundles(transcript),
        sharing(transcript),
        resourceValues(transcript),
        xpcListeners(transcript) {}

  // Every unanswered call's error handler runs, here, and receivers are let go of.
  void dropConnection(const NSErrorPtr& error) {
    ledger.drop(error);
    sharing.drop();
    daemon.releaseReceivers();
  }

  CallLedger ledger;
  ScriptedAccounts accounts;
  ScriptedContainers containers;
  ScriptedDaemon daemon;
  ScriptedDocuments documents;
  ScriptedQueryItems queryItems;
  ScriptedProviderManager manager;
  ScriptedFileOperations fileOperations;
  ScriptedFileManager fileManager;
  ScriptedOperations operations;
  ScriptedCloud cloud;
  ScriptedThumbnailTransfer transfer;
  ScriptedBundles bundles;
  ScriptedSharing sharing;
  ScriptedResourceValues resourceValues;
  ScriptedListeners xpcListeners;
};

}  // namespace skein
