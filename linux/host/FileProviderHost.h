#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <unordered_map>
#include <unordered_set>

#include "base/Mutex.h"
#include "linux/host/ContainerWatch.h"
#include "linux/host/Listing.h"
#include "platform/fileprovider/NSFileProviderExtension.h"
#include "platform/fileprovider/NSFileProviderManager.h"
#include "platform/log/Log.h"

namespace skein {

// Tells of changes that the extension's enumerator of the working set does not signal by
// itself. The system's own part, not the extension's.
class WorkingSetNews {
 public:
  virtual ~WorkingSetNews() = default;
  // From now on `handler` runs, on any thread, whenever something may have changed, until what
  // is answered is let go of. Asks without waiting.
  virtual std::shared_ptr<void> begin(std::function<void()> handler) = 0;
};

// The platform's part around one extension: makes enumerators, asks them for pages and
// changes, keeps one alive per watched container, and hears the extension's signals. It
// knows nothing of sockets. Any thread.
class FileProviderHost final : public NSFileProviderManager,
                               public std::enable_shared_from_this<FileProviderHost> {
 public:
  // A watcher's place in its container's watch; leaves it when it goes.
  class Subscription;

  // `news` may be null. `log` outlives the host.
  FileProviderHost(HostTools tools, std::unique_ptr<WorkingSetNews> news, Log& log);
  ~FileProviderHost() override;

  // Before the first request; the extension needs the host as its manager to be made. One
  // that does not support enumeration is never asked for an enumerator.
  void setExtension(std::shared_ptr<NSFileProviderExtension> extension,
                    bool supportsEnumeration = true);
  NSFileProviderExtension& extension() const { return *_extension; }
  const HostTools& tools() const { return _tools; }

  // Lists a container with an enumerator of the listing's own. Replies when the enumerator
  // was made; the first page is asked for by then.
  void list(const NSFileProviderItemIdentifier& container, NSFileProviderPage firstPage,
            Reply<std::shared_ptr<Listing>, NSErrorPtr> reply);

  // Watches a container; all its watchers share one enumerator.
  std::shared_ptr<Subscription> watch(const NSFileProviderItemIdentifier& container,
                                      std::shared_ptr<ContainerWatcher> watcher)
      SKEIN_EXCLUDES(_mutex);

  // One round of the working set's changes; from the beginning for a nil anchor.
  void workingSetChanges(std::optional<NSFileProviderSyncAnchor> fromSyncAnchor,
                         Reply<HostChangeBatch, NSErrorPtr> reply);

  // signalEnumeratorForContainerItemIdentifier:completionHandler:
  // A container that this host never made an enumerator for is unknown, one that is watched
  // never.
  void signalEnumeratorForContainerItemIdentifier(const NSFileProviderItemIdentifier& identifier,
                                                  Completion<NSErrorPtr> completionHandler) override
      SKEIN_EXCLUDES(_mutex);

  std::size_t watchedContainers() const SKEIN_EXCLUDES(_mutex);

 private:
  struct Watched {
    std::shared_ptr<ContainerWatch> watch;
    std::size_t watchers = 0;
  };

  std::shared_ptr<NSFileProviderEnumerator> makeEnumerator(
      const NSFileProviderItemIdentifier& container, NSErrorOut error) SKEIN_EXCLUDES(_mutex);
  ContainerWatch::Opened open(const NSFileProviderItemIdentifier& container, NSErrorOut error);
  std::shared_ptr<ContainerWatch> makeWatch(const NSFileProviderItemIdentifier& container);
  void leave(const NSFileProviderItemIdentifier& container,
             const std::shared_ptr<ContainerWatch>& watch,
             const std::shared_ptr<ContainerWatcher>& watcher) SKEIN_EXCLUDES(_mutex);

  const HostTools _tools;
  const std::unique_ptr<WorkingSetNews> _news;
  Log& _log;
  std::shared_ptr<NSFileProviderExtension> _extension;
  bool _supportsEnumeration = true;
  mutable Mutex _mutex;
  std::unordered_map<NSFileProviderItemIdentifier, Watched> _watched SKEIN_GUARDED_BY(_mutex);
  // Containers that an enumerator was made for. Forgotten all at once when they get many:
  // a signal for one of them is then answered with an error, which is only logged.
  std::unordered_set<NSFileProviderItemIdentifier> _known SKEIN_GUARDED_BY(_mutex);
};

class FileProviderHost::Subscription {
 public:
  Subscription(std::shared_ptr<FileProviderHost> host, NSFileProviderItemIdentifier container,
               std::shared_ptr<ContainerWatch> watch, std::shared_ptr<ContainerWatcher> watcher)
      : _host(std::move(host)),
        _container(std::move(container)),
        _watch(std::move(watch)),
        _watcher(std::move(watcher)) {}
  ~Subscription() { _host->leave(_container, _watch, _watcher); }
  Subscription(const Subscription&) = delete;
  Subscription& operator=(const Subscription&) = delete;

 private:
  const std::shared_ptr<FileProviderHost> _host;
  const NSFileProviderItemIdentifier _container;
  const std::shared_ptr<ContainerWatch> _watch;
  const std::shared_ptr<ContainerWatcher> _watcher;
};

}  // namespace skein
