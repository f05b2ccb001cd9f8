#include "platform/foundation/NSNotificationCenter.h"

#include <algorithm>
#include <utility>

namespace skein {

void NSNotificationCenter::add(std::weak_ptr<void> owner, std::function<void(void*)> call,
                               std::string name, void* object) {
  MutexLock lock(_mutex);
  _registrations.push_back({std::move(owner), object, std::move(name), std::move(call)});
}

void NSNotificationCenter::removeObserver(const void* observer, std::optional<std::string> name) {
  MutexLock lock(_mutex);
  std::erase_if(_registrations, [&](const Registration& registration) {
    return registration.object == observer && (!name || registration.name == *name);
  });
}

void NSNotificationCenter::postNotificationName(const std::string& name) {
  std::vector<Registration> matching;
  {
    MutexLock lock(_mutex);
    std::erase_if(_registrations, [](const auto& entry) { return entry.owner.expired(); });
    std::copy_if(_registrations.begin(), _registrations.end(), std::back_inserter(matching),
                 [&](const Registration& registration) { return registration.name == name; });
  }
  for (const Registration& registration : matching) {
    if (const auto alive = registration.owner.lock()) registration.call(registration.object);
  }
}

std::size_t NSNotificationCenter::observerCount(const std::string& name) const {
  MutexLock lock(_mutex);
  return static_cast<std::size_t>(
      std::count_if(_registrations.begin(), _registrations.end(),
                    [&](const Registration& registration) { return registration.name == name; }));
}

}  // namespace skein
