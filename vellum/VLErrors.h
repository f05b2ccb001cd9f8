// The Vellum framework's errors.
#pragma once

#include <cstdint>
#include <functional>
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
// vl_errorWithPOSIXCode: without a text, as the number need not mean here what it meant
// where it was written.
NSErrorPtr vl_errorWithPOSIXCode(int code);

// vl_isVellumErrorCode: NO for null.
bool vl_isVellumErrorCode(const NSErrorPtr& error, std::int64_t code);

// vlc_isCloudKitUnknownItemError: CKErrorDomain CKErrorUnknownItem. NO for null.
bool vlc_isCloudKitUnknownItemError(const NSErrorPtr& error);

// vlc_checkErrorsFromCloudKit: whether `test` says yes to the error, to one of a partial
// failure's errors, or to an error underneath. NO for null, which is not tested.
bool vlc_checkErrorsFromCloudKit(const NSErrorPtr& error,
                                 const std::function<bool(const NSErrorPtr&)>& test);

// vald could not be reached or its connection broke; `reason` says how.
NSErrorPtr vl_errorDaemonUnreachable(const std::string& reason);

}  // namespace skein
