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
// Pictures that nobody takes fill up to 8 MiB; then the threads that bring more wait. It has
// no deadline: a cloud takes the time it takes. Any thread.
class ThumbnailStream final : public std::enable_shared_from_this<ThumbnailStream> {
 public:
  ThumbnailStream(const HostTools& tools, std::size_t targets);

  // Once, when the process starts: the memory that a batch's pictures were in stays for those
  // that follow. Given back to the system picture by picture, it costs more than reading them.
  static void keepMemoryForPictures();

  // The targets by their items: before the first thumbnail comes.
  using Targets = std::multimap<NSFileProviderItemIdentifier, std::uint32_t>;
  void expect(Targets targets) SKEIN_EXCLUDES(_mutex);
  void fail(std::uint32_t index, NSErrorPtr error) SKEIN_EXCLUDES(_mutex);
  // The extension's handlers. May block.
  void thumbnailDidCome(const NSFileProviderItemIdentifier& identifier, std::optional<NSData> data,
                        std::optional<std::string> type, NSErrorPtr error) SKEIN_EXCLUDES(_mutex);
  void batchDidEnd(NSErrorPtr error) SKEIN_EXCLUDES(_mutex);

  // Cancelled when nobody wants the batch any more, also when that was before.
  void setProgress(std::shared_ptr<NSProgress> progress) SKEIN_EXCLUDES(_mutex);

  void next(Reply<HostThumbnailStep, NSErrorPtr> reply) SKEIN_EXCLUDES(_mutex);
  void letGo() SKEIN_EXCLUDES(_mutex);

 private:
  // Has a step handed out when somebody waits for one.
  void handOutSoon() SKEIN_EXCLUDES(_mutex);
  // On the queue: steps go out in their order, and under no lock.
  void handOut() SKEIN_EXCLUDES(_mutex);
  void takeStep(HostThumbnailStep& step) SKEIN_REQUIRES(_mutex);
  // False when the item was told of. Otherwise it has reserved room for `bytes`.
  bool waitForRoom(const NSFileProviderItemIdentifier& identifier, std::size_t bytes)
      SKEIN_EXCLUDES(_mutex);
  void tellOfRoom() SKEIN_REQUIRES(_mutex);

  const std::shared_ptr<Executor> _executor;
  const std::size_t _targets;
  SerialQueue _queue;

  Mutex _mutex;
  CondVar _roomCame;
  // The targets that were not told of yet, by their item.
  Targets _expected SKEIN_GUARDED_BY(_mutex);
  std::deque<HostThumbnail> _ready SKEIN_GUARDED_BY(_mutex);
  std::size_t _bytes SKEIN_GUARDED_BY(_mutex) = 0;  // of pictures not taken, and reserved
  std::deque<Reply<HostThumbnailStep, NSErrorPtr>> _waiting SKEIN_GUARDED_BY(_mutex);
  bool _willHandOut SKEIN_GUARDED_BY(_mutex) = false;
  std::uint64_t _done SKEIN_GUARDED_BY(_mutex) = 0;  // handed out
  bool _hasEnded SKEIN_GUARDED_BY(_mutex) = false;
  NSErrorPtr _error SKEIN_GUARDED_BY(_mutex);
  bool _isWanted SKEIN_GUARDED_BY(_mutex) = true;
  std::shared_ptr<NSProgress> _progress SKEIN_GUARDED_BY(_mutex);
};

}  // namespace skein
