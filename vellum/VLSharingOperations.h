// What the framework does with shares: operations that ask the daemon.
//
// Each takes its completion block before it is queued and calls it once, on a thread of the
// framework's, also when it was cancelled (NSUserCancelledError), before or after its start.
// Other errors come as the cloud gave them, or are the connection's.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "base/UniqueFunction.h"
#include "platform/cloudkit/CKShare.h"
#include "platform/foundation/NSError.h"
#include "platform/foundation/NSOperation.h"
#include "platform/foundation/NSURL.h"

namespace skein {

// Fetches the share that covers an item: its own, or that of a folder above it.
class VLShareCopyOperation : public NSOperation {
 public:
  // setRootShareCopyCompletionBlock: the share; the identifier of the folder whose share it
  // is, nil when it is the item's own; an error. A share of a folder may change or go
  // without the item's doing. Where the item has no share yet, the error is CKErrorDomain
  // CKErrorUnknownItem, alone or within a partial failure, or VLVellumErrorUnknownShare.
  virtual void setRootShareCopyCompletionBlock(
      UniqueFunction<void(CKSharePtr, std::optional<std::string>, NSErrorPtr)> block) = 0;
};

// Finds the URL by which people come to a shared item; an item that is not shared is first
// shared with nobody.
class VLShareCopyShareURLOperation : public NSOperation {
 public:
  // setCopyShareURLCompletionBlock:
  virtual void setCopyShareURLCompletionBlock(UniqueFunction<void(NSURLPtr, NSErrorPtr)> block) = 0;
};

// Makes the server's share what the given one says.
class VLShareSaveOperation : public NSOperation {
 public:
  // setShareSaveCompletionBlock: the share as the server has it now, null with an error.
  virtual void setShareSaveCompletionBlock(UniqueFunction<void(CKSharePtr, NSErrorPtr)> block) = 0;
};

// Removes a share from the server, and with it everybody's access but the owner's.
class VLShareDestroyOperation : public NSOperation {
 public:
  // setShareDestroyCompletionBlock:
  virtual void setShareDestroyCompletionBlock(UniqueFunction<void(NSErrorPtr)> block) = 0;
};

// Fetches the two tokens that collaborators know a shared document by.
class VLSharingCopyShareTokenOperation : public NSOperation {
 public:
  // setShareAndBaseTokenCompletionBlock: the share token, the base token, an error.
  virtual void setShareAndBaseTokenCompletionBlock(
      UniqueFunction<void(std::optional<std::string>, std::optional<std::string>, NSErrorPtr)>
          block) = 0;
};

// Makes the operations: never null, nothing runs yet. A null URL or share makes an
// operation that fails.
class VLSharingOperations {
 public:
  virtual ~VLSharingOperations() = default;

  // VLShareCopyOperation initWithURL:
  virtual std::shared_ptr<VLShareCopyOperation> shareCopyOperation(const NSURLPtr& url) = 0;
  // VLShareCopyShareURLOperation initWithFileURL:documentType:
  virtual std::shared_ptr<VLShareCopyShareURLOperation> shareCopyShareURLOperation(
      const NSURLPtr& fileURL, const std::string& documentType) = 0;
  // VLShareSaveOperation initWithShare:
  virtual std::shared_ptr<VLShareSaveOperation> shareSaveOperation(CKSharePtr share) = 0;
  // VLShareDestroyOperation initWithShare:
  virtual std::shared_ptr<VLShareDestroyOperation> shareDestroyOperation(CKSharePtr share) = 0;
  // VLSharingCopyShareTokenOperation initWithURL:
  virtual std::shared_ptr<VLSharingCopyShareTokenOperation> copyShareTokenOperation(
      const NSURLPtr& url) = 0;

  // VLSharingCreateShareForItemAtURL: a share that the server does not know yet, of the
  // item's type ("folder" or its content type), with nobody in it. Synchronous; may ask the
  // daemon. Null with an error for what cannot be shared.
  virtual CKSharePtr VLSharingCreateShareForItemAtURL(const NSURLPtr& url, NSErrorOut error) = 0;
};

}  // namespace skein
