#include "linux/host/ThumbnailStream.h"

#include <malloc.h>

#include <algorithm>
#include <utility>

#include "vellum/VLFileObjectID.h"

namespace skein {
namespace {

constexpr std::size_t kMostBytes = 16 << 20;
// What crosses the socket at once, but for a single picture that is larger.
constexpr std::size_t kStepBytes = 1 << 20;
constexpr std::size_t kStepThumbnails = 200;

std::size_t bytesOf(const HostThumbnail& thumbnail) {
  return thumbnail.data ? thumbnail.data->length() : 0;
}

HostThumbnail::Kind kindOf(const NSFileProviderItemIdentifier& identifier, bool hasData,
                           bool hasError) {
  if (hasError) return HostThumbnail::Kind::Error;
  if (!hasData) return HostThumbnail::Kind::None;
  // Of the folders, containers alone have a picture: their app's.
  const auto id = VLFileObjectID::fileObjectIDWithString(identifier);
  return id && !id->isFolderOrAliasID() ? HostThumbnail::Kind::Thumbnail
                                        : HostThumbnail::Kind::Icon;
}

}  // namespace

ThumbnailStream::ThumbnailStream(const HostTools& tools, std::size_t targets)
    : _executor(tools.executor), _targets(targets), _queue("thumbnails", tools.executor) {}

void ThumbnailStream::keepMemoryForPictures() { mallopt(M_TRIM_THRESHOLD, kMostBytes); }

void ThumbnailStream::expect(std::uint32_t index, const NSFileProviderItemIdentifier& identifier) {
  _queue.async([self = shared_from_this(), index, identifier] {
    self->_queue.assumeCurrent();
    self->_expected.emplace(identifier, index);
  });
}

void ThumbnailStream::fail(std::uint32_t index, NSErrorPtr error) {
  _queue.async([self = shared_from_this(), index, error = std::move(error)]() mutable {
    self->_queue.assumeCurrent();
    self->tell({index, HostThumbnail::Kind::Error, std::nullopt, std::nullopt, std::move(error)});
  });
}

void ThumbnailStream::thumbnailDidCome(const NSFileProviderItemIdentifier& identifier,
                                       std::optional<NSData> data, std::optional<std::string> type,
                                       NSErrorPtr error) {
  if (data) waitForRoom(data->length());
  HostThumbnail thumbnail{0, kindOf(identifier, data.has_value(), error != nullptr),
                          std::move(data), std::move(type), std::move(error)};
  _queue.async([self = shared_from_this(), identifier, thumbnail = std::move(thumbnail)]() mutable {
    self->_queue.assumeCurrent();
    // An item that was named twice is told of twice, of one picture.
    const auto [first, last] = self->_expected.equal_range(identifier);
    for (auto one = first; one != last; ++one) {
      thumbnail.index = one->second;
      self->tell(thumbnail);
    }
    self->_expected.erase(first, last);
  });
}

void ThumbnailStream::batchDidEnd(NSErrorPtr error) {
  _queue.async([self = shared_from_this(), error = std::move(error)]() mutable {
    self->_queue.assumeCurrent();
    const auto kind = error ? HostThumbnail::Kind::Error : HostThumbnail::Kind::Missing;
    self->_hasEnded = true;
    self->_error = std::move(error);
    for (const auto& [identifier, index] : std::exchange(self->_expected, {})) {
      self->_ready.push_back({index, kind, std::nullopt, std::nullopt, self->_error});
    }
    self->handOut();
  });
}

void ThumbnailStream::setProgress(std::shared_ptr<NSProgress> progress) {
  {
    MutexLock lock(_mutex);
    _progress = progress;
    if (_isWanted) return;
  }
  progress->cancel();
}

void ThumbnailStream::next(Reply<HostThumbnailStep, NSErrorPtr> reply) {
  _queue.async([self = shared_from_this(), reply = std::move(reply)]() mutable {
    self->_queue.assumeCurrent();
    self->_waiting.push_back(std::move(reply));
    self->handOut();
  });
}

void ThumbnailStream::letGo() {
  std::shared_ptr<NSProgress> progress;
  {
    MutexLock lock(_mutex);
    _isWanted = false;
    progress = _progress;
    _roomCame.notifyAll();
  }
  if (progress) progress->cancel();
}

void ThumbnailStream::tell(HostThumbnail thumbnail) {
  _ready.push_back(std::move(thumbnail));
  handOut();
}

void ThumbnailStream::handOut() {
  while (!_waiting.empty() && (!_ready.empty() || _hasEnded)) {
    HostThumbnailStep step;
    std::size_t bytes = 0;
    while (!_ready.empty() && step.thumbnails.size() < kStepThumbnails &&
           (step.thumbnails.empty() || bytes + bytesOf(_ready.front()) <= kStepBytes)) {
      bytes += bytesOf(_ready.front());
      step.thumbnails.push_back(std::move(_ready.front()));
      _ready.pop_front();
    }
    _done += step.thumbnails.size();
    step.done = _done;
    step.total = _targets;
    step.finished = _hasEnded && _ready.empty();
    NSErrorPtr error = step.finished ? _error : nullptr;
    auto reply = std::move(_waiting.front());
    _waiting.pop_front();
    {
      MutexLock lock(_mutex);
      _bytes -= std::min(bytes, _bytes);
      _roomCame.notifyAll();
    }
    reply(std::move(step), std::move(error));
  }
}

void ThumbnailStream::waitForRoom(std::size_t bytes) {
  {
    MutexLock lock(_mutex);
    if (!_isWanted || _bytes == 0 || _bytes + bytes <= kMostBytes) {
      _bytes += bytes;
      return;
    }
  }
  ScopedWait wait(*_executor);
  MutexLock lock(_mutex);
  while (_isWanted && _bytes > 0 && _bytes + bytes > kMostBytes) _roomCame.wait(_mutex);
  _bytes += bytes;
}

}  // namespace skein
