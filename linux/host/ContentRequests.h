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

// Who wants which file's contents. The extension hears of a file once, however many want it.
// When nobody does any more, the transfer that was begun for them is cancelled by its own
// progress. The extension is told to stop only to give a file up: it would find the transfer by
// the file's path, and in a transfer's last instant find none and evict the file, or find that
// of somebody who came since. Any thread.
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

  // Has the extension give the file up; returns when it has, with null, or why it has not: not
  // while somebody wants it. Who comes meanwhile is served when this is over. Waits for vald.
  NSErrorPtr evict(const NSURLPtr& url) SKEIN_EXCLUDES(_mutex);

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
    // It is being cancelled, or is an eviction.
    bool takesNobody = false;
    Round next;  // wants that came too late for the running one
  };

  void start(const std::string& path, const NSURLPtr& url, const Round& round)
      SKEIN_EXCLUDES(_mutex);
  void didProvide(const std::string& path, const NSErrorPtr& error) SKEIN_EXCLUDES(_mutex);
  // The next round takes the place of the one that has ended: answers the URL to start it
  // with. Null, and the path is forgotten, when nobody waits for one.
  NSURLPtr beginNext(std::map<std::string, Entry>::iterator at, Round& toStart)
      SKEIN_REQUIRES(_mutex);
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
