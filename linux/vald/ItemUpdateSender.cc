#include "linux/vald/ItemUpdateSender.h"

#include <string>
#include <utility>

#include "linux/protocol/DocumentURL.h"
#include "linux/vald/WatchScope.h"
#include "platform/fileprovider/NSFileProviderItem.h"
#include "vellum/VLErrors.h"

namespace skein::vald {
namespace {

NSErrorPtr vellumError(std::int64_t code, std::string text) {
  return NSError::errorWithDomain(VLVellumErrorDomain, code,
                                  {{NSLocalizedDescriptionKey, std::move(text)}});
}

NSErrorPtr changesLost() {
  return vellumError(VLVellumErrorChangesLost,
                     "Too many changes came at once to tell them one by one; list the folder "
                     "again.");
}

NSErrorPtr pushLost() {
  return vellumError(VLVellumErrorChangesLost,
                     "Changes could not be told to whoever watches; list the folder again.");
}

NSErrorPtr watchFailed(const NSURLPtr& url, const NSErrorPtr& reason) {
  return NSError::errorWithDomain(
      VLVellumErrorDomain, VLVellumErrorChangesLost,
      {{NSLocalizedDescriptionKey,
        url->path() + " cannot be watched, so list the folder again: " +
            (reason ? reason->localizedDescription() : "there is no item.")},
       {NSUnderlyingErrorKey, reason}});
}

NSErrorPtr invalidated() {
  return vellumError(VLVellumErrorInvalidParameter, "This update sender was invalidated.");
}

}  // namespace

// Forwards to the sender and keeps it alive.
class ItemUpdateSender::Proxy final : public VLItemNotificationSending {
 public:
  explicit Proxy(std::shared_ptr<ItemUpdateSender> sender) : _sender(std::move(sender)) {}

  void boostPriority(Reply<> reply) override { _sender->boostPriority(std::move(reply)); }
  void watchItemAtURL(const NSURLPtr& url, std::uint64_t options,
                      Reply<NSErrorPtr> gatherReply) override {
    _sender->watchItemAtURL(url, options, std::move(gatherReply));
  }
  void invalidate() override { _sender->invalidate(); }

 private:
  const std::shared_ptr<ItemUpdateSender> _sender;
};

// Hears what became of one push: it was answered, or it is destroyed without that.
class ItemUpdateSender::PushReply {
 public:
  explicit PushReply(std::weak_ptr<ItemUpdateSender> sender) : _sender(std::move(sender)) {}
  PushReply(PushReply&&) = default;
  PushReply& operator=(PushReply&&) = delete;
  ~PushReply() {
    if (const auto sender = _sender.lock()) sender->breakLink(pushLost());
  }

  void operator()() {
    if (const auto sender = std::exchange(_sender, {}).lock()) sender->pushWasAnswered();
  }

 private:
  std::weak_ptr<ItemUpdateSender> _sender;
};

ItemUpdateSender::ItemUpdateSender(std::shared_ptr<VLItemNotificationReceiving> receiver,
                                   std::shared_ptr<Executor> executor, Store& store,
                                   SenderLimits limits)
    : _executor(std::move(executor)),
      _store(store),
      _limits(limits),
      _receiver(std::move(receiver)) {}

ItemUpdateSender::~ItemUpdateSender() { end(nullptr, false); }

void ItemUpdateSender::boostPriority(Reply<> reply) {
  {
    MutexLock lock(_mutex);
    _boosted = true;
  }
  _executor->post([reply = std::move(reply)]() mutable { reply(); });
}

void ItemUpdateSender::watchItemAtURL(const NSURLPtr& url, std::uint64_t options,
                                      Reply<NSErrorPtr> gatherReply) {
  NSErrorPtr error;
  if (options != kWatchChildren && options != kWatchSubtree) {
    error = vlc_errorInvalidParameter("options", std::to_string(options));
  } else if (!url) {
    error = vlc_errorInvalidParameter("url", "(null)");
  } else {
    MutexLock lock(_mutex);
    if (_state == State::Ended) {
      error = _endReason;
    } else if (_state != State::Idle) {
      error = vellumError(VLVellumErrorInvalidParameter,
                          "This update sender watches a folder already; ask for another one.");
    } else {
      _state = State::Gathering;
      _subtree = options == kWatchSubtree;
    }
  }
  _executor->post(
      [self = shared_from_this(), url, error, reply = std::move(gatherReply)]() mutable {
        if (error) {
          reply(error);
        } else {
          self->gather(url, std::move(reply));
        }
      });
}

void ItemUpdateSender::gather(const NSURLPtr& url, Reply<NSErrorPtr> gatherReply) {
  NSErrorPtr error;
  const auto id = fileObjectIDOfDocumentURL(url);
  const VLQueryItemPtr item =
      id ? _store.itemWithID(*id, &error) : _store.itemAtPath(url->path(), true, &error);
  if (!item) {
    {
      MutexLock lock(_mutex);
      if (_state == State::Gathering) _state = State::Idle;
      _undecided.clear();
    }
    gatherReply(watchFailed(url, error));
    return;
  }

  const VLFileObjectID folder = item->fileObjectID();
  if (item->isFolder()) _store.retainFolderWatch(folder);
  {
    MutexLock lock(_mutex);
    if (_state == State::Gathering) {
      _state = State::Watching;
      _folder = folder;
      _everything = _subtree && item->itemIdentifier() == NSFileProviderRootContainerItemIdentifier;
      _retainsFolderWatch = item->isFolder();
      schedule();
    } else {
      error = _endReason;
    }
  }
  if (error && item->isFolder()) _store.releaseFolderWatch(folder);
  gatherReply(error);
}

void ItemUpdateSender::invalidate() { end(invalidated(), false); }

std::shared_ptr<VLItemNotificationSending> ItemUpdateSender::remoteObjectProxyWithErrorHandler(
    std::function<void(NSErrorPtr)> errorHandler) {
  NSErrorPtr broken;
  {
    MutexLock lock(_mutex);
    if (_state != State::Ended) {
      _proxyHandlers.push_back(errorHandler);
    } else if (_linkBroke) {
      broken = _endReason;
    }
  }
  if (broken) _executor->post([errorHandler, broken] { errorHandler(broken); });
  return std::make_shared<Proxy>(shared_from_this());
}

void ItemUpdateSender::setLinkBrokenHandler(std::function<void(NSErrorPtr)> handler) {
  NSErrorPtr broken;
  {
    MutexLock lock(_mutex);
    if (_state != State::Ended) {
      std::swap(_linkBrokenHandler, handler);
    } else if (_linkBroke) {
      broken = _endReason;
    }
  }
  if (broken) _executor->post([handler, broken] { handler(broken); });
}

void ItemUpdateSender::storeDidChange(const std::vector<StoreChange>& changes) {
  bool tooMuch = false;
  {
    MutexLock lock(_mutex);
    if (_state != State::Gathering && _state != State::Watching) return;
    const bool decideLater =
        _state == State::Gathering || (_subtree && !_everything) || !_undecided.empty();
    for (const StoreChange& change : changes) {
      if (decideLater) {
        _undecided.push_back(change);
      } else if (VLQueryItemPtr seen = seenWithoutAsking(change)) {
        _pending.add(std::move(seen));
      }
      tooMuch = hasTooMuch();
      if (tooMuch) break;
    }
    if (_state == State::Watching && !(_pending.empty() && _undecided.empty())) schedule();
  }
  if (tooMuch) breakLink(changesLost());
}

void ItemUpdateSender::storeDidOverflow(const VLFileObjectID& folder) {
  std::optional<VLFileObjectID> watched;
  bool subtree = false;
  bool everything = false;
  {
    MutexLock lock(_mutex);
    if (_state != State::Gathering && _state != State::Watching) return;
    watched = _folder;
    subtree = _subtree;
    everything = _everything;
  }
  if (watched && *watched != folder && !everything) {
    const auto path = _store.pathForID(folder, nullptr);
    const auto watchedPath = _store.pathForID(*watched, nullptr);
    // Where either cannot be told any more, nothing may be taken for untouched.
    const bool concerned = !path || !watchedPath || pathIsWithin(*watchedPath, *path) ||
                           (subtree && pathIsWithin(*path, *watchedPath));
    if (!concerned) return;
  }
  breakLink(changesLost());
}

void ItemUpdateSender::breakLink(NSErrorPtr error) {
  Handlers handlers = end(error, true);
  if (handlers.empty()) return;
  _executor->post([handlers = std::move(handlers), error] {
    for (const auto& handler : handlers) handler(error);
  });
}

bool ItemUpdateSender::isBoosted() const {
  MutexLock lock(_mutex);
  return _boosted;
}

bool ItemUpdateSender::hasEnded() const {
  MutexLock lock(_mutex);
  return _state == State::Ended;
}

// One visit to the executor. There is never more than one at a time, which keeps the
// changes of an item in their order.
void ItemUpdateSender::run() {
  while (decideSome()) {
  }
  push();
}

bool ItemUpdateSender::decideSome() {
  std::vector<StoreChange> changes;
  std::optional<VLFileObjectID> folder;
  {
    MutexLock lock(_mutex);
    if (_state != State::Watching || _undecided.empty()) return false;
    if (!_subtree || _everything) {
      // What came while gathering. The lock is kept, so that the next change finds
      // nothing undecided before it.
      for (const StoreChange& change : _undecided) {
        if (VLQueryItemPtr seen = seenWithoutAsking(change)) _pending.add(std::move(seen));
      }
      _undecided.clear();
      return false;
    }
    changes.swap(_undecided);
    folder = _folder;
  }

  SubtreeScope scope(_store, *folder);
  std::vector<VLQueryItemPtr> seenItems;
  for (const StoreChange& change : changes) {
    if (VLQueryItemPtr seen = scope.seen(change)) seenItems.push_back(std::move(seen));
  }
  bool tooMuch = false;
  {
    MutexLock lock(_mutex);
    if (_state != State::Watching) return false;
    for (VLQueryItemPtr& seen : seenItems) _pending.add(std::move(seen));
    tooMuch = hasTooMuch();
  }
  if (tooMuch) breakLink(changesLost());
  return !tooMuch;
}

void ItemUpdateSender::push() {
  VLQueryItems items;
  std::shared_ptr<VLItemNotificationReceiving> receiver;
  {
    MutexLock lock(_mutex);
    _scheduled = false;
    if (_state != State::Watching) return;
    // A change that came since is the next visit's.
    if (!_undecided.empty()) schedule();
    if (_pushUnderWay || _pending.empty()) return;
    items = _pending.take(_limits.batch);
    _pushUnderWay = true;
    receiver = _receiver;
  }
  receiver->receiveUpdates(items, {}, {}, PushReply(weak_from_this()));
}

void ItemUpdateSender::pushWasAnswered() {
  MutexLock lock(_mutex);
  _pushUnderWay = false;
  if (_state == State::Watching && !_pending.empty()) schedule();
}

void ItemUpdateSender::schedule() {
  if (std::exchange(_scheduled, true)) return;
  // A visit that is still to come keeps nobody alive whose client is gone.
  _executor->post([weak = weak_from_this()] {
    if (const auto self = weak.lock()) self->run();
  });
}

VLQueryItemPtr ItemUpdateSender::seenWithoutAsking(const StoreChange& change) const {
  return _everything ? change.item : seenByChildrenWatch(*_folder, change);
}

bool ItemUpdateSender::hasTooMuch() const {
  return _pending.size() > _limits.pending || _undecided.size() > _limits.pending;
}

ItemUpdateSender::Handlers ItemUpdateSender::end(NSErrorPtr reason, bool linkBroke) {
  // Destroyed after the lock is left: what they hold is the client's.
  std::shared_ptr<VLItemNotificationReceiving> receiver;
  PendingItems pending;
  std::vector<StoreChange> undecided;
  Handlers handlers;
  std::optional<VLFileObjectID> retained;
  {
    MutexLock lock(_mutex);
    if (_state == State::Ended) return {};
    _state = State::Ended;
    _endReason = std::move(reason);
    _linkBroke = linkBroke;
    receiver.swap(_receiver);
    std::swap(pending, _pending);
    undecided.swap(_undecided);
    handlers.swap(_proxyHandlers);
    if (_linkBrokenHandler) handlers.push_back(std::exchange(_linkBrokenHandler, nullptr));
    if (_retainsFolderWatch) retained = _folder;
  }
  if (retained) _store.releaseFolderWatch(*retained);
  return handlers;
}

}  // namespace skein::vald
