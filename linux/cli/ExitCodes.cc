#include "linux/cli/ExitCodes.h"

#include <cerrno>
#include <cstdint>
#include <limits>
#include <string_view>

#include "platform/cloudkit/CKError.h"
#include "platform/fileprovider/NSFileProviderError.h"
#include "vellum/VLErrors.h"

namespace skein::cli {
namespace {

struct Meaning {
  std::string_view domain;
  std::int64_t code;
  ExitCode exitCode;
  std::string_view cause;  // when the error brings no text of its own
  std::string_view nextStep;
};

constexpr std::int64_t kAnyCode = std::numeric_limits<std::int64_t>::min();

constexpr std::string_view kLogIn = "log in with: skein account login";
constexpr std::string_view kPermissions = "look at the owner and the mode of it and of its folder";
constexpr std::string_view kMoreRoom = "delete something, or get more room";
constexpr std::string_view kTryAgain = "try again, or end the drive's processes with: skein stop";

constexpr Meaning kMeanings[] = {
    {NSFileProviderErrorDomain, NSFileProviderErrorNotAuthenticated, kNotAuthenticated,
     "nobody is logged in", kLogIn},
    {NSFileProviderErrorDomain, NSFileProviderErrorFilenameCollision, kCollision,
     "an item of this name is there already", "choose another name"},
    {NSFileProviderErrorDomain, NSFileProviderErrorSyncAnchorExpired, kFailure,
     "the token is too old, its changes are no longer kept",
     "start again with: skein changes --since initial"},
    {NSFileProviderErrorDomain, NSFileProviderErrorInsufficientQuota, kQuota,
     "there is no room left in the account", kMoreRoom},
    {NSFileProviderErrorDomain, NSFileProviderErrorServerUnreachable, kUnreachable,
     "the server cannot be reached", "try again later"},
    {NSFileProviderErrorDomain, NSFileProviderErrorNoSuchItem, kNoSuchItem, "there is no such item",
     "see what is there with: skein ls /"},
    {NSCocoaErrorDomain, NSFileNoSuchFileError, kNoSuchItem, "there is no such item",
     "see what is there with: skein ls /"},
    {NSCocoaErrorDomain, NSFileWriteFileExistsError, kCollision,
     "an item of this name is there already", "choose another name"},
    // The number that the sharing service refuses a folder's share with.
    {NSPOSIXErrorDomain, 45, kFailure, "a folder's share cannot be changed through this item",
     "share a document in it, or remove the share from the folder itself"},
    {NSCocoaErrorDomain, NSUserCancelledError, kInterrupted, "it was cancelled", "try again"},
    {NSCocoaErrorDomain, NSXPCConnectionInvalid, kUnreachable,
     "the connection to the item's service has ended", kTryAgain},
    {CKErrorDomain, CKErrorServerRecordChanged, kCollision, "the share was changed meanwhile",
     "see it with: skein share show ITEM"},
    {CKErrorDomain, CKErrorUnknownItem, kFailure, "the share is no longer there",
     "see it with: skein share show ITEM"},
    {CKErrorDomain, CKErrorPermissionFailure, kFailure, "this may not be shared",
     "see what is known with: skein share info ITEM"},
    {CKErrorDomain, CKErrorPartialFailure, kFailure, "it was not done for everybody",
     "see the share with: skein share show ITEM"},
    {VLVellumErrorDomain, VLVellumErrorUnknownShare, kFailure, "this is not shared",
     "share it with: skein share create ITEM"},
    {NSCocoaErrorDomain, 257, kRefused, "it may not be read", kPermissions},
    {NSCocoaErrorDomain, 513, kRefused, "it may not be changed", kPermissions},
    {NSCocoaErrorDomain, 514, kUsage, "a file cannot have that name", "choose another name"},
    {NSCocoaErrorDomain, 640, kQuota, "the disk is full", "free some space and try again"},
    {NSCocoaErrorDomain, 642, kRefused, "the volume is read-only", "choose another folder"},
    {NSCocoaErrorDomain, NSFeatureUnsupportedError, kFailure, "this is not supported",
     "see what is with: skein --help"},
    {NSCocoaErrorDomain, NSUbiquitousFileNotUploadedDueToQuotaError, kQuota,
     "there is no room left in the account", kMoreRoom},
    {NSCocoaErrorDomain, NSUbiquitousFileUbiquityServerNotAvailable, kUnreachable,
     "the server cannot be reached", "try again later"},
    {VLVellumErrorDomain, VLVellumErrorNotAuthenticated, kNotAuthenticated, "nobody is logged in",
     kLogIn},
    {VLVellumErrorDomain, VLVellumErrorInvalidParameter, kUsage, "an argument is not valid",
     "paths begin at the drive's root, such as /Documents, and have no \".\" or \"..\""},
    {VLVellumErrorDomain, VLVellumErrorNotEntitled, kRefused,
     "the app keeps no documents in the drive",
     "its desktop entry would name a container: X-Skein-Containers="},
    {VLVellumErrorDomain, VLVellumErrorDaemonUnreachable, kUnreachable,
     "the drive's processes cannot be reached", kTryAgain},
    {NSPOSIXErrorDomain, ENOSPC, kQuota, "the disk is full", "free some space and try again"},
    {NSPOSIXErrorDomain, EDQUOT, kQuota, "the disk quota is used up",
     "free some space and try again"},
    {NSPOSIXErrorDomain, EACCES, kRefused, "permission denied", kPermissions},
    {NSPOSIXErrorDomain, EBUSY, kRefused, "it is in use just now", "try again when that is over"},
    {NSPOSIXErrorDomain, ETXTBSY, kRefused, "another program has it open for writing",
     "try again when that is over"},
    {"SkeinEvictionErrorDomain", kAnyCode, kRefused, "it was not evicted",
     "see its state with: skein stat"},
};

const Meaning* meaningOf(const NSErrorPtr& error) {
  for (const Meaning& meaning : kMeanings) {
    if (error->domain() != meaning.domain) continue;
    if (meaning.code == error->code() || meaning.code == kAnyCode) return &meaning;
  }
  return nullptr;
}

const Meaning* firstMeaningOf(const NSErrorPtr& error) {
  for (NSErrorPtr at = error; at; at = at->underlyingError()) {
    if (const Meaning* meaning = meaningOf(at)) return meaning;
  }
  return nullptr;
}

std::string describedBy(const NSErrorPtr& error) {
  for (NSErrorPtr at = error; at; at = at->underlyingError()) {
    if (std::string text = at->localizedDescription(); !text.empty()) return text;
  }
  return {};
}

}  // namespace

ExitCode exitCodeFor(const NSErrorPtr& error) {
  if (!error) return kSuccess;
  const Meaning* meaning = firstMeaningOf(error);
  return meaning != nullptr ? meaning->exitCode : kFailure;
}

std::string textFor(const NSErrorPtr& error) {
  const Meaning* meaning = firstMeaningOf(error);
  const ExitCode code = meaning != nullptr ? meaning->exitCode : kFailure;
  std::string cause = describedBy(error);
  while (!cause.empty() && (cause.back() == '.' || cause.back() == ' ')) cause.pop_back();
  // A refusal's own words are enough; others mostly name the next step themselves.
  const bool isComplete =
      !cause.empty() &&
      (code == kRefused || (code != kUnreachable && cause.find("; ") != std::string::npos));
  if (isComplete) return cause;
  if (cause.empty() && meaning != nullptr) cause = meaning->cause;
  if (cause.empty()) cause = error->domain() + " " + std::to_string(error->code());
  return cause + "; " +
         std::string(meaning != nullptr ? meaning->nextStep
                                        : "the log may say more: skein log -n 20");
}

}  // namespace skein::cli
