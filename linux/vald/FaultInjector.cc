#include "linux/vald/FaultInjector.h"

#include <algorithm>
#include <array>
#include <utility>

#include "vellum/VLErrors.h"

namespace skein::vald {
namespace {

// The methods that FaultingDaemon asks about.
constexpr std::array<std::string_view, 13> kMethods = {
    "enumerateItemsInFolder",
    "enumerateAllFoldersWithSortOrder",
    "currentNotifRankWithReply",
    "enumerateWorkingSetChangesFromChangeToken",
    "getItemUpdateSenderWithReceiver",
    "URLForFileObjectID",
    "queryItemForURL",
    "account",
    "logIn",
    "logOut",
    "containers",
    "subscribe",
    "status",
};
constexpr std::size_t kMostPlanned = 100;
constexpr std::uint32_t kMostTimes = 1'000'000;
constexpr std::uint32_t kLongestDelay = 60'000;

NSErrorPtr refused(std::string text) {
  return NSError::errorWithDomain(VLVellumErrorDomain, VLVellumErrorInvalidParameter,
                                  {{NSLocalizedDescriptionKey, std::move(text)}});
}

}  // namespace

NSErrorPtr FaultInjector::plan(FaultInjection fault) {
  if (!_allowed) {
    return refused(
        "vald injects no faults: stop it and start it again with SKEIN_ALLOW_FAULTS=1 in its "
        "environment.");
  }
  if (std::find(kMethods.begin(), kMethods.end(), fault.method) == kMethods.end()) {
    std::string known;
    for (const std::string_view method : kMethods) known.append(" ").append(method);
    return refused("No method \"" + fault.method + "\" takes faults; these do:" + known + ".");
  }
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
