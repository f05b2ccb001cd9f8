#include "linux/vald/cloud/CloudErrors.h"

namespace skein::vald {
namespace {

NSErrorPtr cocoaError(std::int64_t code, std::string text) {
  return NSError::errorWithDomain(NSCocoaErrorDomain, code,
                                  {{NSLocalizedDescriptionKey, std::move(text)}});
}

}  // namespace

NSErrorPtr cancelledError() {
  return cocoaError(NSUserCancelledError, "The operation was cancelled.");
}

NSErrorPtr offlineError() {
  return cocoaError(NSUbiquitousFileUbiquityServerNotAvailable,
                    "The cloud cannot be reached. Try again when it is online.");
}

NSErrorPtr quotaError(std::uint64_t needed, std::uint64_t left) {
  return cocoaError(NSUbiquitousFileNotUploadedDueToQuotaError,
                    "The cloud is full: " + std::to_string(needed) + " bytes are needed and " +
                        std::to_string(left) + " are left. Remove documents or raise the quota.");
}

NSErrorPtr corruptError(const std::string& what) {
  return cocoaError(NSFileReadCorruptFileError,
                    what +
                        " came from the cloud with other contents than were uploaded. Nothing "
                        "was changed; try again.");
}

bool isOffline(const NSErrorPtr& error) {
  return error != nullptr && error->domain() == NSCocoaErrorDomain &&
         error->code() == NSUbiquitousFileUbiquityServerNotAvailable;
}

}  // namespace skein::vald
