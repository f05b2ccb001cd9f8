#include "linux/protocol/CallFaults.h"

#include <capnp/dynamic.h>
#include <capnp/schema.h>

#include <map>
#include <utility>

#include "linux/protocol/DaemonCodec.h"
#include "linux/protocol/WithFaults.h"
#include "platform/cloudkit/CKError.h"

namespace skein {
namespace {

using MethodKey = std::pair<std::uint64_t, std::uint16_t>;
struct Method {
  std::string name;
  capnp::StructSchema results;

  bool answersErrors() const { return results.findFieldByName("error") != nullptr; }
};
using Methods = std::map<MethodKey, Method>;

// These always work: with the first two one finds out what faults did, the third ends them.
bool kept(const std::string& name) {
  return name == "checkIndex" || name == "injectFault" || name == "stop";
}

void addMethods(Methods& methods, capnp::InterfaceSchema interface) {
  for (const auto method : interface.getMethods()) {
    std::string name = method.getProto().getName().cStr();
    if (kept(name)) continue;
    methods.emplace(MethodKey(interface.getProto().getId(), method.getOrdinal()),
                    Method{std::move(name), method.getResultType()});
  }
  for (const auto superclass : interface.getSuperclasses()) addMethods(methods, superclass);
}

// Of everything that vald serves: itself, and the objects that its answers carry.
const Methods& allMethods() {
  static const Methods methods = [] {
    Methods all;
    addMethods(all, capnp::Schema::from<wire::Daemon>());
    addMethods(all, capnp::Schema::from<wire::Sender>());
    addMethods(all, capnp::Schema::from<wire::Transfer>());
    addMethods(all, capnp::Schema::from<wire::RecordFetch>());
    return all;
  }();
  return methods;
}

NSErrorPtr injectedError(const FaultInjection& fault) {
  NSErrorUserInfo userInfo{
      {NSLocalizedDescriptionKey, "A fault that was asked for: " + fault.method + "."}};
  // A failure of parts has a part: an item that the cloud does not know.
  if (fault.errorDomain == CKErrorDomain && fault.errorCode == CKErrorPartialFailure) {
    userInfo.emplace(CKPartialErrorsByItemIDKeyPrefix + fault.method,
                     NSError::errorWithDomain(CKErrorDomain, CKErrorUnknownItem));
  }
  return NSError::errorWithDomain(fault.errorDomain, fault.errorCode, std::move(userInfo));
}

}  // namespace

std::vector<FaultableMethod> faultableMethods() {
  std::map<std::string, bool> byName;
  for (const auto& [key, method] : allMethods())
    byName.emplace(method.name, method.answersErrors());
  std::vector<FaultableMethod> methods;
  methods.reserve(byName.size());
  for (const auto& [name, answersErrors] : byName) methods.push_back({name, answersErrors});
  return methods;
}

std::optional<FaultInjection> takeFault(const DaemonService& service, std::uint64_t interfaceID,
                                        std::uint16_t methodID) {
  if (!service.server->faults) return std::nullopt;
  const auto found = allMethods().find({interfaceID, methodID});
  if (found == allMethods().end()) return std::nullopt;
  return service.server->faults->take(found->second.name);
}

kj::Promise<void> answerWithFault(DaemonService& service, const FaultInjection& fault,
                                  std::uint64_t interfaceID, std::uint16_t methodID,
                                  UntypedCall context, kj::Function<kj::Promise<void>()> call) {
  switch (fault.action) {
    case FaultInjection::Action::DropConnection:
      // The call ends unanswered, with its connection.
      service.server->dropConnections();
      return kj::NEVER_DONE;
    case FaultInjection::Action::Delay:
      return service.loop->io()
          .timer.afterDelay(fault.delayMilliseconds * kj::MILLISECONDS)
          .then(kj::mv(call));
    case FaultInjection::Action::AnswerError: break;
  }
  const Method& method = allMethods().at({interfaceID, methodID});
  KJ_REQUIRE(method.answersErrors(), "no error can be answered", method.name);
  auto results = context.getResults().initAs<capnp::DynamicStruct>(method.results);
  codec::encode(results.init("error").as<capnp::DynamicStruct>().as<wire::Error>(),
                *injectedError(fault));
  return kj::READY_NOW;
}

}  // namespace skein
