#include "linux/vald/FaultInjector.h"

#include <algorithm>
#include <utility>
#include <vector>

#include "vellum/VLErrors.h"

namespace skein::vald {
namespace {

constexpr std::size_t kMostPlanned = 100;
constexpr std::uint32_t kMostTimes = 1'000'000;
constexpr std::uint32_t kLongestDelay = 60'000;

NSErrorPtr refused(std::string text) {
  return NSError::errorWithDomain(VLVellumErrorDomain, VLVellumErrorInvalidParameter,
                                  {{NSLocalizedDescriptionKey, std::move(text)}});
}

// A zone's fetch is the cloud's to answer: it knows no connection.
constexpr std::string_view kFetchOfZone = "fetchRecords ";

NSErrorPtr checkMethod(const FaultInjection& fault) {
  if (fault.method.starts_with(kFetchOfZone)) {
    if (fault.action != FaultInjection::Action::DropConnection) return nullptr;
    return refused("A zone's fetch answers an error or is delayed; it has no connection.");
  }
  const std::vector<FaultableMethod> methods = faultableMethods();
  const auto found = std::find_if(methods.begin(), methods.end(),
                                  [&](const auto& method) { return method.name == fault.method; });
  if (found == methods.end()) {
    std::string known;
    for (const FaultableMethod& method : methods) known.append(" ").append(method.name);
    return refused("No method \"" + fault.method + "\" takes faults; these do:" + known + ".");
  }
  if (fault.action == FaultInjection::Action::AnswerError && !found->answersErrors) {
    return refused("\"" + fault.method +
                   "\" answers no errors: it can be delayed, or lose its connection.");
  }
  return nullptr;
}

}  // namespace

NSErrorPtr FaultInjector::plan(FaultInjection fault) {
  if (!_allowed) {
    return refused(
        "vald injects no faults: stop it and start it again with SKEIN_ALLOW_FAULTS=1 in its "
        "environment.");
  }
  if (NSErrorPtr error = checkMethod(fault)) return error;
  if (fault.times == 0 || fault.times > kMostTimes || fault.delayMilliseconds > kLongestDelay) {
    return refused("A fault comes 1 to " + std::to_string(kMostTimes) +
                   " times and delays at most " + std::to_string(kLongestDelay) + " milliseconds.");
  }
  MutexLock lock(_mutex);
  auto& planned = _planned[fault.method];
  if (planned.size() >= kMostPlanned) {
    return refused("Too many faults of \"" + fault.method + "\" wait already.");
  }
  planned.push_back(std::move(fault));
  return nullptr;
}

std::optional<FaultInjection> FaultInjector::take(std::string_view method) {
  if (!_allowed) return std::nullopt;
  MutexLock lock(_mutex);
  const auto found = _planned.find(method);
  if (found == _planned.end() || found->second.empty()) return std::nullopt;
  FaultInjection fault = found->second.front();
  if (--found->second.front().times == 0) found->second.pop_front();
  return fault;
}

}  // namespace skein::vald
