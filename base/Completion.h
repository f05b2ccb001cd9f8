// "Called exactly once" as a type.
#pragma once

#include <cstddef>
#include <memory>
#include <type_traits>
#include <utility>

#include "base/Fault.h"
#include "base/UniqueFunction.h"

namespace skein {

// A move-only completion handler. Calling it twice, or destroying it uncalled, is a
// fault. An empty one (nullptr) may be called and does nothing, as a message to nil
// would. Not synchronised: it belongs to whoever holds it; where two handlers may
// each have to call it, they share one through share().
template <class... Args>
class Completion {
 public:
  Completion() = default;
  Completion(std::nullptr_t) {}

  template <class F>
  requires(!std::is_same_v<std::remove_cvref_t<F>, Completion> &&
           std::is_invocable_v<std::decay_t<F>&, Args...>) Completion(F&& handler)
      : _handler(std::forward<F>(handler)), _armed(true) {}

  Completion(Completion&& other) noexcept
      : _handler(std::move(other._handler)),
        _armed(std::exchange(other._armed, false)),
        _called(std::exchange(other._called, false)) {}
  Completion& operator=(Completion&& other) noexcept {
    if (this != &other) {
      checkCalled();
      _handler = std::move(other._handler);
      _armed = std::exchange(other._armed, false);
      _called = std::exchange(other._called, false);
    }
    return *this;
  }
  ~Completion() { checkCalled(); }

  void operator()(Args... args) {
    if (_called) {
      reportFault("a completion was called twice");
      return;
    }
    if (!_armed) return;
    _armed = false;
    _called = true;
    auto handler = std::move(_handler);
    handler(std::forward<Args>(args)...);
  }

  // Whether there is a handler that has yet to be called.
  explicit operator bool() const { return _armed; }

  // Gives the handler up unanswered, where that is what the protocol wants.
  void neverAnswered() {
    _armed = false;
    _handler = nullptr;
  }

  // For a request that ends in one of several handlers: all hold the same one.
  std::shared_ptr<Completion> share() && { return std::make_shared<Completion>(std::move(*this)); }

 private:
  void checkCalled() {
    if (_armed) reportFault("a completion was never called");
  }

  UniqueFunction<void(Args...)> _handler;
  bool _armed = false;
  bool _called = false;
};

}  // namespace skein
