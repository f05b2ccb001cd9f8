// Calls to vald, and what vald pushes back.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "base/UniqueFunction.h"
#include "platform/foundation/NSData.h"
#include "platform/foundation/NSError.h"
#include "platform/foundation/NSURL.h"
#include "platform/xpc/NSXPCProxyCreating.h"
#include "vellum/VLContentRecords.h"
#include "vellum/VLFileObjectID.h"
#include "vellum/VLQueryItem.h"

namespace skein {

// Receives the items of a watched folder as they change. Called on a delivery thread of
// the connection, one push at a time; never on its reader thread. The connection holds
// the receiver until its sender was invalidated or died.
class VLItemNotificationReceiving {
 public:
  virtual ~VLItemNotificationReceiving() = default;

  // receiveUpdates:logicalExtensions:physicalExtensions:reply:
  // `reply` is the daemon's flow control: it holds back further pushes meanwhile.
  virtual void receiveUpdates(const VLQueryItems& items,
                              const std::vector<std::string>& logicalExtensions,
                              const std::vector<std::string>& physicalExtensions,
                              Reply<> reply) = 0;

  // receiveProgressUpdates:reply: the daemon does not wait for this reply.
  virtual void receiveProgressUpdates(const VLQueryItems& updates, Reply<> reply) = 0;
};

// The daemon's end of one watch. Any thread. For each message either its reply or the
// proxy's error handler runs, once, on a reply thread.
class VLItemNotificationSending {
 public:
  virtual ~VLItemNotificationSending() = default;

  // boostPriority: the watch's pushes go before others'.
  virtual void boostPriority(Reply<> reply) = 0;

  // watchItemAtURL:options:gatherReply: the reply comes when the watch stands. 19
  // watches a folder's own children, 23 its whole subtree.
  virtual void watchItemAtURL(const NSURLPtr& url, std::uint64_t options,
                              Reply<NSErrorPtr> gatherReply) = 0;

  // Ends the watch; nothing is pushed afterwards.
  virtual void invalidate() = 0;
};

// A sender as it comes from the daemon: makes proxies of itself.
class VLItemNotificationSender : public VLItemNotificationSending,
                                 public NSXPCProxyCreating<VLItemNotificationSending> {};

// vald itself, as a proxy. Asynchronous: a call returns at once; its reply runs later,
// once, on a reply thread, from where synchronous calls may be made, or the proxy's error
// handler runs instead. Never on the calling thread and never under a caller's lock.
class VLDaemon {
 public:
  using ItemsReply = Reply<NSFileProviderItems, std::uint64_t, NSErrorPtr>;
  using Dictionary = std::map<std::string, std::string>;
  using SenderReply = Reply<std::shared_ptr<VLItemNotificationSender>, Dictionary, NSErrorPtr>;

  virtual ~VLDaemon() = default;

  // enumerateItemsInFolder:sortOrder:offset:limit:completion:
  // `folder` nil: the drive's root. `sortOrder` 0 by name, 1 by date (newest first). The
  // reply's number is the next page's offset, 0 at the end.
  virtual void enumerateItemsInFolder(std::optional<VLFileObjectID> folder, std::uint8_t sortOrder,
                                      std::uint64_t offset, std::uint64_t limit,
                                      ItemsReply completion) = 0;

  // enumerateAllFoldersWithSortOrder:offset:limit:completion:
  virtual void enumerateAllFoldersWithSortOrder(std::uint8_t sortOrder, std::uint64_t offset,
                                                std::uint64_t limit, ItemsReply completion) = 0;

  // currentNotifRankWithReply:
  virtual void currentNotifRankWithReply(Reply<std::uint64_t, NSErrorPtr> reply) = 0;

  // enumerateWorkingSetChangesFromChangeToken:limit:completion:
  // A nil token is the start of the history. At most `limit` changes, updates and
  // deletions together; the token given back unchanged means that there are no more. A
  // token that is too old answers NSFileProviderErrorSyncAnchorExpired.
  virtual void enumerateWorkingSetChangesFromChangeToken(
      std::optional<NSData> changeToken, std::uint64_t limit,
      Reply<NSFileProviderItems, std::vector<VLFileObjectID>, std::optional<NSData>, NSErrorPtr>
          completion) = 0;

  // getItemUpdateSenderWithReceiver:reply: the daemon holds `receiver` as said above. The
  // dictionary is what a daemon has to tell of the sender: this host's has nothing to tell.
  virtual void getItemUpdateSenderWithReceiver(
      std::shared_ptr<VLItemNotificationReceiving> receiver, SenderReply reply) = 0;

  // getContainerURLForID:recreateDocumentsIfNeeded:reply:
  // The documents folder of a container, made again when it is gone and that is wanted. The
  // two values between are the container's display name and whether the folder was made
  // just now. What stands here answers NSFeatureUnsupportedError, on the calling thread:
  // a daemon that offers the call overrides it.
  virtual void getContainerURLForID(
      const std::string& containerID, bool recreateDocumentsIfNeeded,
      Reply<NSURLPtr, std::optional<std::string>, bool, NSErrorPtr> reply);

  // The four below, as the one above, answer NSFeatureUnsupportedError here.

  // checkIfItemIsShareableWithInode:reply: whether a folder or alias may be shared; `inode`
  // is its identifier's number.
  virtual void checkIfItemIsShareableWithInode(std::uint64_t inode, Reply<bool, NSErrorPtr> reply);

  // refreshSharingStateForItemIdentifier:reply: the daemon asks the cloud anew whether and
  // how the item is shared, and replies when its own state is up to date.
  virtual void refreshSharingStateForItemIdentifier(const NSFileProviderItemIdentifier& identifier,
                                                    Reply<NSErrorPtr> reply);

  // getShareOptionsOfItemIdentifier:reply: how the item is shared. In order: a set of flags,
  // one for each way in which the item is reached through a share, its own or that of a
  // folder above it; its own share's public permission; those of the flags that are the
  // item's own share's; the name of the shared folder, nil when there is none; an error.
  // Flags of the first set that are not in the other tell of a shared folder above.
  virtual void getShareOptionsOfItemIdentifier(
      const NSFileProviderItemIdentifier& identifier,
      Reply<std::int64_t, std::int64_t, std::int64_t, std::optional<std::string>, NSErrorPtr>
          reply);

  // resolveFileObjectIDsToContentRecordIDs:reply:
  // The cloud's record of each document's contents. What has none is left out; nil with an
  // error.
  virtual void resolveFileObjectIDsToContentRecordIDs(
      const std::vector<VLFileObjectID>& fileObjectIDs,
      Reply<std::optional<VLContentRecordIDs>, NSErrorPtr> reply);
};

// The process's connection to vald; it is made anew when it was lost. Any
// thread.
class VLDaemonConnection : public NSXPCProxyCreating<VLDaemon> {};

}  // namespace skein
