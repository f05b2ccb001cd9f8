#include "linux/host/FileProviderHost.h"

#include <utility>

#include "linux/host/Deadline.h"
#include "platform/fileprovider/NSFileProviderError.h"

namespace skein {
namespace {

constexpr std::size_t kMostKnownContainers = 100'000;

bool isReserved(const NSFileProviderItemIdentifier& identifier) {
  return identifier == NSFileProviderRootContainerItemIdentifier ||
         identifier == NSFileProviderWorkingSetContainerItemIdentifier ||
         identifier == NSFileProviderAllDirectoriesContainerItemIdentifier;
}

// Hands one round on; may be called with the enumerator's lock held.
class BatchObserver final : public NSFileProviderChangeObserver {
 public:
  using Timed = TimedReply<HostChangeBatch>;
  BatchObserver(std::shared_ptr<NSFileProviderEnumerator> enumerator,
                std::shared_ptr<Executor> executor, std::shared_ptr<Timed> reply)
      : _enumerator(std::move(enumerator)),
        _executor(std::move(executor)),
        _reply(std::move(reply)) {}

  void didUpdateItems(const NSFileProviderItems& items) override { _batch.updates = items; }
  void didDeleteItemsWithIdentifiers(
      const std::vector<NSFileProviderItemIdentifier>& identifiers) override {
    _batch.deletions = identifiers;
  }
  void finishEnumeratingChangesUpToSyncAnchor(NSFileProviderSyncAnchor anchor,
                                              bool moreComing) override {
    _batch.token = std::move(anchor);
    _batch.moreComing = moreComing;
    finish(nullptr);
  }
  void finishEnumeratingWithError(NSErrorPtr error) override { finish(std::move(error)); }

 private:
  void finish(NSErrorPtr error) {
    const auto enumerator = std::exchange(_enumerator, nullptr);
    if (!enumerator) return;
    _executor->post([enumerator, reply = _reply, batch = std::move(_batch),
                     error = std::move(error)]() mutable {
      enumerator->invalidate();
      (*reply)(error ? HostChangeBatch() : std::move(batch), error);
    });
  }

  std::shared_ptr<NSFileProviderEnumerator> _enumerator;
  const std::shared_ptr<Executor> _executor;
  const std::shared_ptr<Timed> _reply;
  HostChangeBatch _batch;
};

}  // namespace

FileProviderHost::FileProviderHost(HostTools tools, std::unique_ptr<WorkingSetNews> news, Log& log)
    : _tools(std::move(tools)), _news(std::move(news)), _log(log) {}

FileProviderHost::~FileProviderHost() = default;

void FileProviderHost::setExtension(std::shared_ptr<NSFileProviderExtension> extension,
                                    bool supportsEnumeration) {
  _extension = std::move(extension);
  _supportsEnumeration = supportsEnumeration;
}

std::shared_ptr<NSFileProviderEnumerator> FileProviderHost::makeEnumerator(
    const NSFileProviderItemIdentifier& container, NSErrorOut error) {
  if (!_supportsEnumeration) {
    error.store(NSError::errorWithDomain(
        NSCocoaErrorDomain, NSFeatureUnsupportedError,
        {{NSLocalizedDescriptionKey,
          "The extension's attributes say that its folders cannot be listed."}}));
    return nullptr;
  }
  NSErrorPtr problem;
  auto enumerator = _extension->enumeratorForContainerItemIdentifier(container, &problem);
  if (!enumerator) {
    error.store(problem ? problem : fileProviderErrorForNonExistentItemWithIdentifier(container));
    return nullptr;
  }
  MutexLock lock(_mutex);
  if (_known.size() >= kMostKnownContainers) _known.clear();
  _known.insert(container);
  return enumerator;
}

void FileProviderHost::list(const NSFileProviderItemIdentifier& container,
                            NSFileProviderPage firstPage,
                            Reply<std::shared_ptr<Listing>, NSErrorPtr> reply) {
  auto timed = TimedReply<std::shared_ptr<Listing>>::begin(_tools, std::move(reply));
  _tools.executor->post(
      [self = shared_from_this(), container, firstPage = std::move(firstPage), timed]() mutable {
        NSErrorPtr error;
        auto enumerator = self->makeEnumerator(container, &error);
        std::shared_ptr<Listing> listing;
        if (enumerator) {
          listing = std::make_shared<Listing>(std::move(enumerator), std::move(firstPage), true,
                                              self->_tools);
          listing->start();
        }
        (*timed)(std::move(listing), std::move(error));
      });
}

std::shared_ptr<FileProviderHost::Subscription> FileProviderHost::watch(
    const NSFileProviderItemIdentifier& container, std::shared_ptr<ContainerWatcher> watcher) {
  std::shared_ptr<ContainerWatch> watch;
  {
    MutexLock lock(_mutex);
    Watched& watched = _watched[container];
    if (!watched.watch) watched.watch = makeWatch(container);
    ++watched.watchers;
    watch = watched.watch;
  }
  watch->addWatcher(watcher);
  return std::make_shared<Subscription>(shared_from_this(), container, std::move(watch),
                                        std::move(watcher));
}

ContainerWatch::Opened FileProviderHost::open(const NSFileProviderItemIdentifier& container,
                                              NSErrorOut error) {
  ContainerWatch::Opened opened{makeEnumerator(container, error), container};
  if (!opened.enumerator || isReserved(container)) return opened;
  // An alias has the URL of what it leads to.
  if (const NSURLPtr url = _extension->URLForItemWithPersistentIdentifier(container)) {
    const auto folder = _extension->persistentIdentifierForItemAtURL(url);
    if (folder) opened.folder = *folder;
  }
  return opened;
}

std::shared_ptr<ContainerWatch> FileProviderHost::makeWatch(
    const NSFileProviderItemIdentifier& container) {
  ContainerWatch::BeginNews beginNews;
  if (_news && container == NSFileProviderWorkingSetContainerItemIdentifier) {
    beginNews = [weak = weak_from_this()](std::function<void()> handler) -> std::shared_ptr<void> {
      const auto self = weak.lock();
      return self ? self->_news->begin(std::move(handler)) : nullptr;
    };
  }
  return std::make_shared<ContainerWatch>(
      container,
      [weak = weak_from_this(), container](NSErrorOut error) {
        const auto self = weak.lock();
        return self ? self->open(container, error) : ContainerWatch::Opened();
      },
      std::move(beginNews), _tools, _log);
}

void FileProviderHost::leave(const NSFileProviderItemIdentifier& container,
                             const std::shared_ptr<ContainerWatch>& watch,
                             const std::shared_ptr<ContainerWatcher>& watcher) {
  watch->removeWatcher(watcher);
  {
    MutexLock lock(_mutex);
    const auto watched = _watched.find(container);
    if (watched == _watched.end() || --watched->second.watchers > 0) return;
    _watched.erase(watched);
  }
}

void FileProviderHost::workingSetChanges(std::optional<NSFileProviderSyncAnchor> fromSyncAnchor,
                                         Reply<HostChangeBatch, NSErrorPtr> reply) {
  auto timed = TimedReply<HostChangeBatch>::begin(_tools, std::move(reply));
  _tools.executor->post([self = shared_from_this(), fromSyncAnchor, timed] {
    NSErrorPtr error;
    const auto enumerator =
        self->makeEnumerator(NSFileProviderWorkingSetContainerItemIdentifier, &error);
    auto* changes = dynamic_cast<NSFileProviderChangeEnumerating*>(enumerator.get());
    if (changes == nullptr) {
      (*timed)({}, error ? error
                         : NSError::errorWithDomain(NSCocoaErrorDomain, NSFeatureUnsupportedError));
      return;
    }
    const auto observer = std::make_shared<BatchObserver>(enumerator, self->_tools.executor, timed);
    if (fromSyncAnchor) {
      changes->enumerateChangesForObserver(observer, fromSyncAnchor);
      return;
    }
    changes->currentSyncAnchorWithCompletionHandler(
        [enumerator, changes, observer](std::optional<NSFileProviderSyncAnchor> anchor) {
          changes->enumerateChangesForObserver(observer, std::move(anchor));
        });
  });
}

void FileProviderHost::signalEnumeratorForContainerItemIdentifier(
    const NSFileProviderItemIdentifier& identifier, Completion<NSErrorPtr> completionHandler) {
  std::shared_ptr<ContainerWatch> watch;
  bool known = false;
  {
    MutexLock lock(_mutex);
    if (const auto watched = _watched.find(identifier); watched != _watched.end()) {
      watch = watched->second.watch;
    }
    known = watch || isReserved(identifier) || _known.contains(identifier);
  }
  if (watch) watch->signal();
  if (!completionHandler) return;
  _tools.executor->post([completion = std::move(completionHandler),
                         error = known ? nullptr
                                       : fileProviderErrorForNonExistentItemWithIdentifier(
                                             identifier)]() mutable { completion(error); });
}

std::size_t FileProviderHost::watchedContainers() const {
  MutexLock lock(_mutex);
  return _watched.size();
}

}  // namespace skein
