// Category VLFPAdditions on NSError: what the host is told of an error. Pure functions,
// any thread.
#pragma once

#include <cstdint>

#include "platform/foundation/NSError.h"

namespace skein {

// _vl_getFileProviderDomainErrorCode:
// Whether `error` has a counterpart in NSFileProviderErrorDomain, whose code then goes to
// `code` unless that is null. Without one `code` is left alone; a null error has none.
bool _vl_getFileProviderDomainErrorCode(const NSErrorPtr& error, std::int64_t* code);

// vl_fileProviderError
// The counterpart, with `error` as its only user information, underlying; without one
// `error` itself, the same object. Null for null.
NSErrorPtr vl_fileProviderError(const NSErrorPtr& error);

}  // namespace skein
