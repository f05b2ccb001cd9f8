#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "base/Mutex.h"
#include "base/SerialQueue.h"
#include "linux/host/Listing.h"
#include "linux/protocol/HostThumbnails.h"
#include "platform/fileprovider/NSFileProviderItem.h"
#include "platform/foundation/NSProgress.h"

namespace skein {

// One batch, between the extension, which hands thumbnails over as they come, and whoever
// takes them out step by step. Each target is told of once, whatever the extension calls: what
// it leaves out is told of at the end, as missing or with the batch's error.
//
// Pictures that nobody takes fill up to 16 MiB; then the threads that bring more wait. It has
// no deadline: a cloud takes the time it takes. Any thread.
class ThumbnailStream final : public std::enable_shared_from_this<ThumbnailStream> {
 public:
  ThumbnailStream(const HostTools& tools, std::size_t targets);

  // Once, when the process starts: the memory that a batch's pictures were in stays for those
  // that follow. Given back to the system picture by picture, it costs more than reading them.
  static void keepMemoryForPictures();

  // Target `index` is the item `identifier`: before its thumbnail comes.
  void expect(std::uint32_t index, const NSFileProviderItemIdentifier& identifier);
  void fail(std::uint32_t index, NSErrorPtr error);
  // The extension's handlers. May block.
  void thumbnailDidCome(const NSFileProviderItemIdentifier& identifier, std::optional<NSData> data,
                        std::optional<std::string> type, NSErrorPtr error) SKEIN_EXCLUDES(_mutex);
  void batchDidEnd(NSErrorPtr error);

  // Cancelled when nobody wants the batch any more, also when that was before.
  void setProgress(std::shared_ptr<NSProgress> progress) SKEIN_EXCLUDES(_mutex);

  void next(Reply<HostThumbnailStep, NSErrorPtr> reply);
  void letGo() SKEIN_EXCLUDES(_mutex);

 private:
  void tell(HostThumbnail thumbnail) SKEIN_REQUIRES(_queue);
  void handOut() SKEIN_REQUIRES(_queue) SKEIN_EXCLUDES(_mutex);
  void waitForRoom(std::size_t bytes) SKEIN_EXCLUDES(_mutex);

  const std::shared_ptr<Executor> _executor;
  const std::size_t _targets;

  SerialQueue _queue;
  // The targets that were not told of yet, by their item.
  std::multimap<NSFileProviderItemIdentifier, std::uint32_t> _expected SKEIN_GUARDED_BY(_queue);
  std::deque<HostThumbnail> _ready SKEIN_GUARDED_BY(_queue);
  std::deque<Reply<HostThumbnailStep, NSErrorPtr>> _waiting SKEIN_GUARDED_BY(_queue);
  std::uint64_t _done SKEIN_GUARDED_BY(_queue) = 0;  // handed out
  bool _hasEnded SKEIN_GUARDED_BY(_queue) = false;
  NSErrorPtr _error SKEIN_GUARDED_BY(_queue);

  Mutex _mutex;
  CondVar _roomCame;
  std::size_t _bytes SKEIN_GUARDED_BY(_mutex) = 0;  // of pictures that were not taken
  bool _isWanted SKEIN_GUARDED_BY(_mutex) = true;
  std::shared_ptr<NSProgress> _progress SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein
