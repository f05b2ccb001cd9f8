#include "linux/host/ThumbnailStream.h"

#include <malloc.h>

#include <utility>

#include "vellum/VLFileObjectID.h"

namespace skein {
namespace {

constexpr std::size_t kMostBytes = 8 << 20;
// What crosses the socket at once, but for a single picture that is larger.
constexpr std::size_t kStepBytes = 4 << 20;
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

void ThumbnailStream::expect(Targets targets) {
  MutexLock lock(_mutex);
  _expected = std::move(targets);
}

void ThumbnailStream::fail(std::uint32_t index, NSErrorPtr error) {
  {
    MutexLock lock(_mutex);
    _ready.push_back(
        {index, HostThumbnail::Kind::Error, std::nullopt, std::nullopt, std::move(error)});
  }
  handOutSoon();
}

void ThumbnailStream::thumbnailDidCome(const NSFileProviderItemIdentifier& identifier,
                                       std::optional<NSData> data, std::optional<std::string> type,
                                       NSErrorPtr error) {
  const std::size_t reserved = data ? data->length() : 0;
  if (!waitForRoom(identifier, reserved)) return;
  HostThumbnail thumbnail{0, kindOf(identifier, data.has_value(), error != nullptr),
                          std::move(data), std::move(type), std::move(error)};
  {
    MutexLock lock(_mutex);
    // An item that was named twice is told of twice, of one picture. Only what will be taken
    // counts: another thread may have told of the item meanwhile.
    _bytes -= reserved;
    const auto [first, last] = _expected.equal_range(identifier);
    for (auto one = first; one != last; ++one) {
      thumbnail.index = one->second;
      _ready.push_back(thumbnail);
      _bytes += reserved;
    }
    _expected.erase(first, last);
    tellOfRoom();
  }
  handOutSoon();
}

void ThumbnailStream::batchDidEnd(NSErrorPtr error) {
  {
    MutexLock lock(_mutex);
    const auto kind = error ? HostThumbnail::Kind::Error : HostThumbnail::Kind::Missing;
    _hasEnded = true;
    _error = std::move(error);
    for (const auto& [identifier, index] : std::exchange(_expected, {})) {
      _ready.push_back({index, kind, std::nullopt, std::nullopt, _error});
    }
  }
  handOutSoon();
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
  {
    MutexLock lock(_mutex);
    _waiting.push_back(std::move(reply));
  }
  handOutSoon();
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

void ThumbnailStream::handOutSoon() {
  {
    MutexLock lock(_mutex);
    const bool isThereSomething = !_ready.empty() || _hasEnded;
    if (_waiting.empty() || !isThereSomething || std::exchange(_willHandOut, true)) return;
  }
  _queue.async([self = shared_from_this()] { self->handOut(); });
}

void ThumbnailStream::handOut() {
  for (;;) {
    HostThumbnailStep step;
    NSErrorPtr error;
    Reply<HostThumbnailStep, NSErrorPtr> reply;
    {
      MutexLock lock(_mutex);
      _willHandOut = false;
      if (_waiting.empty() || (_ready.empty() && !_hasEnded)) return;
      takeStep(step);
      if (step.finished) error = _error;
      reply = std::move(_waiting.front());
      _waiting.pop_front();
    }
    reply(std::move(step), std::move(error));
  }
}

void ThumbnailStream::takeStep(HostThumbnailStep& step) {
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
  _bytes -= bytes;
  tellOfRoom();
}

void ThumbnailStream::tellOfRoom() {
  if (_bytes <= kMostBytes / 2) _roomCame.notifyAll();
}

bool ThumbnailStream::waitForRoom(const NSFileProviderItemIdentifier& identifier,
                                  std::size_t bytes) {
  {
    MutexLock lock(_mutex);
    if (!_expected.contains(identifier)) return false;
    if (!_isWanted || _bytes == 0 || _bytes + bytes <= kMostBytes) {
      _bytes += bytes;
      return true;
    }
  }
  // Until there is room for many, or every picture that is taken would wake one that comes.
  ScopedWait wait(*_executor);
  MutexLock lock(_mutex);
  while (_isWanted && _bytes > kMostBytes / 2) _roomCame.wait(_mutex);
  _bytes += bytes;
  return true;
}

}  // namespace skein
