// Where each call of a client passes before it reaches the object that it is for. Include
// this in few files: it costs seconds to compile.
#pragma once

#include <capnp/capability.h>
#include <kj/function.h>

#include <cstdint>
#include <optional>
#include <utility>

#include "linux/protocol/CallFaults.h"
#include "linux/protocol/DaemonService.h"

namespace skein {

using UntypedCall = capnp::CallContext<capnp::AnyPointer, capnp::AnyPointer>;

// The fault that is planned for the method, if any.
std::optional<FaultInjection> takeFault(const DaemonService& service, std::uint64_t interfaceID,
                                        std::uint16_t methodID);
// Answers the call as the fault says; `call` makes it reach its object after all.
kj::Promise<void> answerWithFault(DaemonService& service, const FaultInjection& fault,
                                  std::uint64_t interfaceID, std::uint16_t methodID,
                                  UntypedCall context, kj::Function<kj::Promise<void>()> call);

// One of vald's objects as its clients get it. The service is the object's first argument.
template <class Object>
class WithFaults final : public Object {
 public:
  template <class... Arguments>
  explicit WithFaults(DaemonServicePtr service, Arguments&&... arguments)
      : Object(service, std::forward<Arguments>(arguments)...), _servedBy(std::move(service)) {}

  capnp::Capability::Server::DispatchCallResult dispatchCall(std::uint64_t interfaceID,
                                                             std::uint16_t methodID,
                                                             UntypedCall context) override {
    const std::optional<FaultInjection> fault = takeFault(*_servedBy, interfaceID, methodID);
    if (!fault) return Object::dispatchCall(interfaceID, methodID, context);
    auto call = [this, interfaceID, methodID, context]() mutable {
      auto dispatched = Object::dispatchCall(interfaceID, methodID, context);
      return kj::mv(dispatched.promise);
    };
    return {answerWithFault(*_servedBy, *fault, interfaceID, methodID, context, kj::mv(call)),
            false};
  }

 private:
  const DaemonServicePtr _servedBy;
};

}  // namespace skein
