#include "vellum/VLFileProviderQuireCollaboration.h"

namespace skein {
namespace {

NSErrorPtr notOffered() {
  return NSError::errorWithDomain(
      NSCocoaErrorDomain, NSFeatureUnsupportedError,
      {{NSLocalizedDescriptionKey,
        std::string("This collaboration service does not offer this method.")}});
}

}  // namespace

void VLFileProviderQuireCollaboration::setEnvironmentType(std::uint64_t /*environmentType*/) {}

VLFileProviderQuireCollaboration::Progress
VLFileProviderQuireCollaboration::fetchCollaborationTokenWithCompletionHandler(
    Completion<Text, Text, Text, std::optional<NSDate>, NSErrorPtr> handler) {
  handler(std::nullopt, std::nullopt, std::nullopt, std::nullopt, notOffered());
  return nullptr;
}

VLFileProviderQuireCollaboration::Progress
VLFileProviderQuireCollaboration::fetchLatestRevisionWithCompletionHandler(
    Completion<NSErrorPtr> handler) {
  handler(notOffered());
  return nullptr;
}

VLFileProviderQuireCollaboration::Progress
VLFileProviderQuireCollaboration::refreshSharingStateWithCompletionHandler(
    Completion<NSErrorPtr> handler) {
  handler(notOffered());
  return nullptr;
}

VLFileProviderQuireCollaboration::Progress
VLFileProviderQuireCollaboration::fetchPrivacyStateWithCompletionHandler(
    Completion<bool, bool, NSURLPtr, NSErrorPtr> handler) {
  handler(false, false, nullptr, notOffered());
  return nullptr;
}

void VLFileProviderQuireCollaboration::documentIsInUseWithTimeout(double /*timeout*/) {}

void VLFileProviderQuireCollaboration::fetchFileProviderIdentifierWithCompletionHandler(
    Completion<Text, NSErrorPtr> handler) {
  handler(std::nullopt, notOffered());
}

void VLFileProviderQuireCollaboration::fetchURLForSharingFileWithCompletionHandler(
    Completion<NSURLPtr, NSErrorPtr> handler) {
  handler(nullptr, notOffered());
}

VLFileProviderQuireCollaboration::Progress
VLFileProviderQuireCollaboration::fetchFolderSharingStateWithCompletionHandler(
    Completion<bool, NSErrorPtr> handler) {
  handler(false, notOffered());
  return nullptr;
}

VLFileProviderQuireCollaboration::Progress
VLFileProviderQuireCollaboration::fetchSharedFolderInfoWithCompletionHandler(
    Completion<bool, Text, NSErrorPtr> handler) {
  handler(false, std::nullopt, notOffered());
  return nullptr;
}

}  // namespace skein
