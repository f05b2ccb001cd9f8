#pragma once

#include <deque>
#include <map>
#include <optional>
#include <string>
#include <string_view>

#include "base/Mutex.h"
#include "linux/protocol/CallFaults.h"

namespace skein::vald {

// The faults that were asked for and have not come yet. Any thread.
class FaultInjector final : public CallFaults {
 public:
  // `allowed`: whether vald was started with SKEIN_ALLOW_FAULTS=1.
  explicit FaultInjector(bool allowed) : _allowed(allowed) {}

  // Plans a fault behind those of the same method. An error when faults are not allowed,
  // no such method can have this one, or the numbers are out of bounds.
  NSErrorPtr plan(FaultInjection fault) SKEIN_EXCLUDES(_mutex);

  std::optional<FaultInjection> take(std::string_view method) override SKEIN_EXCLUDES(_mutex);

 private:
  const bool _allowed;
  Mutex _mutex;
  std::map<std::string, std::deque<FaultInjection>, std::less<>> _planned SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein::vald
