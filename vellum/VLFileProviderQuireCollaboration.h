#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "base/Completion.h"
#include "platform/foundation/NSDate.h"
#include "platform/foundation/NSError.h"
#include "platform/foundation/NSProgress.h"
#include "platform/foundation/NSURL.h"
#include "platform/xpc/NSXPCConnection.h"

namespace skein {

inline constexpr char VLQuireCollaborationServiceName[] = "com.tessel.QuireCollaboration";
inline constexpr char VLQuireCollaborationProtocolName[] = "VLFileProviderQuireCollaboration";

// The protocol's methods, in the order of their declaration.
inline constexpr std::string_view VLFileProviderQuireCollaborationSelectors[] = {
    "fetchVersionAndCapabilitiesWithCompletionHandler:",
    "setEnvironmentType:",
    "fetchCollaborationTokenWithCompletionHandler:",
    "fetchLatestRevisionWithCompletionHandler:",
    "refreshSharingStateWithCompletionHandler:",
    "fetchPrivacyStateWithCompletionHandler:",
    "documentIsInUseWithTimeout:",
    "fetchFileProviderIdentifierWithCompletionHandler:",
    "fetchURLForSharingFileWithCompletionHandler:",
    "fetchFolderSharingStateWithCompletionHandler:",
    "fetchSharedFolderInfoWithCompletionHandler:",
};

// Working together on one document, as a client process meets it. Threads and replies as
// in VLSharingServiceV1. Only the first method is required: an object says which others it
// has, and one that it has not answers NSFeatureUnsupportedError, or does nothing where
// there is no reply. Which is what stands here.
class VLFileProviderQuireCollaboration : public NSXPCExportedObject {
 public:
  using Progress = std::shared_ptr<NSProgress>;
  using Text = std::optional<std::string>;

  // respondsToSelector: with the whole selector, as "setEnvironmentType:".
  virtual bool respondsToSelector(std::string_view selector) const = 0;

  // fetchVersionAndCapabilitiesWithCompletionHandler:
  virtual void fetchVersionAndCapabilitiesWithCompletionHandler(
      Completion<std::uint64_t, std::uint64_t, NSErrorPtr> handler) = 0;

  // setEnvironmentType:
  virtual void setEnvironmentType(std::uint64_t environmentType);

  // fetchCollaborationTokenWithCompletionHandler: the provider's identifier, two tokens,
  // and when they expire; four nils with an error.
  virtual Progress fetchCollaborationTokenWithCompletionHandler(
      Completion<Text, Text, Text, std::optional<NSDate>, NSErrorPtr> handler);

  // fetchLatestRevisionWithCompletionHandler:
  virtual Progress fetchLatestRevisionWithCompletionHandler(Completion<NSErrorPtr> handler);

  // refreshSharingStateWithCompletionHandler:
  virtual Progress refreshSharingStateWithCompletionHandler(Completion<NSErrorPtr> handler);

  // fetchPrivacyStateWithCompletionHandler:
  virtual Progress fetchPrivacyStateWithCompletionHandler(
      Completion<bool, bool, NSURLPtr, NSErrorPtr> handler);

  // documentIsInUseWithTimeout: in seconds.
  virtual void documentIsInUseWithTimeout(double timeout);

  // fetchFileProviderIdentifierWithCompletionHandler:
  virtual void fetchFileProviderIdentifierWithCompletionHandler(
      Completion<Text, NSErrorPtr> handler);

  // fetchURLForSharingFileWithCompletionHandler:
  virtual void fetchURLForSharingFileWithCompletionHandler(
      Completion<NSURLPtr, NSErrorPtr> handler);

  // fetchFolderSharingStateWithCompletionHandler:
  virtual Progress fetchFolderSharingStateWithCompletionHandler(
      Completion<bool, NSErrorPtr> handler);

  // fetchSharedFolderInfoWithCompletionHandler:
  virtual Progress fetchSharedFolderInfoWithCompletionHandler(
      Completion<bool, Text, NSErrorPtr> handler);
};

}  // namespace skein
