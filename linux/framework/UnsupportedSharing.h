// Sharing, on a host that offers none of it: everything is refused with
// NSFeatureUnsupportedError, in words that name the operation.
#pragma once

#include "vellum/VLResourceValues.h"
#include "vellum/VLSharingOperations.h"

namespace skein {

class UnsupportedSharingOperations final : public VLSharingOperations {
 public:
  std::shared_ptr<VLShareCopyOperation> shareCopyOperation(const NSURLPtr& url) override;
  std::shared_ptr<VLShareCopyShareURLOperation> shareCopyShareURLOperation(
      const NSURLPtr& fileURL, const std::string& documentType) override;
  std::shared_ptr<VLShareSaveOperation> shareSaveOperation(CKSharePtr share) override;
  std::shared_ptr<VLShareDestroyOperation> shareDestroyOperation(CKSharePtr share) override;
  std::shared_ptr<VLSharingCopyShareTokenOperation> copyShareTokenOperation(
      const NSURLPtr& url) override;
  CKSharePtr VLSharingCreateShareForItemAtURL(const NSURLPtr& url, NSErrorOut error) override;
};

class UnsupportedResourceValues final : public VLResourceValues {
 public:
  std::optional<bool> getResourceValue(const NSURLPtr& url, std::string_view forKey,
                                       NSErrorOut error) override;
  std::optional<bool> getPromisedItemResourceValue(const NSURLPtr& url, std::string_view forKey,
                                                   NSErrorOut error) override;
  std::optional<std::string> vl_typeIdentifierWithError(const NSURLPtr& url,
                                                        NSErrorOut error) override;
};

}  // namespace skein
