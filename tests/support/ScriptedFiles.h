// The roles that do something to files, as a test writes them. What is asynchronous is held
// until the test answers it; the rest answers from public fields. All of it goes into the
// transcript.
#pragma once

#include <atomic>
#include <functional>
#include <map>
#include <set>
#include <string>
#include <vector>

#include "platform/launchservices/LSBundleProxy.h"
#include "tests/support/HeldCalls.h"
#include "tests/support/Transcript.h"
#include "vellum/VLFileOperations.h"

namespace skein {

class ScriptedFileOperations final : public VLFileOperations {
 public:
  ScriptedFileOperations(Transcript& transcript, CallLedger& ledger)
      : results(ledger), deletions(ledger), _transcript(transcript) {}

  void fp_importUnderFolder(const NSURLPtr& url, const NSURLPtr& folder,
                            VLURLHandler handler) override;
  void fp_createSubFolder(const NSURLPtr& url, const std::string& name,
                          VLURLHandler handler) override;
  void fp_renameWithNewName(const NSURLPtr& url, const std::string& newName,
                            VLURLHandler handler) override;
  void fp_reparentUnderFolder_withNewName(const NSURLPtr& url, const NSURLPtr& folder,
                                          std::optional<std::string> newName,
                                          VLURLHandler handler) override;
  void fp_reparentUnderFolder_allowBouncing(const NSURLPtr& url, const NSURLPtr& folder,
                                            bool allowBouncing, VLURLHandler handler) override;
  void fp_deleteWithCompletionHandler(const NSURLPtr& url,
                                      UniqueFunction<void(NSErrorPtr)> handler) override;
  void fp_coordinatedDeleteWithHandler(const NSURLPtr& url, VLURLHandler handler) override;
  std::uint64_t vl_capabilityToMoveToURL(const NSURLPtr& url, const NSURLPtr& toURL,
                                         NSErrorOut error) override;
  bool vl_setTagNames(const NSURLPtr& url, const std::vector<std::string>& names,
                      NSErrorOut error) override;
  NSURLPtr vl_physicalURL(const NSURLPtr& url) override;
  bool vl_isPromiseURL(const NSURLPtr& url) override;
  std::shared_ptr<const VLContainer> vl_vellumContainer(const NSURLPtr& url) override;
  bool checkResourceIsReachable(const NSURLPtr& url, NSErrorOut error) override;

  HeldCalls<NSURLPtr, NSErrorPtr> results;  // of the five that give a new URL
  HeldCalls<NSErrorPtr> deletions;

  std::optional<NSURLPtr> coordinatedURL;  // unset: the item's own
  NSErrorPtr coordinationError;
  std::uint64_t capability = 1;
  NSErrorPtr capabilityError;  // stored with every answer, when set
  bool setsTags = true;
  NSErrorPtr tagError;  // stored with every answer, when set
  // By path:
  std::map<std::string, NSURLPtr> physicalURLs;
  std::set<std::string> promises;
  std::set<std::string> reachable;
  std::map<std::string, std::shared_ptr<const VLContainer>> containers;

 private:
  void hold(const std::string& call, VLURLHandler handler);

  Transcript& _transcript;
};

class ScriptedFileManager final : public VLFileManager {
 public:
  explicit ScriptedFileManager(Transcript& transcript) : _transcript(transcript) {}

  bool evictUbiquitousItemAtURL(const NSURLPtr& url, NSErrorOut error) override;
  bool vl_trashItemAtURL(const NSURLPtr& url, NSURLPtr* resultingURL, NSErrorOut error) override;
  NSURLPtr vl_putBackURLForTrashedItemAtURL(const NSURLPtr& url, NSErrorOut error) override;
  void vl_setLastOpenDate(std::optional<NSDate> date, const NSURLPtr& onItemAtURL) override;
  void vl_setFavoriteRank(std::optional<std::int64_t> rank, const NSURLPtr& onItemAtURL) override;

  NSErrorPtr evictError;
  bool trashes = true;
  NSURLPtr trashedURL;
  NSErrorPtr trashError;
  std::map<std::string, NSURLPtr> putBackURLs;  // by path
  NSErrorPtr putBackError;

 private:
  Transcript& _transcript;
};

// Reports once: when the test finishes it, or when it was cancelled, at its start or, once
// it runs, on the canceller's thread.
class ScriptedProvidingOperation final
    : public VLFileProvidingOperation,
      public std::enable_shared_from_this<ScriptedProvidingOperation> {
 public:
  using Started = std::function<void(std::shared_ptr<ScriptedProvidingOperation>)>;

  ScriptedProvidingOperation(std::string name, Transcript& transcript, Started started)
      : _name(std::move(name)), _transcript(transcript), _started(std::move(started)) {}

  void start() override SKEIN_EXCLUDES(_mutex);
  void cancel() override SKEIN_EXCLUDES(_mutex);
  void setFileProvidingCompletion(UniqueFunction<void(NSErrorPtr)> completion) override
      SKEIN_EXCLUDES(_mutex);
  void setWantsCurrentVersion(bool wantsCurrentVersion) override {
    wantsCurrent = wantsCurrentVersion;
  }

  std::atomic<bool> wantsCurrent{false};

  // False when it had reported before.
  bool finish(const NSErrorPtr& error) SKEIN_EXCLUDES(_mutex);

 private:
  const std::string _name;
  Transcript& _transcript;
  const Started _started;
  Mutex _mutex;
  bool _running SKEIN_GUARDED_BY(_mutex) = false;
  UniqueFunction<void(NSErrorPtr)> _completion SKEIN_GUARDED_BY(_mutex);
};

class ScriptedOperations final : public VLOperations {
 public:
  explicit ScriptedOperations(Transcript& transcript) : _transcript(transcript) {}
  std::shared_ptr<VLFileProvidingOperation> fileProvidingOperation(
      const NSURLPtr& url, std::uint64_t readingOptions) override SKEIN_EXCLUDES(_mutex);

  // Takes the oldest operation that was made. Throws when there is none.
  std::shared_ptr<ScriptedProvidingOperation> next() SKEIN_EXCLUDES(_mutex);

  // Called as an operation starts; set before threads do. Operations are not kept then.
  ScriptedProvidingOperation::Started started;

 private:
  Transcript& _transcript;
  Mutex _mutex;
  std::deque<std::shared_ptr<ScriptedProvidingOperation>> _made SKEIN_GUARDED_BY(_mutex);
};

class ScriptedBundles final : public LSBundles {
 public:
  explicit ScriptedBundles(Transcript& transcript) : _transcript(transcript) {}
  std::shared_ptr<const LSBundleProxy> bundleProxyForIdentifier(
      const std::string& identifier) override;

  std::map<std::string, LSBundleProxy::EntitlementValues> apps;  // by bundle identifier

 private:
  Transcript& _transcript;
};

}  // namespace skein
