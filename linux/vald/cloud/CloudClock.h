// Time as the cloud sees it: settling, delays, bandwidth, backing off.
#pragma once

#include <chrono>
#include <memory>

#include "base/UniqueFunction.h"
#include "linux/vald/cloud/Cancellation.h"
#include "platform/foundation/NSDate.h"

namespace skein::vald {

// Any thread. Programs use SystemCloudClock; tests turn one by hand.
class CloudClock {
 public:
  using Duration = std::chrono::nanoseconds;

  virtual ~CloudClock() = default;

  // Time since some moment; never goes back.
  virtual Duration now() = 0;
  // The time of day, comparable with a file's times.
  virtual NSDate date() = 0;
  // Runs `task` on the clock's thread when `delay` has passed: it must be short and must
  // not wait. Destroys it uncalled when the clock goes first.
  virtual void callAfter(Duration delay, Task task) = 0;

  // Blocks the calling thread for `delay`, or until cancelled: then false, at once.
  bool wait(Duration delay, Cancellation& cancellation);
};

// The system's clocks, and one thread for what is due.
class SystemCloudClock final : public CloudClock {
 public:
  SystemCloudClock();
  ~SystemCloudClock() override;

  Duration now() override;
  NSDate date() override;
  void callAfter(Duration delay, Task task) override;

 private:
  struct State;
  std::unique_ptr<State> _state;
};

}  // namespace skein::vald
