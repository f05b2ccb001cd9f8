#include "vellum/VLErrors.h"

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

NSErrorPtr vl_errorDaemonUnreachable(const std::string& reason) {
  return vellumError(VLVellumErrorDaemonUnreachable, reason);
}

}  // namespace skein
