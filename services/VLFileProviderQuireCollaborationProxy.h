#pragma once

#include "services/ServiceItem.h"
#include "vellum/VLFileProviderQuireCollaboration.h"

namespace skein {

// Working together on one document, for one connection: what a client app reaches.
//
// Requests are independent of each other and nothing is kept between them. Errors of the
// framework and the daemon are passed on as they are. There are no sections and no reply
// lines here. setEnvironmentType:, fetchPrivacyStateWithCompletionHandler: and
// documentIsInUseWithTimeout: are left out; a client asks before it calls them.
class VLFileProviderQuireCollaborationProxy final : public VLFileProviderQuireCollaboration,
                                                    public ServiceItem {
 public:
  using ServiceItem::ServiceItem;

  bool respondsToSelector(std::string_view selector) const override;

  // Always version 1 and the capability bits 82.
  void fetchVersionAndCapabilitiesWithCompletionHandler(
      Completion<std::uint64_t, std::uint64_t, NSErrorPtr> handler) override;
  Progress fetchCollaborationTokenWithCompletionHandler(
      Completion<Text, Text, Text, std::optional<NSDate>, NSErrorPtr> handler) override;
  // Fetches by an operation of its own; the extension's downloads neither see nor join it.
  Progress fetchLatestRevisionWithCompletionHandler(Completion<NSErrorPtr> handler) override;
  // The progress has no effect.
  Progress refreshSharingStateWithCompletionHandler(Completion<NSErrorPtr> handler) override;
  void fetchFileProviderIdentifierWithCompletionHandler(
      Completion<Text, NSErrorPtr> handler) override;
  // Always neither a URL nor an error: a document is not shared through a URL from here.
  void fetchURLForSharingFileWithCompletionHandler(
      Completion<NSURLPtr, NSErrorPtr> handler) override;
  // Whether a folder above shares the item. Cannot be cancelled: null.
  Progress fetchFolderSharingStateWithCompletionHandler(
      Completion<bool, NSErrorPtr> handler) override;
  // The same and that folder's name.
  Progress fetchSharedFolderInfoWithCompletionHandler(
      Completion<bool, Text, NSErrorPtr> handler) override;

 private:
  // _newProgressWithCancellationHandler:
  static Progress _newProgressWithCancellationHandler(std::function<void()> handler);
  // What both answers about folder sharing are made of.
  void _fetchShareOptions(Completion<bool, Text, NSErrorPtr> handler);
};

}  // namespace skein
