#include "linux/host/ContainerWatch.h"

#include <algorithm>
#include <utility>

#include "platform/fileprovider/NSFileProviderError.h"

namespace skein {
namespace {

using namespace std::chrono_literals;

// Between attempts while the extension fails.
constexpr auto kFirstPause = 100ms;
constexpr auto kLongestPause = 3200ms;
// Anchors that expire again and again (a folder that changes faster than it is listed, or that
// can be listed and not be watched) are followed at once this often, then with pauses.
constexpr unsigned kExpiriesAtOnce = 3;

bool isProviderError(const NSErrorPtr& error, std::int64_t code) {
  return error->domain() == NSFileProviderErrorDomain && error->code() == code;
}

HostChange deletion(const NSFileProviderItemIdentifier& identifier, const KnownItem& known) {
  return {HostChange::Kind::Deleted, identifier, known.filename, std::nullopt, nullptr};
}

HostChange update(const NSFileProviderItemPtr& item, const KnownItem* before) {
  HostChange change{before != nullptr ? HostChange::Kind::Changed : HostChange::Kind::Created,
                    item->itemIdentifier(), item->filename(), std::nullopt, item};
  if (before != nullptr && before->filename != change.filename) {
    change.previousFilename = before->filename;
  }
  return change;
}

}  // namespace

// Hears one round. It may be called with the enumerator's lock held, so it only queues.
class ContainerWatch::RoundObserver final : public NSFileProviderChangeObserver {
 public:
  RoundObserver(std::shared_ptr<ContainerWatch> watch, std::uint64_t step)
      : _watch(std::move(watch)), _step(step) {}

  void didUpdateItems(const NSFileProviderItems& items) override {
    _round.updates.insert(_round.updates.end(), items.begin(), items.end());
  }
  void didDeleteItemsWithIdentifiers(
      const std::vector<NSFileProviderItemIdentifier>& identifiers) override {
    _round.deletions.insert(_round.deletions.end(), identifiers.begin(), identifiers.end());
  }
  void finishEnumeratingChangesUpToSyncAnchor(NSFileProviderSyncAnchor anchor,
                                              bool moreComing) override {
    _round.anchor = std::move(anchor);
    _round.moreComing = moreComing;
    finish();
  }
  void finishEnumeratingWithError(NSErrorPtr error) override {
    _round.error = std::move(error);
    finish();
  }

 private:
  void finish() {
    const auto watch = std::move(_watch);
    if (!watch) return;
    watch->continueStep(_step, [round = std::move(_round)](ContainerWatch& self) mutable {
      self._queue.assumeCurrent();
      self.roundDidEnd(std::move(round));
    });
  }

  std::shared_ptr<ContainerWatch> _watch;
  const std::uint64_t _step;
  Round _round;
};

ContainerWatch::ContainerWatch(NSFileProviderItemIdentifier container, Open open,
                               BeginNews beginNews, HostTools tools, Log& log)
    : _container(std::move(container)),
      _open(std::move(open)),
      _beginNews(std::move(beginNews)),
      _tools(std::move(tools)),
      _log(log),
      _queue("container-watch", _tools.executor) {}

void ContainerWatch::addWatcher(std::shared_ptr<ContainerWatcher> watcher) {
  _queue.async([self = shared_from_this(), watcher = std::move(watcher)]() mutable {
    self->_queue.assumeCurrent();
    self->_watchers.push_back(watcher);
    if (self->_begun) watcher->watchDidBegin();
    if (self->_state == State::Idle || self->_state == State::Ended) self->open();
  });
}

void ContainerWatch::removeWatcher(const std::shared_ptr<ContainerWatcher>& watcher) {
  _queue.async([self = shared_from_this(), watcher] {
    self->_queue.assumeCurrent();
    std::erase(self->_watchers, watcher);
    if (self->_watchers.empty() && self->_state != State::Ended) self->end(nullptr);
  });
}

void ContainerWatch::signal() {
  if (_signalled.exchange(true)) return;
  _queue.async([self = shared_from_this()] {
    self->_queue.assumeCurrent();
    self->_signalled = false;
    self->_hasNews = true;
    if (self->_state == State::Live && !self->_inRound) self->startRound();
  });
}

// --- Steps.

std::uint64_t ContainerWatch::beginStep() {
  endStep();
  const std::uint64_t step = ++_step;
  _timer = _tools.timers->after(_tools.deadline, [weak = weak_from_this(), step] {
    const auto self = weak.lock();
    if (!self) return;
    self->continueStep(step, [](ContainerWatch& watch) {
      watch._queue.assumeCurrent();
      watch.didFail(lostAnswerError(watch._tools.deadline));
    });
  });
  return step;
}

void ContainerWatch::endStep() {
  ++_step;
  _tools.timers->cancel(std::exchange(_timer, 0));
}

void ContainerWatch::continueStep(std::uint64_t step, UniqueFunction<void(ContainerWatch&)> work) {
  _queue.async([self = shared_from_this(), step, work = std::move(work)]() mutable {
    self->_queue.assumeCurrent();
    if (self->_step == step) work(*self);
  });
}

void ContainerWatch::open() {
  _state = State::Opening;
  // Before the first round, so that nothing falls between.
  if (_beginNews && !_newsOfOthers) {
    _newsOfOthers = _beginNews([weak = weak_from_this()] {
      if (const auto self = weak.lock()) self->signal();
    });
  }
  const std::uint64_t step = beginStep();
  _tools.executor->post([self = shared_from_this(), step] {
    NSErrorPtr error;
    Opened opened = self->_open(&error);
    self->_queue.async([self, step, opened = std::move(opened), error]() mutable {
      self->_queue.assumeCurrent();
      if (self->_step == step) {
        self->didOpen(std::move(opened), error);
      } else if (opened.enumerator) {
        opened.enumerator->invalidate();
      }
    });
  });
}

void ContainerWatch::didOpen(Opened opened, NSErrorPtr error) {
  endStep();
  if (!opened.enumerator) {
    didFail(error ? error : fileProviderErrorForNonExistentItemWithIdentifier(_container));
    return;
  }
  _enumerator = std::move(opened.enumerator);
  _folder = std::move(opened.folder);
  if (dynamic_cast<NSFileProviderChangeEnumerating*>(_enumerator.get()) == nullptr) {
    end(NSError::errorWithDomain(
        NSCocoaErrorDomain, NSFeatureUnsupportedError,
        {{NSLocalizedDescriptionKey, "This container reports no changes."}}));
    return;
  }
  if (_anchor) {
    _state = State::Resuming;
    startRound();
  } else {
    rebuild();
  }
}

// The anchor comes first: what changes while the listing runs is then in the first round,
// and a reset meanwhile shows as an expired anchor.
void ContainerWatch::rebuild() {
  _state = State::Rebuilding;
  _inRound = false;
  _fresh.clear();
  _news.clear();
  auto& changes = dynamic_cast<NSFileProviderChangeEnumerating&>(*_enumerator);
  const std::uint64_t step = beginStep();
  changes.currentSyncAnchorWithCompletionHandler(
      [self = shared_from_this(), step](std::optional<NSFileProviderSyncAnchor> anchor) {
        self->continueStep(step, [anchor = std::move(anchor)](ContainerWatch& watch) mutable {
          watch._queue.assumeCurrent();
          watch._anchor = std::move(anchor);
          watch.list();
        });
      });
}

void ContainerWatch::list() {
  // The listing has a deadline of its own for each page.
  endStep();
  _listing = std::make_shared<Listing>(_enumerator, NSFileProviderInitialPageSortedByName(), false,
                                       _tools);
  pullPage();
}

void ContainerWatch::pullPage() {
  const std::uint64_t step = _step;
  _listing->next(
      [self = shared_from_this(), step](NSFileProviderItems items, bool last, NSErrorPtr error) {
        self->continueStep(step, [items = std::move(items), last,
                                  error = std::move(error)](ContainerWatch& watch) mutable {
          watch._queue.assumeCurrent();
          if (error) {
            watch.didFail(error);
            return;
          }
          Round page;
          page.updates = std::move(items);
          watch.apply(page, watch._fresh);
          if (!last) {
            watch.pullPage();
            return;
          }
          watch._listing = nullptr;
          watch.startRound();
        });
      });
}

void ContainerWatch::startRound() {
  auto& changes = dynamic_cast<NSFileProviderChangeEnumerating&>(*_enumerator);
  _inRound = true;
  _hasNews = false;
  const std::uint64_t step = beginStep();
  changes.enumerateChangesForObserver(std::make_shared<RoundObserver>(shared_from_this(), step),
                                      _anchor);
}

void ContainerWatch::roundDidEnd(Round round) {
  endStep();
  _inRound = false;
  if (round.error) {
    if (isProviderError(round.error, NSFileProviderErrorSyncAnchorExpired)) {
      anchorDidExpire(round.error);
    } else {
      didFail(round.error);
    }
    return;
  }
  _anchor = std::move(round.anchor);
  const bool rebuilds = _state == State::Rebuilding;
  tell(apply(round, rebuilds ? _fresh : _known));
  // Also while it is being listed: nothing comes of a folder that is gone, not even this again.
  if (std::any_of(round.deletions.begin(), round.deletions.end(), [this](const auto& identifier) {
        _queue.assumeCurrent();
        return isOwnFolder(identifier);
      })) {
    end(fileProviderErrorForNonExistentItemWithIdentifier(_container));
    return;
  }
  if (!rebuilds) {
    _state = State::Live;
    _failures = 0;
    _expiries = 0;
  }
  if (round.moreComing || (!rebuilds && _hasNews)) {
    startRound();
  } else if (rebuilds) {
    becomeLive();
  }
}

// What was listed takes the place of what was known.
void ContainerWatch::becomeLive() {
  _state = State::Live;
  // Not the expiries: a watch that cannot stand expires as soon as it is live.
  if (_expiries == 0) _failures = 0;
  std::vector<HostChange> changes;
  if (_begun) {
    for (const auto& [identifier, known] : _known) {
      if (!_fresh.contains(identifier)) changes.push_back(deletion(identifier, known));
    }
    for (const auto& [identifier, item] : _news) {
      const auto before = _known.find(identifier);
      changes.push_back(update(item, before == _known.end() ? nullptr : &before->second));
    }
  }
  _known = std::exchange(_fresh, {});
  _news.clear();
  tell(changes);
  if (!std::exchange(_begun, true)) {
    for (const auto& watcher : _watchers) watcher->watchDidBegin();
  }
  if (_hasNews) startRound();
}

bool ContainerWatch::isOwnFolder(const NSFileProviderItemIdentifier& identifier) const {
  return identifier == _container || identifier == _folder;
}

std::vector<HostChange> ContainerWatch::apply(const Round& round, KnownItems& known) {
  const bool rebuilding = &known == &_fresh;
  std::vector<HostChange> changes;
  for (const NSFileProviderItemPtr& item : round.updates) {
    const NSFileProviderItemIdentifier identifier = item->itemIdentifier();
    if (isOwnFolder(identifier)) continue;  // the folder itself, not what it holds
    const KnownItem now = KnownItem::of(*item);
    const auto [place, isNew] = known.try_emplace(identifier, now);
    if (rebuilding) {
      place->second = now;
      if (!_begun) continue;
      const auto before = _known.find(identifier);
      if (before != _known.end() && before->second == now) {
        _news.erase(identifier);
      } else {
        _news[identifier] = item;
      }
      continue;
    }
    // A listing may have shown the change already that a round brings.
    if (!isNew && place->second == now) continue;
    changes.push_back(update(item, isNew ? nullptr : &place->second));
    place->second = now;
  }
  for (const NSFileProviderItemIdentifier& identifier : round.deletions) {
    const auto place = known.find(identifier);
    if (place == known.end()) continue;
    if (!rebuilding) changes.push_back(deletion(identifier, place->second));
    known.erase(place);
    _news.erase(identifier);
  }
  return changes;
}

void ContainerWatch::tell(const std::vector<HostChange>& changes) {
  if (changes.empty()) return;
  for (const auto& watcher : _watchers) watcher->containerDidChange(changes);
}

// --- Failures and the end.

void ContainerWatch::anchorDidExpire(const NSErrorPtr& error) {
  _anchor.reset();
  // This enumerator is new: the anchor was another one's.
  if (_state == State::Resuming) {
    rebuild();
    return;
  }
  letGoOfEnumerator();
  if (++_expiries <= kExpiriesAtOnce) {
    open();
  } else {
    openLater(_expiries - kExpiriesAtOnce - 1, error);
  }
}

void ContainerWatch::didFail(const NSErrorPtr& error) {
  endStep();
  letGoOfEnumerator();
  // The anchor of a state that was not listed to its end.
  if (_state == State::Rebuilding) _anchor.reset();
  const bool final = isProviderError(error, NSFileProviderErrorNotAuthenticated) ||
                     isProviderError(error, NSFileProviderErrorNoSuchItem);
  // A first state is not waited for.
  if (final || !_begun) {
    end(error);
  } else {
    openLater(_failures++, error);
  }
}

void ContainerWatch::openLater(unsigned tries, const NSErrorPtr& error) {
  _state = State::Waiting;
  const auto pause = std::min<std::chrono::milliseconds>(kFirstPause * (1U << std::min(tries, 10U)),
                                                         kLongestPause);
  VL_NOTICE(_log, "[NOTICE] the watch of %@ will try again in %lld ms: %@", _container,
            static_cast<long long>(pause.count()), error);
  const std::uint64_t step = ++_step;
  _timer = _tools.timers->after(pause, [weak = weak_from_this(), step] {
    const auto self = weak.lock();
    if (!self) return;
    self->continueStep(step, [](ContainerWatch& watch) {
      watch._queue.assumeCurrent();
      watch.open();
    });
  });
}

void ContainerWatch::end(const NSErrorPtr& error) {
  endStep();
  letGoOfEnumerator();
  _newsOfOthers = nullptr;
  _anchor.reset();
  _state = State::Ended;
  _begun = false;
  _failures = 0;
  _expiries = 0;
  _known.clear();
  _fresh.clear();
  _news.clear();
  for (const auto& watcher : std::exchange(_watchers, {})) watcher->watchDidEnd(error);
}

void ContainerWatch::letGoOfEnumerator() {
  _inRound = false;
  if (const auto listing = std::exchange(_listing, nullptr)) listing->cancel();
  if (const auto enumerator = std::exchange(_enumerator, nullptr)) enumerator->invalidate();
}

}  // namespace skein
