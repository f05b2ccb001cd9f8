// The shares of a drive's items: what vald's local cloud keeps of who else may see or change
// them, and the zones of others that are attached as folders. Stands on both sides of the
// socket, as LocalDaemon does.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "base/UniqueFunction.h"
#include "platform/cloudkit/CKShare.h"
#include "platform/cloudkit/CloudKit.h"
#include "platform/foundation/NSError.h"
#include "platform/foundation/NSProgress.h"
#include "platform/foundation/NSURL.h"
#include "vellum/VLQueryItem.h"

namespace skein {

// Somebody else's zone, attached as a folder of the drive.
struct AttachedZone {
  NSURLPtr folder;  // null while the folder is gone
  CKRecordZoneID zone;
  // What its owner lets this drive do there.
  CKShareParticipantPermission permission = CKShareParticipantPermissionReadWrite;
};

// How an item is shared, by flags.
inline constexpr std::int64_t kHasOwnShare = 1;       // whoever's it is
inline constexpr std::int64_t kInSharedFolder = 2;    // below a folder that this drive shares
inline constexpr std::int64_t kInFolderOfOthers = 4;  // below one that somebody else shares

struct ShareOptions {
  std::int64_t flags = 0;
  std::int64_t ownFlags = 0;  // those that tell of the item's own share
  // Of the item's own share; unknown (0) without one.
  CKShareParticipantPermission publicPermission = CKShareParticipantPermissionUnknown;
  std::optional<std::string> sharedFolder;  // the name of the nearest shared one above
};

// Asynchronous, as VLDaemon: a call returns at once; its reply runs later, once, on a reply
// thread, or the proxy's error handler runs instead. A call's progress has one unit;
// cancelling it ends the request, whose reply is NSUserCancelledError unless what was asked
// has just been done. URLs are absolute file URLs in the store; a null one is answered with
// an invalid-parameter error.
//
// Errors: NSCocoaErrorDomain 4 for an item that is not there; VLVellumErrorUnknownShare for
// one without a share; CKErrorPermissionFailure, with the reason, for what cannot be shared
// or is somebody else's to share; CKErrorServerRecordChanged for a new share of an item that
// has been shared meanwhile, CKErrorUnknownItem for a change of a share that has been
// removed; CKErrorPartialFailure when some participants cannot be invited. Nothing was
// changed then.
class LocalShares {
 public:
  using ShareReply = Reply<CKSharePtr, NSErrorPtr>;

  virtual ~LocalShares() = default;

  // The share that covers the item: its own, or the nearest of a folder above it. The text is
  // that folder's identifier; nil when the share is the item's own.
  virtual std::shared_ptr<NSProgress> copyShare(
      NSURLPtr url, Reply<CKSharePtr, std::optional<std::string>, NSErrorPtr> reply) = 0;
  // A share of the item with nobody in it. It gives no access until it is saved.
  virtual std::shared_ptr<NSProgress> newShare(NSURLPtr url, ShareReply reply) = 0;
  // Where people come to the item by its share, or by that of a folder above it. An item
  // without one is first shared with nobody.
  virtual std::shared_ptr<NSProgress> copyShareURL(NSURLPtr url,
                                                   Reply<NSURLPtr, NSErrorPtr> reply) = 0;
  // Writes the share of the item that it names, and answers it as it is kept: the owner
  // first, whoever is new pending, whoever was there before with the acceptance that he gave.
  virtual std::shared_ptr<NSProgress> saveShare(CKShare share, ShareReply reply) = 0;
  virtual std::shared_ptr<NSProgress> destroyShare(CKShare share, Reply<NSErrorPtr> reply) = 0;
  // The token of the share that covers the item, and the item's base token, which is the same
  // through every share that the item has.
  virtual std::shared_ptr<NSProgress> copyShareTokens(
      NSURLPtr url,
      Reply<std::optional<std::string>, std::optional<std::string>, NSErrorPtr> reply) = 0;

  // Says for a participant, who is not of this drive, that the invitation to the share at
  // `shareURL` was accepted or declined.
  virtual void answerInvitation(NSURLPtr shareURL, std::string participant, bool accepts,
                                Reply<NSErrorPtr> reply) = 0;

  // Makes an existing folder the root of a zone of somebody else's: its items are of that
  // zone and shared by its owner. Lasts until it is detached. The folder may not be the
  // drive's root, an app's, nor above or below a shared one.
  virtual void attachZone(NSURLPtr folder, CKRecordZoneID zone,
                          CKShareParticipantPermission permission, Reply<NSErrorPtr> reply) = 0;
  // The folder and what is in it stay, as one's own. By the folder's URL.
  virtual void detachZone(NSURLPtr folder, Reply<NSErrorPtr> reply) = 0;
  virtual void attachedZones(Reply<std::vector<AttachedZone>, NSErrorPtr> reply) = 0;

  // The framework's questions (VLDaemon has them under its own names), by identifier.
  //
  // Not the drive's root, an app's folder, an alias, what is in the trash, what lies in a
  // shared folder, and what somebody else shares; and nothing at or below a folder with the
  // extended attribute "user.skein.shareable" set to "no". An item that is shared already may
  // be shared on.
  virtual void isShareable(VLFileObjectID item, Reply<bool, NSErrorPtr> reply) = 0;
  // Brings what listings tell of an item in line with the cloud's shares. A share of an item
  // that is gone is forgotten.
  virtual void refreshSharingState(NSFileProviderItemIdentifier item, Reply<NSErrorPtr> reply) = 0;
  virtual void shareOptions(NSFileProviderItemIdentifier item,
                            Reply<ShareOptions, NSErrorPtr> reply) = 0;
};

}  // namespace skein
