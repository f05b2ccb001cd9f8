#include "linux/protocol/SharesObject.h"

#include <optional>
#include <utility>
#include <vector>

#include "linux/protocol/Answer.h"

namespace skein {
namespace {

constexpr auto encodeWholeShare = [](auto results, const CKSharePtr& share,
                                     const NSErrorPtr& error) {
  if (share) codec::encode(results.initShare(), *share);
  codec::setError(results, error);
};

// Cancels a call that ends before it was answered.
struct GivingUp {
  std::shared_ptr<NSProgress> progress;  // null: it was answered

  ~GivingUp() {
    if (progress) progress->cancel();
  }
};

}  // namespace

template <class Context, class Start, class Encode>
kj::Promise<void> SharesObject::answerUnlessGivenUp(Context context, Start start, Encode encode) {
  context.allowCancellation();
  // What was given up before it came here ends before it is started.
  return kj::evalLater([this, context, start = std::move(start),
                        encode = std::move(encode)]() mutable {
    auto givingUp = kj::heap<GivingUp>();
    GivingUp& call = *givingUp;
    auto answered = answer(
        _service, context,
        [&](auto reply) { call.progress = start(shares(), context.getParams(), std::move(reply)); },
        std::move(encode));
    return answered.then([&call] { call.progress = nullptr; }).attach(kj::mv(givingUp));
  });
}

kj::Promise<void> SharesObject::copyShare(CopyShareContext context) {
  return answerUnlessGivenUp(
      context,
      [](LocalShares& shares, auto params, auto reply) {
        return shares.copyShare(urlFromClient(params.getUrl()), std::move(reply));
      },
      [](auto results, const CKSharePtr& share, const std::optional<std::string>& folder,
         const NSErrorPtr& error) {
        if (folder) results.setFolder(codec::bytes(*folder));
        encodeWholeShare(results, share, error);
      });
}

kj::Promise<void> SharesObject::newShare(NewShareContext context) {
  return answerUnlessGivenUp(
      context,
      [](LocalShares& shares, auto params, auto reply) {
        return shares.newShare(urlFromClient(params.getUrl()), std::move(reply));
      },
      encodeWholeShare);
}

kj::Promise<void> SharesObject::copyShareURL(CopyShareURLContext context) {
  return answerUnlessGivenUp(
      context,
      [](LocalShares& shares, auto params, auto reply) {
        return shares.copyShareURL(urlFromClient(params.getUrl()), std::move(reply));
      },
      [](auto results, const NSURLPtr& url, const NSErrorPtr& error) {
        if (url) results.setAddress(codec::bytes(url->absoluteString()));
        codec::setError(results, error);
      });
}

kj::Promise<void> SharesObject::saveShare(SaveShareContext context) {
  return answerUnlessGivenUp(
      context,
      [](LocalShares& shares, auto params, auto reply) {
        return shares.saveShare(codec::decode(params.getShare()), std::move(reply));
      },
      encodeWholeShare);
}

kj::Promise<void> SharesObject::destroyShare(DestroyShareContext context) {
  return answerUnlessGivenUp(
      context,
      [](LocalShares& shares, auto params, auto reply) {
        return shares.destroyShare(codec::decode(params.getShare()), std::move(reply));
      },
      codec::encodeError);
}

kj::Promise<void> SharesObject::copyShareTokens(CopyShareTokensContext context) {
  return answerUnlessGivenUp(
      context,
      [](LocalShares& shares, auto params, auto reply) {
        return shares.copyShareTokens(urlFromClient(params.getUrl()), std::move(reply));
      },
      [](auto results, const std::optional<std::string>& shareToken,
         const std::optional<std::string>& baseToken, const NSErrorPtr& error) {
        if (shareToken) results.setShareToken(codec::bytes(*shareToken));
        if (baseToken) results.setBaseToken(codec::bytes(*baseToken));
        codec::setError(results, error);
      });
}

kj::Promise<void> SharesObject::answerInvitation(AnswerInvitationContext context) {
  const auto params = context.getParams();
  return answer(
      _service, context,
      [&](auto reply) {
        shares().answerInvitation(NSURL::URLWithString(codec::text(params.getAddress())),
                                  codec::text(params.getParticipant()), params.getAccepts(),
                                  std::move(reply));
      },
      codec::encodeError);
}

kj::Promise<void> SharesObject::attachZone(AttachZoneContext context) {
  const auto params = context.getParams();
  return answer(
      _service, context,
      [&](auto reply) {
        shares().attachZone(urlFromClient(params.getFolder()), codec::decode(params.getZone()),
                            params.getPermission(), std::move(reply));
      },
      codec::encodeError);
}

kj::Promise<void> SharesObject::detachZone(DetachZoneContext context) {
  const NSURLPtr folder = urlFromClient(context.getParams().getFolder());
  return answer(
      _service, context, [&](auto reply) { shares().detachZone(folder, std::move(reply)); },
      codec::encodeError);
}

kj::Promise<void> SharesObject::attachedZones(AttachedZonesContext context) {
  return answer(
      _service, context, [&](auto reply) { shares().attachedZones(std::move(reply)); },
      [](auto results, const std::vector<AttachedZone>& zones, const NSErrorPtr& error) {
        auto list = results.initZones(static_cast<unsigned>(zones.size()));
        unsigned at = 0;
        for (const AttachedZone& zone : zones) codec::encode(list[at++], zone);
        codec::setError(results, error);
      });
}

kj::Promise<void> SharesObject::isShareable(IsShareableContext context) {
  const VLFileObjectID item = codec::decode(context.getParams().getItem());
  return answer(
      _service, context, [&](auto reply) { shares().isShareable(item, std::move(reply)); },
      [](auto results, bool shareable, const NSErrorPtr& error) {
        results.setShareable(shareable);
        codec::setError(results, error);
      });
}

kj::Promise<void> SharesObject::refreshSharingState(RefreshSharingStateContext context) {
  const auto identifier = codec::text(context.getParams().getIdentifier());
  return answer(
      _service, context,
      [&](auto reply) { shares().refreshSharingState(identifier, std::move(reply)); },
      codec::encodeError);
}

kj::Promise<void> SharesObject::shareOptions(ShareOptionsContext context) {
  const auto identifier = codec::text(context.getParams().getIdentifier());
  return answer(
      _service, context, [&](auto reply) { shares().shareOptions(identifier, std::move(reply)); },
      [](auto results, const ShareOptions& options, const NSErrorPtr& error) {
        codec::encode(results.initOptions(), options);
        codec::setError(results, error);
      });
}

}  // namespace skein
