#include "vellum/VLErrors.h"

#include "platform/cloudkit/CKError.h"

namespace skein {
namespace {

NSErrorPtr vellumError(std::int64_t code, std::string text) {
  return NSError::errorWithDomain(VLVellumErrorDomain, code,
                                  {{NSLocalizedDescriptionKey, std::move(text)}});
}

}  // namespace

NSErrorPtr vlc_errorLoggedOut() {
  return vellumError(VLVellumErrorNotAuthenticated, "No account is logged in.");
}

NSErrorPtr vlc_errorInvalidParameter(const std::string& name, const std::string& value) {
  return vellumError(VLVellumErrorInvalidParameter,
                     "The parameter \"" + name + "\" has the invalid value \"" + value + "\".");
}

NSErrorPtr vl_errorWithPOSIXCode(int code, const std::string& description) {
  return NSError::errorWithDomain(NSPOSIXErrorDomain, code,
                                  {{NSLocalizedDescriptionKey, description}});
}

NSErrorPtr vl_errorWithPOSIXCode(int code) {
  return NSError::errorWithDomain(NSPOSIXErrorDomain, code);
}

bool vl_isVellumErrorCode(const NSErrorPtr& error, std::int64_t code) {
  return error && error->domain() == VLVellumErrorDomain && error->code() == code;
}

bool vlc_isCloudKitUnknownItemError(const NSErrorPtr& error) {
  return error && error->domain() == CKErrorDomain && error->code() == CKErrorUnknownItem;
}

bool vlc_checkErrorsFromCloudKit(const NSErrorPtr& error,
                                 const std::function<bool(const NSErrorPtr&)>& test) {
  if (!error) return false;
  if (test(error)) return true;
  for (const auto& [key, value] : error->userInfo()) {
    const auto* inner = std::get_if<NSErrorPtr>(&value);
    if (inner == nullptr) continue;
    const bool isCloudKits =
        key == NSUnderlyingErrorKey || key.starts_with(CKPartialErrorsByItemIDKeyPrefix);
    if (isCloudKits && vlc_checkErrorsFromCloudKit(*inner, test)) return true;
  }
  return false;
}

NSErrorPtr vl_errorDaemonUnreachable(const std::string& reason) {
  return vellumError(VLVellumErrorDaemonUnreachable, reason);
}

}  // namespace skein
