#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <vector>

#include "base/Completion.h"
#include "platform/cloudkit/CKShare.h"
#include "platform/fileprovider/NSFileProviderItem.h"
#include "platform/foundation/NSError.h"
#include "platform/foundation/NSProgress.h"
#include "platform/foundation/NSURL.h"
#include "platform/xpc/NSXPCConnection.h"

namespace skein {

// What the service calls an item.
using VLFileProviderItem = NSFileProviderItem;
using VLFileProviderItemPtr = std::shared_ptr<const VLFileProviderItem>;

inline constexpr char VLSharingServiceName[] = "com.tessel.Vellum.SharingV1";

// Sharing one item, as a client process meets it. Methods return soon; each reply comes
// once, on any thread, perhaps before the method has returned. A progress may be null: there
// is nothing to cancel then.
class VLSharingServiceV1 : public NSXPCExportedObject {
 public:
  using Progress = std::shared_ptr<NSProgress>;
  using Items = std::optional<std::vector<VLFileProviderItemPtr>>;
  using Participants = std::optional<std::vector<CKShareParticipant>>;

  // fetchSharingInfo: whether the item is shared.
  virtual void fetchSharingInfo(Completion<bool, VLFileProviderItemPtr, NSErrorPtr> reply) = 0;

  // preflightCheckIfCurrentlyShareableWithCompletion:
  virtual Progress preflightCheckIfCurrentlyShareableWithCompletion(
      Completion<bool, VLFileProviderItemPtr, Items, Items, NSErrorPtr> completion) = 0;

  // fetchParticipantListAndPublicPermission:
  virtual Progress fetchParticipantListAndPublicPermission(
      Completion<Participants, std::int64_t, NSErrorPtr> reply) = 0;

  // startPreparingForShareWhenForcing:
  virtual void startPreparingForShareWhenForcing(bool forcing) = 0;

  // fetchShareWithCompletion: the item's share, or where it has none one to begin with,
  // which the server does not know yet.
  virtual Progress fetchShareWithCompletion(Completion<CKSharePtr, NSErrorPtr> completion) = 0;

  // fetchShareURLWithCompletion:
  virtual Progress fetchShareURLWithCompletion(Completion<NSURLPtr, NSErrorPtr> completion) = 0;

  // saveShare:completion: the share as the server has it then.
  virtual Progress saveShare(CKSharePtr share, Completion<CKSharePtr, NSErrorPtr> completion) = 0;

  // unshareWithCompletion:
  virtual Progress unshareWithCompletion(Completion<NSErrorPtr> completion) = 0;
};

// getSharingServiceInterface
inline NSXPCInterface getSharingServiceInterface() {
  return NSXPCInterface::interfaceWithProtocol("VLSharingServiceV1");
}

}  // namespace skein
