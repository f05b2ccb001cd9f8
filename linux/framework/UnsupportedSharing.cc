#include "linux/framework/UnsupportedSharing.h"

#include <utility>

namespace skein {
namespace {

NSErrorPtr notSupported(const std::string& what) {
  return NSError::errorWithDomain(
      NSCocoaErrorDomain, NSFeatureUnsupportedError,
      {{NSLocalizedDescriptionKey, "This host does not offer " + what + "."}});
}

// Refuses when it is started, cancelled or not.
template <class Operation, class... Values>
class Refusal : public Operation {
 public:
  void start() override {
    if (auto block = std::exchange(_block, nullptr)) {
      block(Values()..., notSupported("sharing"));
    }
  }

 protected:
  UniqueFunction<void(Values..., NSErrorPtr)> _block;
};

using Text = std::optional<std::string>;

struct ShareCopy final : Refusal<VLShareCopyOperation, CKSharePtr, Text> {
  void setRootShareCopyCompletionBlock(
      UniqueFunction<void(CKSharePtr, Text, NSErrorPtr)> block) override {
    _block = std::move(block);
  }
};
struct CopyShareURL final : Refusal<VLShareCopyShareURLOperation, NSURLPtr> {
  void setCopyShareURLCompletionBlock(UniqueFunction<void(NSURLPtr, NSErrorPtr)> block) override {
    _block = std::move(block);
  }
};
struct ShareSave final : Refusal<VLShareSaveOperation, CKSharePtr> {
  void setShareSaveCompletionBlock(UniqueFunction<void(CKSharePtr, NSErrorPtr)> block) override {
    _block = std::move(block);
  }
};
struct ShareDestroy final : Refusal<VLShareDestroyOperation> {
  void setShareDestroyCompletionBlock(UniqueFunction<void(NSErrorPtr)> block) override {
    _block = std::move(block);
  }
};
struct CopyToken final : Refusal<VLSharingCopyShareTokenOperation, Text, Text> {
  void setShareAndBaseTokenCompletionBlock(
      UniqueFunction<void(Text, Text, NSErrorPtr)> block) override {
    _block = std::move(block);
  }
};

}  // namespace

std::shared_ptr<VLShareCopyOperation> UnsupportedSharingOperations::shareCopyOperation(
    const NSURLPtr&) {
  return std::make_shared<ShareCopy>();
}
std::shared_ptr<VLShareCopyShareURLOperation>
UnsupportedSharingOperations::shareCopyShareURLOperation(const NSURLPtr&, const std::string&) {
  return std::make_shared<CopyShareURL>();
}
std::shared_ptr<VLShareSaveOperation> UnsupportedSharingOperations::shareSaveOperation(CKSharePtr) {
  return std::make_shared<ShareSave>();
}
std::shared_ptr<VLShareDestroyOperation> UnsupportedSharingOperations::shareDestroyOperation(
    CKSharePtr) {
  return std::make_shared<ShareDestroy>();
}
std::shared_ptr<VLSharingCopyShareTokenOperation>
UnsupportedSharingOperations::copyShareTokenOperation(const NSURLPtr&) {
  return std::make_shared<CopyToken>();
}
CKSharePtr UnsupportedSharingOperations::VLSharingCreateShareForItemAtURL(const NSURLPtr&,
                                                                          NSErrorOut error) {
  error.store(notSupported("sharing"));
  return nullptr;
}

std::optional<bool> UnsupportedResourceValues::getResourceValue(const NSURLPtr&, std::string_view,
                                                                NSErrorOut error) {
  error.store(notSupported("resource values"));
  return std::nullopt;
}
std::optional<bool> UnsupportedResourceValues::getPromisedItemResourceValue(const NSURLPtr&,
                                                                            std::string_view,
                                                                            NSErrorOut error) {
  error.store(notSupported("resource values"));
  return std::nullopt;
}
std::optional<std::string> UnsupportedResourceValues::vl_typeIdentifierWithError(const NSURLPtr&,
                                                                                 NSErrorOut error) {
  error.store(notSupported("content types"));
  return std::nullopt;
}

}  // namespace skein
