// Errors: immutable, shared, with identity. "The same error" means the same object.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <variant>

#include "platform/foundation/NSURL.h"

namespace skein {

class NSError;
class NSFileProviderItem;

// An error reference; null is nil: no error.
using NSErrorPtr = std::shared_ptr<const NSError>;
using NSErrorValue =
    std::variant<std::string, NSErrorPtr, NSURLPtr, std::shared_ptr<const NSFileProviderItem>>;
using NSErrorUserInfo = std::map<std::string, NSErrorValue>;

inline constexpr char NSCocoaErrorDomain[] = "NSCocoaErrorDomain";
inline constexpr char NSPOSIXErrorDomain[] = "NSPOSIXErrorDomain";

inline constexpr char NSUnderlyingErrorKey[] = "NSUnderlyingError";
inline constexpr char NSLocalizedDescriptionKey[] = "NSLocalizedDescription";
inline constexpr char NSURLErrorKey[] = "NSURL";

// Codes of NSCocoaErrorDomain.
inline constexpr std::int64_t NSFileNoSuchFileError = 4;
inline constexpr std::int64_t NSFileWriteUnknownError = 512;
inline constexpr std::int64_t NSFileWriteFileExistsError = 516;
inline constexpr std::int64_t NSUserCancelledError = 3072;
inline constexpr std::int64_t NSFeatureUnsupportedError = 3328;
inline constexpr std::int64_t NSXPCConnectionInterrupted = 4097;
inline constexpr std::int64_t NSXPCConnectionInvalid = 4099;
inline constexpr std::int64_t NSUbiquitousFileNotUploadedDueToQuotaError = 4354;
inline constexpr std::int64_t NSUbiquitousFileUbiquityServerNotAvailable = 4355;

class NSError {
 public:
  NSError(std::string domain, std::int64_t code, NSErrorUserInfo userInfo)
      : _domain(std::move(domain)), _code(code), _userInfo(std::move(userInfo)) {}

  static NSErrorPtr errorWithDomain(std::string domain, std::int64_t code,
                                    NSErrorUserInfo userInfo = {}) {
    return std::make_shared<const NSError>(std::move(domain), code, std::move(userInfo));
  }

  const std::string& domain() const { return _domain; }
  std::int64_t code() const { return _code; }
  const NSErrorUserInfo& userInfo() const { return _userInfo; }

  // The NSLocalizedDescriptionKey entry; empty when there is none.
  std::string localizedDescription() const;
  // The NSUnderlyingErrorKey entry; null when there is none.
  NSErrorPtr underlyingError() const;

 private:
  const std::string _domain;
  const std::int64_t _code;
  const NSErrorUserInfo _userInfo;
};

// An optional error out-argument: knows whether the caller passed a slot, since the
// log says so. Holds a pointer to the caller's slot, so it must not outlive the call.
class NSErrorOut {
 public:
  NSErrorOut(std::nullptr_t = nullptr) {}
  NSErrorOut(NSErrorPtr* slot) : _slot(slot) {}

  bool passed() const { return _slot != nullptr; }
  // Writes only when the caller passed a slot.
  void store(NSErrorPtr error) const {
    if (_slot != nullptr) *_slot = std::move(error);
  }
  // What the slot holds; null without a slot.
  NSErrorPtr stored() const { return _slot != nullptr ? *_slot : nullptr; }

 private:
  NSErrorPtr* _slot = nullptr;
};

}  // namespace skein
