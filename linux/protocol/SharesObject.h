// vald's shares, as one connection sees them. Include this in few files: it costs seconds to
// compile.
#pragma once

#include "linux/protocol/DaemonService.h"
#include "linux/protocol/SharesCodec.h"

namespace skein {

// The part of vald's object that has to do with shares. Lives on the loop's thread. A client
// that lets go of a call that may be given up, or is gone, cancels it.
class SharesObject : public virtual wire::Shares::Server {
 public:
  explicit SharesObject(DaemonServicePtr service) : _service(std::move(service)) {}

  kj::Promise<void> copyShare(CopyShareContext context) override;
  kj::Promise<void> newShare(NewShareContext context) override;
  kj::Promise<void> copyShareURL(CopyShareURLContext context) override;
  kj::Promise<void> saveShare(SaveShareContext context) override;
  kj::Promise<void> destroyShare(DestroyShareContext context) override;
  kj::Promise<void> copyShareTokens(CopyShareTokensContext context) override;

  kj::Promise<void> answerInvitation(AnswerInvitationContext context) override;
  kj::Promise<void> attachZone(AttachZoneContext context) override;
  kj::Promise<void> detachZone(DetachZoneContext context) override;
  kj::Promise<void> attachedZones(AttachedZonesContext context) override;

  kj::Promise<void> isShareable(IsShareableContext context) override;
  kj::Promise<void> refreshSharingState(RefreshSharingStateContext context) override;
  kj::Promise<void> shareOptions(ShareOptionsContext context) override;

 private:
  LocalShares& shares() const { return _service->server->daemon->shares(); }
  // start(shares, params, reply) answers the progress that cancels what it started.
  template <class Context, class Start, class Encode>
  kj::Promise<void> answerUnlessGivenUp(Context context, Start start, Encode encode);

  const DaemonServicePtr _service;
};

}  // namespace skein
