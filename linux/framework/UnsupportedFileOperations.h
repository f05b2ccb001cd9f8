// The roles that do something to files, on a host that offers none of it. What such a host
// knows all the same it answers: every file of its store is present, so that no URL is a
// promise, and each is its own physical file. The rest is refused with
// NSFeatureUnsupportedError, in words that name the operation.
#pragma once

#include <memory>
#include <string>

#include "base/Executor.h"
#include "platform/launchservices/LSBundleProxy.h"
#include "platform/log/Log.h"
#include "vellum/VLFileOperations.h"

namespace skein {

// Asynchronous answers come on the executor's threads.
class UnsupportedFileOperations final : public VLFileOperations {
 public:
  explicit UnsupportedFileOperations(std::shared_ptr<Executor> executor)
      : _executor(std::move(executor)) {}

  void fp_importUnderFolder(const NSURLPtr& url, const NSURLPtr& folder,
                            VLURLHandler completionHandler) override;
  void fp_createSubFolder(const NSURLPtr& url, const std::string& name,
                          VLURLHandler completionHandler) override;
  void fp_renameWithNewName(const NSURLPtr& url, const std::string& newName,
                            VLURLHandler completionHandler) override;
  void fp_reparentUnderFolder_withNewName(const NSURLPtr& url, const NSURLPtr& folder,
                                          std::optional<std::string> newName,
                                          VLURLHandler completionHandler) override;
  void fp_reparentUnderFolder_allowBouncing(const NSURLPtr& url, const NSURLPtr& folder,
                                            bool allowBouncing,
                                            VLURLHandler completionHandler) override;
  void fp_deleteWithCompletionHandler(const NSURLPtr& url,
                                      UniqueFunction<void(NSErrorPtr)> completionHandler) override;
  void fp_coordinatedDeleteWithHandler(const NSURLPtr& url, VLURLHandler handler) override;
  std::uint64_t vl_capabilityToMoveToURL(const NSURLPtr& url, const NSURLPtr& toURL,
                                         NSErrorOut error) override;
  bool vl_setTagNames(const NSURLPtr& url, const std::vector<std::string>& names,
                      NSErrorOut error) override;
  NSURLPtr vl_physicalURL(const NSURLPtr& url) override { return url; }
  bool vl_isPromiseURL(const NSURLPtr& /*url*/) override { return false; }
  std::shared_ptr<const VLContainer> vl_vellumContainer(const NSURLPtr& /*url*/) override {
    return nullptr;
  }
  // Asks the disk.
  bool checkResourceIsReachable(const NSURLPtr& url, NSErrorOut error) override;

 private:
  void refuseLater(const char* operation, VLURLHandler handler);

  const std::shared_ptr<Executor> _executor;
};

// The two writes that have no error to answer with are logged as not done.
class UnsupportedFileManager final : public VLFileManager {
 public:
  explicit UnsupportedFileManager(Log& log) : _log(log) {}

  bool evictUbiquitousItemAtURL(const NSURLPtr& url, NSErrorOut error) override;
  bool vl_trashItemAtURL(const NSURLPtr& url, NSURLPtr* resultingURL, NSErrorOut error) override;
  NSURLPtr vl_putBackURLForTrashedItemAtURL(const NSURLPtr& url, NSErrorOut error) override;
  void vl_setLastOpenDate(std::optional<NSDate> date, const NSURLPtr& onItemAtURL) override;
  void vl_setFavoriteRank(std::optional<std::int64_t> rank, const NSURLPtr& onItemAtURL) override;

 private:
  Log& _log;
};

class UnsupportedOperations final : public VLOperations {
 public:
  std::shared_ptr<VLFileProvidingOperation> fileProvidingOperation(
      const NSURLPtr& url, std::uint64_t readingOptions) override;
};

// No app is known to be installed.
class UnsupportedBundles final : public LSBundles {
 public:
  std::shared_ptr<const LSBundleProxy> bundleProxyForIdentifier(
      const std::string& /*identifier*/) override {
    return nullptr;
  }
};

}  // namespace skein
