#include "linux/framework/LocalSharingOperations.h"

#include <utility>

#include "linux/framework/DaemonOperation.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

NSErrorPtr errorIfNull(const char* name, const auto& value) {
  return value ? nullptr : vlc_errorInvalidParameter(name, "(null)");
}

class CopyOperation final : public DaemonOperation<VLShareCopyOperation, CKSharePtr,
                                                   std::optional<std::string>, NSErrorPtr> {
 public:
  using DaemonOperation::DaemonOperation;
  void setRootShareCopyCompletionBlock(Block block) override { setBlock(std::move(block)); }
};

class CopyURLOperation final
    : public DaemonOperation<VLShareCopyShareURLOperation, NSURLPtr, NSErrorPtr> {
 public:
  using DaemonOperation::DaemonOperation;
  void setCopyShareURLCompletionBlock(Block block) override { setBlock(std::move(block)); }
};

class SaveOperation final : public DaemonOperation<VLShareSaveOperation, CKSharePtr, NSErrorPtr> {
 public:
  using DaemonOperation::DaemonOperation;
  void setShareSaveCompletionBlock(Block block) override { setBlock(std::move(block)); }
};

class DestroyOperation final : public DaemonOperation<VLShareDestroyOperation, NSErrorPtr> {
 public:
  using DaemonOperation::DaemonOperation;
  void setShareDestroyCompletionBlock(Block block) override { setBlock(std::move(block)); }
};

class CopyTokenOperation final
    : public DaemonOperation<VLSharingCopyShareTokenOperation, std::optional<std::string>,
                             std::optional<std::string>, NSErrorPtr> {
 public:
  using DaemonOperation::DaemonOperation;
  void setShareAndBaseTokenCompletionBlock(Block block) override { setBlock(std::move(block)); }
};

}  // namespace

std::shared_ptr<VLShareCopyOperation> LocalSharingOperations::shareCopyOperation(
    const NSURLPtr& url) {
  return std::make_shared<CopyOperation>(
      _access,
      [url](LocalDaemon& daemon, auto reply) {
        return daemon.shares().copyShare(url, std::move(reply));
      },
      errorIfNull("url", url));
}

std::shared_ptr<VLShareCopyShareURLOperation> LocalSharingOperations::shareCopyShareURLOperation(
    const NSURLPtr& fileURL, const std::string& /*documentType*/) {
  // vald knows the document's type by itself.
  return std::make_shared<CopyURLOperation>(
      _access,
      [fileURL](LocalDaemon& daemon, auto reply) {
        return daemon.shares().copyShareURL(fileURL, std::move(reply));
      },
      errorIfNull("fileURL", fileURL));
}

std::shared_ptr<VLShareSaveOperation> LocalSharingOperations::shareSaveOperation(CKSharePtr share) {
  NSErrorPtr error = errorIfNull("share", share);
  return std::make_shared<SaveOperation>(
      _access,
      [share = std::move(share)](LocalDaemon& daemon, auto reply) {
        return daemon.shares().saveShare(*share, std::move(reply));
      },
      std::move(error));
}

std::shared_ptr<VLShareDestroyOperation> LocalSharingOperations::shareDestroyOperation(
    CKSharePtr share) {
  NSErrorPtr error = errorIfNull("share", share);
  return std::make_shared<DestroyOperation>(
      _access,
      [share = std::move(share)](LocalDaemon& daemon, auto reply) {
        return daemon.shares().destroyShare(*share, std::move(reply));
      },
      std::move(error));
}

std::shared_ptr<VLSharingCopyShareTokenOperation> LocalSharingOperations::copyShareTokenOperation(
    const NSURLPtr& url) {
  return std::make_shared<CopyTokenOperation>(
      _access,
      [url](LocalDaemon& daemon, auto reply) {
        return daemon.shares().copyShareTokens(url, std::move(reply));
      },
      errorIfNull("url", url));
}

CKSharePtr LocalSharingOperations::VLSharingCreateShareForItemAtURL(const NSURLPtr& url,
                                                                    NSErrorOut error) {
  if (NSErrorPtr missing = errorIfNull("url", url)) {
    error.store(std::move(missing));
    return nullptr;
  }
  auto [share, problem] = askDaemon<CKSharePtr>(_access, [&](LocalDaemon& daemon, auto reply) {
    daemon.shares().newShare(url, std::move(reply));
  });
  if (!share) error.store(std::move(problem));
  return share;
}

}  // namespace skein
