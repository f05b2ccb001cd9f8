#pragma once

#include <utility>
#include <variant>

#include "platform/foundation/NSError.h"

namespace skein::vald {

// A value, or the error that stands in its way: never both, never neither. An operation
// without a value answers an NSErrorPtr instead, null on success.
template <class T>
class Outcome {
 public:
  Outcome(T value) : _state(std::in_place_index<0>, std::move(value)) {}
  Outcome(NSErrorPtr error) : _state(std::in_place_index<1>, std::move(error)) {}

  explicit operator bool() const { return _state.index() == 0; }
  // Only of one that holds a value.
  T& operator*() { return *std::get_if<0>(&_state); }
  const T& operator*() const { return *std::get_if<0>(&_state); }
  T* operator->() { return std::get_if<0>(&_state); }
  const T* operator->() const { return std::get_if<0>(&_state); }
  // Null when there is a value.
  NSErrorPtr error() const {
    const auto* error = std::get_if<1>(&_state);
    return error != nullptr ? *error : nullptr;
  }

 private:
  std::variant<T, NSErrorPtr> _state;
};

}  // namespace skein::vald
