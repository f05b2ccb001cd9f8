#pragma once

#include <memory>
#include <string>

#include "base/Mutex.h"
#include "services/ServiceItem.h"
#include "support/VLLogSection.h"
#include "vellum/VLSharingServiceV1.h"

namespace skein {

// Sharing one item, for one connection: what a client app reaches.
//
// Every method opens an info-level section that closes when the method returns, whether or
// not its reply has come; every reply is logged just before it is given. Methods come on
// the transport's threads; replies of what asks the framework, on the framework's.
class VLSharingProxy final : public VLSharingServiceV1,
                             public ServiceItem,
                             public std::enable_shared_from_this<VLSharingProxy> {
 public:
  using ServiceItem::ServiceItem;

  void fetchSharingInfo(Completion<bool, VLFileProviderItemPtr, NSErrorPtr> reply) override;
  // Answers with the same flag: no other test is made.
  Progress preflightCheckIfCurrentlyShareableWithCompletion(
      Completion<bool, VLFileProviderItemPtr, Items, Items, NSErrorPtr> completion) override;
  Progress fetchParticipantListAndPublicPermission(
      Completion<Participants, std::int64_t, NSErrorPtr> reply) override;
  // Has no effect.
  void startPreparingForShareWhenForcing(bool forcing) override;
  // Once the share is known it is answered from what is known, without a progress; the
  // progress of a fetch is never advanced.
  Progress fetchShareWithCompletion(Completion<CKSharePtr, NSErrorPtr> completion) override;
  Progress fetchShareURLWithCompletion(Completion<NSURLPtr, NSErrorPtr> completion) override;
  // Refuses a folder's share with POSIX error 45.
  Progress saveShare(CKSharePtr share, Completion<CKSharePtr, NSErrorPtr> completion) override;
  // Refuses a folder's share with POSIX error 45 unless the item is inode-based, that is,
  // unless it may be that folder.
  Progress unshareWithCompletion(Completion<NSErrorPtr> completion) override;

 private:
  VLLogSection _openSection(const char* method) const;
  // Whether the item is shared, or why that cannot be said.
  bool _isShared(NSErrorOut error) const;
  NSURLPtr _url() const;

  // unshareWithCompletion:, once the share is there.
  void _removeShare(const CKSharePtr& share, const std::shared_ptr<NSProgress>& progress,
                    Completion<NSErrorPtr> reply);

  // The last share known for the item, or nil. It is read and written at any time, by
  // framework threads too, without anyone waiting for a request to end.
  CKSharePtr _currentCachedShare() const SKEIN_EXCLUDES(_mutex);
  void _setCachedShare(CKSharePtr share) SKEIN_EXCLUDES(_mutex);

  mutable Mutex _mutex;
  CKSharePtr _cachedShare SKEIN_GUARDED_BY(_mutex);
};

// "<VLSharingProxy: 0x...>": tells one connection's lines from another's.
std::string description(const VLSharingProxy& proxy);

}  // namespace skein
