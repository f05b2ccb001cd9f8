// The errors of the local cloud, in the words a person reads.
#pragma once

#include <cstdint>
#include <string>

#include "platform/foundation/NSError.h"

namespace skein::vald {

// A code of NSCocoaErrorDomain that only contents need.
inline constexpr std::int64_t NSFileReadCorruptFileError = 259;

// NSUserCancelledError.
NSErrorPtr cancelledError();
// NSUbiquitousFileUbiquityServerNotAvailable.
NSErrorPtr offlineError();
// NSUbiquitousFileNotUploadedDueToQuotaError.
NSErrorPtr quotaError(std::uint64_t needed, std::uint64_t left);
// NSFileReadCorruptFileError: `what` came back with other bytes than were uploaded.
NSErrorPtr corruptError(const std::string& what);

// Whether the cloud could not be reached, so that trying again later makes sense.
bool isOffline(const NSErrorPtr& error);

}  // namespace skein::vald
