#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>

#include "base/Mutex.h"
#include "base/UniqueFunction.h"
#include "linux/framework/RequestProgress.h"
#include "platform/fileprovider/NSFileProviderExtension.h"

namespace skein {

// Who wants which file's contents. The extension hears of a file once, however many want it,
// and is told to stop when nobody does any more: to stop a file that it is not providing
// would evict it. Any thread.
class ContentRequests final : public std::enable_shared_from_this<ContentRequests> {
 public:
  using Done = UniqueFunction<void(NSErrorPtr)>;
  // One who wants a file; letting go of it gives it up.
  class Want;

  // `extension` outlives it.
  explicit ContentRequests(NSFileProviderExtension& extension) : _extension(extension) {}

  // `done` runs once, on any thread, also inside this call; not after the want is gone.
  // `currentVersion`: the file is fetched although a copy is there.
  std::shared_ptr<Want> provide(const NSURLPtr& url, bool currentVersion, Done done)
      SKEIN_EXCLUDES(_mutex);

 private:
  // Wants that the extension serves with one call.
  struct Round {
    bool currentVersion = false;
    std::map<std::uint64_t, Done> wants;
    std::shared_ptr<RequestProgress> progress = std::make_shared<RequestProgress>();
  };
  struct Entry {
    NSURLPtr url;
    Round running;
    bool started = false;  // the extension's call has returned
    bool stopping = false;
    Round next;  // wants that came too late for the running one
  };

  void start(const std::string& path, const NSURLPtr& url, const Round& round)
      SKEIN_EXCLUDES(_mutex);
  void didProvide(const std::string& path, const NSErrorPtr& error) SKEIN_EXCLUDES(_mutex);
  void giveUp(const std::string& path, std::uint64_t number) SKEIN_EXCLUDES(_mutex);

  NSFileProviderExtension& _extension;
  Mutex _mutex;
  std::uint64_t _lastNumber SKEIN_GUARDED_BY(_mutex) = 0;
  std::map<std::string, Entry> _entries SKEIN_GUARDED_BY(_mutex);
};

class ContentRequests::Want {
 public:
  Want(std::shared_ptr<ContentRequests> requests, std::string path, std::uint64_t number,
       std::shared_ptr<RequestProgress> progress)
      : _requests(std::move(requests)),
        _path(std::move(path)),
        _number(number),
        _progress(std::move(progress)) {}
  ~Want() { _requests->giveUp(_path, _number); }
  Want(const Want&) = delete;
  Want& operator=(const Want&) = delete;

  const std::shared_ptr<RequestProgress>& progress() const { return _progress; }

 private:
  const std::shared_ptr<ContentRequests> _requests;
  const std::string _path;
  const std::uint64_t _number;
  const std::shared_ptr<RequestProgress> _progress;
};

}  // namespace skein
