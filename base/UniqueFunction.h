// A move-only callable, so that work and replies can own what they carry.
#pragma once

#include <cstddef>
#include <memory>
#include <type_traits>
#include <utility>

namespace skein {

template <class Signature>
class UniqueFunction;

// Like std::function, but moves. Calling an empty one is the caller's error:
// test it first, or use Completion, where empty is a no-op.
template <class R, class... Args>
class UniqueFunction<R(Args...)> {
 public:
  UniqueFunction() = default;
  UniqueFunction(std::nullptr_t) {}

  template <class F>
  requires(!std::is_same_v<std::remove_cvref_t<F>, UniqueFunction> &&
           std::is_invocable_r_v<R, std::decay_t<F>&, Args...>) UniqueFunction(F&& function)
      : _callable(std::make_unique<Model<std::decay_t<F>>>(std::forward<F>(function))) {}

  R operator()(Args... args) { return _callable->call(std::forward<Args>(args)...); }
  explicit operator bool() const { return _callable != nullptr; }

 private:
  struct Concept {
    virtual ~Concept() = default;
    virtual R call(Args... args) = 0;
  };
  template <class F>
  struct Model final : Concept {
    explicit Model(F function) : _function(std::move(function)) {}
    R call(Args... args) override { return _function(std::forward<Args>(args)...); }
    F _function;
  };

  std::unique_ptr<Concept> _callable;
};

// A unit of work.
using Task = UniqueFunction<void()>;

// What a remote call hands its result to. At most once: when the connection fails,
// the proxy's error handler runs instead and the reply is destroyed uncalled.
template <class... Args>
using Reply = UniqueFunction<void(Args...)>;

}  // namespace skein
