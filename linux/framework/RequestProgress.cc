#include "linux/framework/RequestProgress.h"

#include <algorithm>
#include <utility>

namespace skein {
namespace {

thread_local std::shared_ptr<RequestProgress> currentProgress;

std::uint64_t count(std::int64_t units) {
  return static_cast<std::uint64_t>(std::max<std::int64_t>(units, 0));
}

}  // namespace

void RequestProgress::follow(std::shared_ptr<NSProgress> progress) {
  bool cancelled = false;
  {
    MutexLock lock(_mutex);
    _progress = progress;
    cancelled = _cancelled;
  }
  if (cancelled && progress) progress->cancel();
}

std::shared_ptr<NSProgress> RequestProgress::followed() const {
  MutexLock lock(_mutex);
  return _progress;
}

std::uint64_t RequestProgress::completed() const {
  const auto progress = followed();
  return progress ? count(progress->completedUnitCount()) : 0;
}

std::uint64_t RequestProgress::total() const {
  const auto progress = followed();
  return progress ? count(progress->totalUnitCount()) : 0;
}

void RequestProgress::cancel() {
  std::shared_ptr<NSProgress> progress;
  {
    MutexLock lock(_mutex);
    _cancelled = true;
    progress = _progress;
  }
  if (progress) progress->cancel();
}

RequestProgressScope::RequestProgressScope(std::shared_ptr<RequestProgress> progress)
    : _previous(std::exchange(currentProgress, std::move(progress))) {}

RequestProgressScope::~RequestProgressScope() { currentProgress = std::move(_previous); }

std::shared_ptr<RequestProgress> RequestProgressScope::current() { return currentProgress; }

}  // namespace skein
