#include "support/NSError+VLFPAdditions.h"

#include "platform/fileprovider/NSFileProviderError.h"
#include "vellum/VLErrors.h"

namespace skein {
namespace {

struct Mapping {
  std::int64_t source;
  std::int64_t result;
};

// Tried in this order.
constexpr Mapping kCocoaMappings[] = {
    {NSUbiquitousFileUbiquityServerNotAvailable, NSFileProviderErrorServerUnreachable},
    {NSUbiquitousFileNotUploadedDueToQuotaError, NSFileProviderErrorInsufficientQuota},
    // 14 as it stands. NSFileNoSuchFileError (4) has no counterpart: the host gets it as it is.
    {14, NSFileProviderErrorNoSuchItem},
};

}  // namespace

bool _vl_getFileProviderDomainErrorCode(const NSErrorPtr& error, std::int64_t* code) {
  if (!error) return false;
  if (error->domain() == NSCocoaErrorDomain) {
    for (const Mapping& mapping : kCocoaMappings) {
      if (error->code() != mapping.source) continue;
      if (code != nullptr) *code = mapping.result;
      return true;
    }
    return false;
  }
  if (error->domain() == VLVellumErrorDomain && error->code() == VLVellumErrorNotAuthenticated) {
    if (code != nullptr) *code = NSFileProviderErrorNotAuthenticated;
    return true;
  }
  return false;
}

NSErrorPtr vl_fileProviderError(const NSErrorPtr& error) {
  std::int64_t code = 0;
  if (!_vl_getFileProviderDomainErrorCode(error, &code)) return error;
  return NSError::errorWithDomain(NSFileProviderErrorDomain, code, {{NSUnderlyingErrorKey, error}});
}

}  // namespace skein
