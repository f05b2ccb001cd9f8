// What "%@" prints of a value. A type of another room adds an overload beside itself.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/fileprovider/NSFileProviderItem.h"
#include "platform/foundation/NSData.h"
#include "platform/foundation/NSDate.h"
#include "platform/foundation/NSError.h"
#include "platform/foundation/NSURL.h"

namespace skein {

inline std::string description(std::string_view text) { return std::string(text); }
inline std::string description(const std::string& text) { return text; }
inline std::string description(const char* text) { return text != nullptr ? text : "(null)"; }
std::string description(const NSURL& url);
std::string description(const NSData& data);
// In whole seconds, UTC: "2026-11-24 21:40:00 +0000".
std::string description(NSDate date);
// A number that is an object, as a favourite rank is.
std::string description(std::int64_t number);
std::string description(const NSError& error);
std::string description(const NSFileProviderItem& item);

template <class T>
std::string description(const std::optional<T>& value);
template <class T>
std::string description(const std::shared_ptr<T>& value);
template <class T>
std::string description(const std::vector<T>& values);

template <class T>
std::string description(const std::optional<T>& value) {
  return value ? description(*value) : "(null)";
}

template <class T>
std::string description(const std::shared_ptr<T>& value) {
  return value ? description(*value) : "(null)";
}

template <class T>
std::string description(const std::vector<T>& values) {
  std::string text = "(";
  for (const T& value : values) {
    if (text.size() > 1) text += ", ";
    text += description(value);
  }
  return text + ")";
}

}  // namespace skein
