#include "linux/protocol/CloudObject.h"

#include <utility>

#include "linux/protocol/Answer.h"

namespace skein {

kj::Promise<void> CloudObject::setConditions(SetConditionsContext context) {
  return answer(
      _service, context,
      [&](auto reply) {
        cloud().setConditions(codec::decode(context.getParams().getConditions()), std::move(reply));
      },
      codec::encodeError);
}

kj::Promise<void> CloudObject::cloudStatus(CloudStatusContext context) {
  return answer(
      _service, context, [&](auto reply) { cloud().cloudStatus(std::move(reply)); },
      [](auto results, const LocalCloudStatus& status, const NSErrorPtr& error) {
        codec::encode(results.initStatus(), status);
        codec::setError(results, error);
      });
}

kj::Promise<void> CloudObject::setKeeping(SetKeepingContext context) {
  return answer(
      _service, context,
      [&](auto reply) {
        cloud().setKeeping(codec::decode(context.getParams().getKeeping()), std::move(reply));
      },
      codec::encodeError);
}

kj::Promise<void> CloudObject::collect(CollectContext context) {
  return answer(
      _service, context, [&](auto reply) { cloud().collect(std::move(reply)); },
      [](auto results, const LocalCloudCollection& collection, const NSErrorPtr& error) {
        codec::encode(results.initCollection(), collection);
        codec::setError(results, error);
      });
}

kj::Promise<void> CloudObject::verify(VerifyContext context) {
  return answer(
      _service, context,
      [&](auto reply) {
        const auto params = context.getParams();
        cloud().verify(codec::decode(params.getMarkers()), params.getQuick(), std::move(reply));
      },
      [](auto results, const LocalCloudVerification& verification, const NSErrorPtr& error) {
        codec::encode(results.initVerification(), verification);
        codec::setError(results, error);
      });
}

}  // namespace skein
