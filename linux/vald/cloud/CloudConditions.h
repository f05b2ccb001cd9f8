#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <optional>

#include "base/Mutex.h"
#include "linux/vald/cloud/Cancellation.h"
#include "linux/vald/cloud/CloudClock.h"
#include "linux/vald/cloud/ContentStream.h"
#include "platform/foundation/NSError.h"

namespace skein::vald {

// How the cloud behaves at the moment: at once and without end, unless a test or a person
// who tries it out says otherwise. Changed at run time, from any thread; a transfer that
// runs sees the change with its next piece.
class CloudConditions {
 public:
  struct Settings {
    bool offline = false;
    bool corrupt = false;                // contents arrive with other bytes
    std::optional<std::uint64_t> quota;  // bytes; nil: no end
    std::chrono::milliseconds delay{0};  // before a transfer's first byte
    std::uint64_t bytesPerSecond = 0;    // of each transfer; 0: no limit
    std::uint32_t failures = 0;          // this many transfers fail at their start,
    NSErrorPtr failure;                  // with this error; null: as when offline
  };

  Settings settings() const SKEIN_EXCLUDES(_mutex);
  // `change` runs under the lock: it only sets fields.
  void change(const std::function<void(Settings&)>& change) SKEIN_EXCLUDES(_mutex);

  // What a transfer that starts now meets, this call counting as one.
  NSErrorPtr admit() SKEIN_EXCLUDES(_mutex);

 private:
  mutable Mutex _mutex;
  Settings _settings SKEIN_GUARDED_BY(_mutex);
};

// One transfer under these conditions: waits as they say, ends when it is cancelled. One
// thread; what it is made of outlives it.
class CloudTransfer : public StreamObserver {
 public:
  enum class Direction : std::uint8_t { Up, Down };

  CloudTransfer(CloudConditions& conditions, CloudClock& clock, Cancellation& cancellation,
                Direction direction)
      : _conditions(conditions),
        _clock(clock),
        _cancellation(cancellation),
        _direction(direction) {}

  NSErrorPtr didPass(std::uint64_t bytes) override;
  void willPass(char* data, std::size_t size) override;
  std::size_t pieceSize() const override;

 private:
  NSErrorPtr begin();
  // Null, or the cancellation.
  NSErrorPtr waitFor(CloudClock::Duration delay);

  CloudConditions& _conditions;
  CloudClock& _clock;
  Cancellation& _cancellation;
  const Direction _direction;
  bool _begun = false;
  // When the next piece may pass.
  CloudClock::Duration _next{};
  std::uint64_t _passed = 0;
};

}  // namespace skein::vald
