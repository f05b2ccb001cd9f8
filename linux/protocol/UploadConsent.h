#pragma once

#include <cstdint>
#include <string>

#include "platform/foundation/NSError.h"

namespace skein {

// Whether somebody agreed that this drive's documents are copied into its cloud. It is kept
// in the drive's state folder; a drive that was there before anybody was asked has agreed.
// A setting of SKEIN_UPLOADS is an agreement, too, or a refusal ("off").
enum class UploadConsent : std::uint8_t { Given, Unasked, Refused };

// Any process and thread; one question to the disk.
UploadConsent uploadConsentOf(const std::string& stateDirectory);

// An error that names the file.
NSErrorPtr setUploadConsent(const std::string& stateDirectory, UploadConsent consent);

}  // namespace skein
