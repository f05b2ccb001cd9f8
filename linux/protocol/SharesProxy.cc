#include "linux/protocol/SharesProxy.h"

#include <tuple>
#include <utility>

#include "linux/protocol/CancellableCall.h"
#include "linux/protocol/DaemonCalls.h"
#include "linux/protocol/SharesCodec.h"

namespace skein {
namespace {

NSErrorPtr cancelled() {
  return NSError::errorWithDomain(
      NSCocoaErrorDomain, NSUserCancelledError,
      {{NSLocalizedDescriptionKey, std::string("The request was cancelled.")}});
}

// A request that names its item by URL.
template <class Request>
auto sendWithURL(Request request, const NSURLPtr& url) {
  if (url) request.setUrl(codec::bytes(url->path()));
  return request.send();
}

std::tuple<CKSharePtr, NSErrorPtr> shareOf(const auto& results) {
  CKSharePtr share;
  if (results.hasShare())
    share = std::make_shared<const CKShare>(codec::decode(results.getShare()));
  return {std::move(share), codec::errorOf(results)};
}

class SharesProxy final : public LocalShares {
 public:
  explicit SharesProxy(DaemonCalls calls) : _calls(std::move(calls)) {}

  std::shared_ptr<NSProgress> copyShare(
      NSURLPtr url, Reply<CKSharePtr, std::optional<std::string>, NSErrorPtr> reply) override {
    return callUnlessCancelled(
        std::move(reply),
        [=](wire::Shares::Client& shares) { return sendWithURL(shares.copyShareRequest(), url); },
        [](const auto& results) {
          auto [share, error] = shareOf(results);
          return std::tuple(std::move(share),
                            codec::optionalText(results.hasFolder(), results.getFolder()),
                            std::move(error));
        });
  }

  std::shared_ptr<NSProgress> newShare(NSURLPtr url, ShareReply reply) override {
    return callUnlessCancelled(
        std::move(reply),
        [=](wire::Shares::Client& shares) { return sendWithURL(shares.newShareRequest(), url); },
        [](const auto& results) { return shareOf(results); });
  }

  std::shared_ptr<NSProgress> copyShareURL(NSURLPtr url,
                                           Reply<NSURLPtr, NSErrorPtr> reply) override {
    return callUnlessCancelled(
        std::move(reply),
        [=](wire::Shares::Client& shares) {
          return sendWithURL(shares.copyShareURLRequest(), url);
        },
        [](const auto& results) {
          NSURLPtr address;
          if (results.hasAddress())
            address = NSURL::URLWithString(codec::text(results.getAddress()));
          return std::tuple(std::move(address), codec::errorOf(results));
        });
  }

  std::shared_ptr<NSProgress> saveShare(CKShare share, ShareReply reply) override {
    return callUnlessCancelled(
        std::move(reply),
        [share = std::move(share)](wire::Shares::Client& shares) {
          auto request = shares.saveShareRequest();
          codec::encode(request.initShare(), share);
          return request.send();
        },
        [](const auto& results) { return shareOf(results); });
  }

  std::shared_ptr<NSProgress> destroyShare(CKShare share, Reply<NSErrorPtr> reply) override {
    return callUnlessCancelled(
        std::move(reply),
        [share = std::move(share)](wire::Shares::Client& shares) {
          auto request = shares.destroyShareRequest();
          codec::encode(request.initShare(), share);
          return request.send();
        },
        [](const auto& results) { return std::tuple(codec::errorOf(results)); });
  }

  std::shared_ptr<NSProgress> copyShareTokens(
      NSURLPtr url,
      Reply<std::optional<std::string>, std::optional<std::string>, NSErrorPtr> reply) override {
    return callUnlessCancelled(
        std::move(reply),
        [=](wire::Shares::Client& shares) {
          return sendWithURL(shares.copyShareTokensRequest(), url);
        },
        [](const auto& results) {
          return std::tuple(codec::optionalText(results.hasShareToken(), results.getShareToken()),
                            codec::optionalText(results.hasBaseToken(), results.getBaseToken()),
                            codec::errorOf(results));
        });
  }

  void answerInvitation(NSURLPtr shareURL, std::string participant, bool accepts,
                        Reply<NSErrorPtr> reply) override {
    call(
        [=](wire::Shares::Client& shares) {
          auto request = shares.answerInvitationRequest();
          if (shareURL) request.setAddress(codec::bytes(shareURL->absoluteString()));
          request.setParticipant(codec::bytes(participant));
          request.setAccepts(accepts);
          return request.send();
        },
        errorReply(std::move(reply)));
  }

  void attachZone(NSURLPtr folder, CKRecordZoneID zone, CKShareParticipantPermission permission,
                  Reply<NSErrorPtr> reply) override {
    call(
        [=](wire::Shares::Client& shares) {
          auto request = shares.attachZoneRequest();
          if (folder) request.setFolder(codec::bytes(folder->path()));
          codec::encode(request.initZone(), zone);
          request.setPermission(permission);
          return request.send();
        },
        errorReply(std::move(reply)));
  }

  void detachZone(NSURLPtr folder, Reply<NSErrorPtr> reply) override {
    call(
        [=](wire::Shares::Client& shares) {
          auto request = shares.detachZoneRequest();
          if (folder) request.setFolder(codec::bytes(folder->path()));
          return request.send();
        },
        errorReply(std::move(reply)));
  }

  void attachedZones(Reply<std::vector<AttachedZone>, NSErrorPtr> reply) override {
    call([](wire::Shares::Client& shares) { return shares.attachedZonesRequest().send(); },
         [reply = std::move(reply)](const auto& results) mutable -> Task {
           std::vector<AttachedZone> zones;
           for (const auto zone : results.getZones()) zones.push_back(codec::decode(zone));
           return [reply = std::move(reply), zones = std::move(zones),
                   error = codec::errorOf(results)]() mutable {
             reply(std::move(zones), std::move(error));
           };
         });
  }

  void isShareable(VLFileObjectID item, Reply<bool, NSErrorPtr> reply) override {
    call(
        [=](wire::Shares::Client& shares) {
          auto request = shares.isShareableRequest();
          codec::encode(request.initItem(), item);
          return request.send();
        },
        [reply = std::move(reply)](const auto& results) mutable -> Task {
          return
              [reply = std::move(reply), shareable = results.getShareable(),
               error = codec::errorOf(results)]() mutable { reply(shareable, std::move(error)); };
        });
  }

  void refreshSharingState(NSFileProviderItemIdentifier item, Reply<NSErrorPtr> reply) override {
    call(
        [=](wire::Shares::Client& shares) {
          auto request = shares.refreshSharingStateRequest();
          request.setIdentifier(codec::bytes(item));
          return request.send();
        },
        errorReply(std::move(reply)));
  }

  void shareOptions(NSFileProviderItemIdentifier item,
                    Reply<ShareOptions, NSErrorPtr> reply) override {
    call(
        [=](wire::Shares::Client& shares) {
          auto request = shares.shareOptionsRequest();
          request.setIdentifier(codec::bytes(item));
          return request.send();
        },
        [reply = std::move(reply)](const auto& results) mutable -> Task {
          return [reply = std::move(reply), options = codec::decode(results.getOptions()),
                  error = codec::errorOf(results)]() mutable {
            reply(std::move(options), std::move(error));
          };
        });
  }

 private:
  template <class Build, class Decode>
  void call(Build build, Decode decode) {
    _calls.call<wire::Shares>(std::move(build), std::move(decode));
  }

  // decode(results) makes the reply's values.
  template <class... Values, class Build, class Decode>
  std::shared_ptr<NSProgress> callUnlessCancelled(Reply<Values...> reply, Build build,
                                                  Decode decode) {
    std::shared_ptr<NSProgress> progress;
    auto cancellable = CancellableCall::make(_calls.socket()->loop(), progress);
    _calls.call<wire::Shares>(
        [build = std::move(build), decode = std::move(decode),
         cancellable = std::move(cancellable)](wire::Shares::Client& shares) mutable {
          auto givenUp = kj::heap<std::tuple<Values...>>();
          std::get<NSErrorPtr>(*givenUp) = cancelled();
          kj::Promise<kj::Own<std::tuple<Values...>>> answered = nullptr;
          if (!cancellable->isCancelled()) {
            answered = build(shares).then([decode = std::move(decode)](auto&& results) {
              return kj::heap<std::tuple<Values...>>(decode(results));
            });
          }
          return cancellable->unlessCancelled(kj::mv(answered), kj::mv(givenUp))
              .attach(std::move(cancellable));
        },
        [reply = std::move(reply),
         progress](kj::Own<std::tuple<Values...>>& values) mutable -> Task {
          return [reply = std::move(reply), progress, values = std::move(*values)]() mutable {
            progress->setCompletedUnitCount(1);
            std::apply([&](Values&... each) { reply(std::move(each)...); }, values);
          };
        },
        Patience::WhilePeerLives);
    return progress;
  }

  const DaemonCalls _calls;
};

}  // namespace

std::unique_ptr<LocalShares> makeSharesProxy(DaemonCalls calls) {
  return std::make_unique<SharesProxy>(std::move(calls));
}

}  // namespace skein
