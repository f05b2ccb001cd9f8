#include "platform/foundation/NSError.h"

namespace skein {
namespace {

template <class T>
T entry(const NSErrorUserInfo& userInfo, const char* key) {
  const auto found = userInfo.find(key);
  if (found == userInfo.end()) return {};
  const T* value = std::get_if<T>(&found->second);
  return value != nullptr ? *value : T{};
}

}  // namespace

std::string NSError::localizedDescription() const {
  return entry<std::string>(_userInfo, NSLocalizedDescriptionKey);
}

NSErrorPtr NSError::underlyingError() const {
  return entry<NSErrorPtr>(_userInfo, NSUnderlyingErrorKey);
}

}  // namespace skein
