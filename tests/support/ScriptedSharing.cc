#include "tests/support/ScriptedSharing.h"

#include "platform/log/Description.h"

namespace skein {

template <class Operation>
std::shared_ptr<Operation> ScriptedSharing::make(MadeOperations<Operation>& made,
                                                 const std::string& name) {
  auto operation = std::make_shared<Operation>(name, _transcript);
  made.add(operation);
  return operation;
}

std::shared_ptr<VLShareCopyOperation> ScriptedSharing::shareCopyOperation(const NSURLPtr& url) {
  return make(copies, "share copy of " + description(url));
}

std::shared_ptr<VLShareCopyShareURLOperation> ScriptedSharing::shareCopyShareURLOperation(
    const NSURLPtr& fileURL, const std::string& documentType) {
  return make(urls, "share URL of " + description(fileURL) + ", " + documentType);
}

std::shared_ptr<VLShareSaveOperation> ScriptedSharing::shareSaveOperation(CKSharePtr share) {
  auto operation = make(saves, "save of " + description(share));
  lastSaved = std::move(share);
  return operation;
}

std::shared_ptr<VLShareDestroyOperation> ScriptedSharing::shareDestroyOperation(CKSharePtr share) {
  return make(destroys, "removal of " + description(share));
}

std::shared_ptr<VLSharingCopyShareTokenOperation> ScriptedSharing::copyShareTokenOperation(
    const NSURLPtr& url) {
  return make(tokens, "tokens of " + description(url));
}

CKSharePtr ScriptedSharing::VLSharingCreateShareForItemAtURL(const NSURLPtr& url,
                                                             NSErrorOut error) {
  _transcript.add("sharing: new share of " + description(url));
  if (createError) error.store(createError);
  return createdShare;
}

std::optional<bool> ScriptedResourceValues::getResourceValue(const NSURLPtr& url,
                                                             std::string_view forKey,
                                                             NSErrorOut out) {
  _transcript.add("read " + std::string(forKey) + " of " + description(url));
  return flag(url, forKey, out);
}

std::optional<bool> ScriptedResourceValues::getPromisedItemResourceValue(const NSURLPtr& url,
                                                                         std::string_view forKey,
                                                                         NSErrorOut out) {
  _transcript.add("read promised " + std::string(forKey) + " of " + description(url));
  return flag(url, forKey, out);
}

std::optional<std::string> ScriptedResourceValues::vl_typeIdentifierWithError(const NSURLPtr& url,
                                                                              NSErrorOut out) {
  if (!url) return std::nullopt;
  if (error) {
    out.store(error);
    return std::nullopt;
  }
  const auto found = types.find(url->path());
  return found != types.end() ? found->second : "public.text";
}

std::optional<bool> ScriptedResourceValues::flag(const NSURLPtr& url, std::string_view key,
                                                 NSErrorOut out) {
  if (!url) return std::nullopt;
  if (error) {
    out.store(error);
    return std::nullopt;
  }
  const auto found = flags.find(std::string(key) + ' ' + url->path());
  return found != flags.end() && found->second;
}

}  // namespace skein
