#pragma once

#include "linux/framework/SyncCall.h"
#include "vellum/VLSharingOperations.h"

namespace skein {

// What is done with shares, each an operation that asks vald. Any thread; blocks run on the
// executor, once. A cancelled operation reports at once, and vald gives up what it has not
// begun; a lost connection is reported when it is noticed.
class LocalSharingOperations final : public VLSharingOperations {
 public:
  explicit LocalSharingOperations(DaemonAccess access) : _access(std::move(access)) {}

  std::shared_ptr<VLShareCopyOperation> shareCopyOperation(const NSURLPtr& url) override;
  std::shared_ptr<VLShareCopyShareURLOperation> shareCopyShareURLOperation(
      const NSURLPtr& fileURL, const std::string& documentType) override;
  std::shared_ptr<VLShareSaveOperation> shareSaveOperation(CKSharePtr share) override;
  std::shared_ptr<VLShareDestroyOperation> shareDestroyOperation(CKSharePtr share) override;
  std::shared_ptr<VLSharingCopyShareTokenOperation> copyShareTokenOperation(
      const NSURLPtr& url) override;
  // Waits for vald: any thread but the loop's.
  CKSharePtr VLSharingCreateShareForItemAtURL(const NSURLPtr& url, NSErrorOut error) override;

 private:
  const DaemonAccess _access;
};

}  // namespace skein
