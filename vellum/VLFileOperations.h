// What the framework does to files: under coordination, on the real store.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "base/UniqueFunction.h"
#include "platform/foundation/NSDate.h"
#include "platform/foundation/NSError.h"
#include "platform/foundation/NSOperation.h"
#include "platform/foundation/NSURL.h"
#include "vellum/VLContainer.h"

namespace skein {

// A file operation's outcome: the URL the item has now, or an error. A name that is taken
// is NSCocoaErrorDomain 516 and names the colliding URL (fp_collidingURL).
using VLURLHandler = UniqueFunction<void(NSURLPtr newURL, NSErrorPtr error)>;

// URL file operations. Asynchronous unless said otherwise: the handler runs once, on a
// thread of the framework's, from where synchronous daemon calls may be made. URLs may be
// null; the operation then fails with an error.
class VLFileOperations {
 public:
  virtual ~VLFileOperations() = default;

  // fp_importUnderFolder:completionHandler:
  virtual void fp_importUnderFolder(const NSURLPtr& url, const NSURLPtr& folder,
                                    VLURLHandler completionHandler) = 0;
  // fp_createSubFolder:completionHandler:
  virtual void fp_createSubFolder(const NSURLPtr& url, const std::string& name,
                                  VLURLHandler completionHandler) = 0;
  // fp_renameWithNewName:completionHandler:
  virtual void fp_renameWithNewName(const NSURLPtr& url, const std::string& newName,
                                    VLURLHandler completionHandler) = 0;
  // fp_reparentUnderFolder:withNewName:completionHandler: a nil name keeps the name.
  virtual void fp_reparentUnderFolder_withNewName(const NSURLPtr& url, const NSURLPtr& folder,
                                                  std::optional<std::string> newName,
                                                  VLURLHandler completionHandler) = 0;
  // fp_reparentUnderFolder:allowBouncing:completionHandler: with bouncing, a clash at the
  // destination is resolved with another name.
  virtual void fp_reparentUnderFolder_allowBouncing(const NSURLPtr& url, const NSURLPtr& folder,
                                                    bool allowBouncing,
                                                    VLURLHandler completionHandler) = 0;
  // fp_deleteWithCompletionHandler:
  virtual void fp_deleteWithCompletionHandler(
      const NSURLPtr& url, UniqueFunction<void(NSErrorPtr)> completionHandler) = 0;
  // fp_coordinatedDeleteWithHandler: synchronous; the handler has run, with the
  // coordinated URL or an error, before it returns.
  virtual void fp_coordinatedDeleteWithHandler(const NSURLPtr& url, VLURLHandler handler) = 0;

  // vl_capabilityToMoveToURL:error: synchronous. The bits say which kinds of move are
  // allowed from `url` to where it would be; none of the significant ones is a refusal.
  virtual std::uint64_t vl_capabilityToMoveToURL(const NSURLPtr& url, const NSURLPtr& toURL,
                                                 NSErrorOut error) = 0;
  // vl_setTagNames:error: synchronous; replaces the whole set. NO, without an error, for
  // nil.
  virtual bool vl_setTagNames(const NSURLPtr& url, const std::vector<std::string>& names,
                              NSErrorOut error) = 0;
  // vl_physicalURL: where the item's physical file is; null for nil.
  virtual NSURLPtr vl_physicalURL(const NSURLPtr& url) = 0;
  // vl_isPromiseURL: whether the URL names a marker of a file that is not present.
  virtual bool vl_isPromiseURL(const NSURLPtr& url) = 0;
  // vl_vellumContainer: null outside every container.
  virtual std::shared_ptr<const VLContainer> vl_vellumContainer(const NSURLPtr& url) = 0;
  // checkResourceIsReachableAndReturnError: NO for nil.
  virtual bool checkResourceIsReachable(const NSURLPtr& url, NSErrorOut error) = 0;
};

// The default file manager. Synchronous, on the calling thread.
class VLFileManager {
 public:
  virtual ~VLFileManager() = default;

  // evictUbiquitousItemAtURL:error: NO for nil, and for what is not safely uploaded.
  virtual bool evictUbiquitousItemAtURL(const NSURLPtr& url, NSErrorOut error) = 0;
  // vl_trashItemAtURL:resultingURL:error:
  virtual bool vl_trashItemAtURL(const NSURLPtr& url, NSURLPtr* resultingURL, NSErrorOut error) = 0;
  // vl_putBackURLForTrashedItemAtURL:error: where the item was before; null when unknown.
  virtual NSURLPtr vl_putBackURLForTrashedItemAtURL(const NSURLPtr& url, NSErrorOut error) = 0;
  // vl_setLastOpenDate:onItemAtURL: and vl_setFavoriteRank:onItemAtURL: nil clears. A null
  // URL is ignored.
  virtual void vl_setLastOpenDate(std::optional<NSDate> date, const NSURLPtr& onItemAtURL) = 0;
  virtual void vl_setFavoriteRank(std::optional<std::int64_t> rank,
                                  const NSURLPtr& onItemAtURL) = 0;
};

// Makes a file's contents present: asks the daemon and reports once, also when it was
// cancelled before it started.
class VLFileProvidingOperation : public NSOperation {
 public:
  // setFileProvidingCompletion: before the operation is queued; null error on success.
  virtual void setFileProvidingCompletion(UniqueFunction<void(NSErrorPtr)> completion) = 0;
  // setWantsCurrentVersion: fetch the newest revision even when a copy is present.
  virtual void setWantsCurrentVersion(bool wantsCurrentVersion) = 0;
};

// Makes the framework's operations.
class VLOperations {
 public:
  virtual ~VLOperations() = default;
  // initWithURL:readingOptions: never null; a null URL makes an operation that fails.
  virtual std::shared_ptr<VLFileProvidingOperation> fileProvidingOperation(
      const NSURLPtr& url, std::uint64_t readingOptions) = 0;
};

}  // namespace skein
