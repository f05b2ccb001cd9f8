#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "base/Mutex.h"

namespace skein {

// Delivers notifications by name within the process.
//
// Posting is synchronous, on the poster's thread, without the center's lock, and in
// the order of registration. Observers are held weakly; one that is being called is
// kept alive until its call returns. An observer removed during a delivery may still
// get that one notification, never a later one. Any thread.
//
// A handler may wait for its observer's queue, so nothing may post from work that
// runs on such a queue, nor from a connection's reader thread.
class NSNotificationCenter {
 public:
  // Calls `selector` of `observer` for every notification named `name`.
  template <class T>
  void addObserver(const std::shared_ptr<T>& observer, void (T::*selector)(), std::string name) {
    add(
        observer, [selector](void* object) { (static_cast<T*>(object)->*selector)(); },
        std::move(name), static_cast<void*>(observer.get()));
  }

  // Removes the registrations of `observer` for `name`, or all without a name. The
  // pointer is only compared, so a destructor may pass `this`.
  void removeObserver(const void* observer, std::optional<std::string> name = std::nullopt)
      SKEIN_EXCLUDES(_mutex);

  void postNotificationName(const std::string& name) SKEIN_EXCLUDES(_mutex);

  // How many registrations there are for `name`.
  std::size_t observerCount(const std::string& name) const SKEIN_EXCLUDES(_mutex);

 private:
  struct Registration {
    std::weak_ptr<void> owner;
    void* object;
    std::string name;
    std::function<void(void*)> call;
  };

  void add(std::weak_ptr<void> owner, std::function<void(void*)> call, std::string name,
           void* object) SKEIN_EXCLUDES(_mutex);

  mutable Mutex _mutex;
  std::vector<Registration> _registrations SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein
