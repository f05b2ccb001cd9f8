#include "linux/protocol/CloudProxy.h"

#include <utility>

#include "linux/protocol/CloudCodec.h"
#include "linux/protocol/DaemonCalls.h"

namespace skein {
namespace {

class CloudProxy final : public LocalCloud {
 public:
  explicit CloudProxy(DaemonCalls calls) : _calls(std::move(calls)) {}

  void setConditions(LocalCloudConditions conditions, Reply<NSErrorPtr> reply) override {
    _calls.call<wire::Cloud>(
        [conditions](wire::Cloud::Client& cloud) {
          auto request = cloud.setConditionsRequest();
          codec::encode(request.initConditions(), conditions);
          return request.send();
        },
        errorReply(std::move(reply)));
  }

  void cloudStatus(Reply<LocalCloudStatus, NSErrorPtr> reply) override {
    _calls.call<wire::Cloud>(
        [](wire::Cloud::Client& cloud) { return cloud.cloudStatusRequest().send(); },
        [reply = std::move(reply)](const auto& results) mutable -> Task {
          return [reply = std::move(reply), status = codec::decode(results.getStatus()),
                  error = codec::errorOf(results)]() mutable {
            reply(std::move(status), std::move(error));
          };
        });
  }

  void setKeeping(LocalCloudKeeping keeping, Reply<NSErrorPtr> reply) override {
    _calls.call<wire::Cloud>(
        [keeping](wire::Cloud::Client& cloud) {
          auto request = cloud.setKeepingRequest();
          codec::encode(request.initKeeping(), keeping);
          return request.send();
        },
        errorReply(std::move(reply)));
  }

  void verify(std::vector<std::string> markers, bool quick,
              Reply<LocalCloudVerification, NSErrorPtr> reply) override {
    _calls.call<wire::Cloud>(
        [markers = std::move(markers), quick](wire::Cloud::Client& cloud) {
          auto request = cloud.verifyRequest();
          codec::encode(request.initMarkers(static_cast<unsigned>(markers.size())), markers);
          request.setQuick(quick);
          return request.send();
        },
        [reply = std::move(reply)](const auto& results) mutable -> Task {
          return [reply = std::move(reply), verification = codec::decode(results.getVerification()),
                  error = codec::errorOf(results)]() mutable {
            reply(std::move(verification), std::move(error));
          };
        },
        Patience::WhilePeerLives);
  }

  void collect(Reply<LocalCloudCollection, NSErrorPtr> reply) override {
    _calls.call<wire::Cloud>(
        [](wire::Cloud::Client& cloud) { return cloud.collectRequest().send(); },
        [reply = std::move(reply)](const auto& results) mutable -> Task {
          return
              [reply = std::move(reply), collection = codec::decode(results.getCollection()),
               error = codec::errorOf(results)]() mutable { reply(collection, std::move(error)); };
        },
        Patience::WhilePeerLives);
  }

 private:
  const DaemonCalls _calls;
};

}  // namespace

std::unique_ptr<LocalCloud> makeCloudProxy(DaemonCalls calls) {
  return std::make_unique<CloudProxy>(std::move(calls));
}

}  // namespace skein
