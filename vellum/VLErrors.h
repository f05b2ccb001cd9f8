// The Vellum framework's errors.
#pragma once

#include <cstdint>
#include <string>

#include "platform/foundation/NSError.h"

namespace skein {

inline constexpr char VLVellumErrorDomain[] = "VLVellumErrorDomain";

// Codes of VLVellumErrorDomain.
inline constexpr std::int64_t VLVellumErrorNotEntitled = 1;
inline constexpr std::int64_t VLVellumErrorNotAuthenticated = 2;
inline constexpr std::int64_t VLVellumErrorInvalidParameter = 15;
inline constexpr std::int64_t VLVellumErrorUnknownShare = 20;
// The connection to vald broke, or vald does not answer.
inline constexpr std::int64_t VLVellumErrorDaemonUnreachable = 30;
// Changes were too many to be told one by one: the folder must be listed afresh.
inline constexpr std::int64_t VLVellumErrorChangesLost = 31;

// "Nobody is logged in": VLVellumErrorNotAuthenticated.
NSErrorPtr vlc_errorLoggedOut();

// vlc_errorInvalidParameter:value: VLVellumErrorInvalidParameter, both in the text.
NSErrorPtr vlc_errorInvalidParameter(const std::string& name, const std::string& value);

// vl_errorWithPOSIXCode:description: in NSPOSIXErrorDomain.
NSErrorPtr vl_errorWithPOSIXCode(int code, const std::string& description);

// vald could not be reached or its connection broke; `reason` says how.
NSErrorPtr vl_errorDaemonUnreachable(const std::string& reason);

}  // namespace skein
