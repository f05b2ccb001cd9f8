#include "linux/vald/cloud/CloudConditions.h"

#include <algorithm>

#include "linux/vald/cloud/CloudErrors.h"

namespace skein::vald {

CloudConditions::Settings CloudConditions::settings() const {
  MutexLock lock(_mutex);
  return _settings;
}

void CloudConditions::change(const std::function<void(Settings&)>& change) {
  MutexLock lock(_mutex);
  change(_settings);
}

NSErrorPtr CloudConditions::admit() {
  MutexLock lock(_mutex);
  if (_settings.offline) return offlineError();
  if (_settings.failures == 0) return nullptr;
  --_settings.failures;
  return _settings.failure != nullptr ? _settings.failure : offlineError();
}

NSErrorPtr CloudTransfer::didPass(std::uint64_t bytes) {
  if (_cancellation.isCancelled()) return cancelledError();
  if (!_begun) return begin();
  const auto settings = _conditions.settings();
  if (settings.offline) return offlineError();
  const std::uint64_t piece = bytes - _passed;
  _passed = bytes;
  const auto now = _clock.now();
  if (settings.bytesPerSecond == 0) {
    _next = now;
    return nullptr;
  }
  _next += std::chrono::duration_cast<CloudClock::Duration>(std::chrono::duration<double>(
      static_cast<double>(piece) / static_cast<double>(settings.bytesPerSecond)));
  return _next > now ? waitFor(_next - now) : nullptr;
}

NSErrorPtr CloudTransfer::begin() {
  _begun = true;
  if (NSErrorPtr error = _conditions.admit()) return error;
  if (const auto delay = _conditions.settings().delay; delay.count() > 0) {
    if (NSErrorPtr error = waitFor(delay)) return error;
  }
  _next = _clock.now();
  return nullptr;
}

NSErrorPtr CloudTransfer::waitFor(CloudClock::Duration delay) {
  return _clock.wait(delay, _cancellation) ? nullptr : cancelledError();
}

void CloudTransfer::willPass(char* data, std::size_t size) {
  if (_direction == Direction::Down && size > 0 && _conditions.settings().corrupt) {
    data[0] = static_cast<char>(~data[0]);
  }
}

std::size_t CloudTransfer::pieceSize() const {
  // A tenth of a second's worth at most, so that a change of the bandwidth is felt soon.
  const std::uint64_t limit = _conditions.settings().bytesPerSecond;
  if (limit == 0) return kLargestPiece;
  return static_cast<std::size_t>(std::clamp<std::uint64_t>(limit / 10, 1, kLargestPiece));
}

}  // namespace skein::vald
