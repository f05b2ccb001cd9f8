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

}  // namespace skein
