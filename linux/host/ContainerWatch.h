#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <vector>

#include "base/SerialQueue.h"
#include "linux/host/Listing.h"
#include "linux/host/WatchEvents.h"
#include "platform/fileprovider/NSFileProviderExtension.h"
#include "platform/log/Log.h"

namespace skein {

// Hears of one container. Called on the watch's queue: hand on and return.
class ContainerWatcher {
 public:
  virtual ~ContainerWatcher() = default;
  // What changes from now on is told. Once.
  virtual void watchDidBegin() = 0;
  virtual void containerDidChange(const std::vector<HostChange>& changes) = 0;
  // The watch has ended, or never began; nothing more comes.
  virtual void watchDidEnd(NSErrorPtr error) = 0;
};

// The one live enumerator of a watched container, shared by its watchers.
//
// It reads the current anchor, then lists, then asks for changes in rounds, each from the
// anchor that the round before it ended with. When an anchor has expired it does all that
// anew and tells the watchers how the result differs from what they knew; so they hear of
// everything, and of nothing twice. It takes a new enumerator for that: the folder may have
// another URL by now, or none, and an enumerator keeps the one that it was made with. When
// the extension fails for another reason (vald ended) it tries again, also with a new
// enumerator, until it works, and goes on from the anchor that it has: the working set's
// anchors outlive an enumerator. Being logged out, or the container being gone, ends the
// watch.
//
// Every answer of the extension is queued to _queue and carries the number of the step it
// belongs to; answers of a step that was given up are dropped.
class ContainerWatch final : public std::enable_shared_from_this<ContainerWatch> {
 public:
  // What a container was opened as.
  struct Opened {
    std::shared_ptr<NSFileProviderEnumerator> enumerator;  // null with an error
    // The folder that it enumerates: the container, or what an alias leads to.
    NSFileProviderItemIdentifier folder;
  };
  using Open = std::function<Opened(NSErrorOut)>;
  // Signals for what the enumerator does not signal by itself: `handler` runs, on any thread,
  // whenever something may have changed, until what was answered is let go of.
  using BeginNews = std::function<std::shared_ptr<void>(std::function<void()> handler)>;

  // `open` may ask vald: it runs on the executor. `beginNews` may be empty. `log` outlives the
  // watch.
  ContainerWatch(NSFileProviderItemIdentifier container, Open open, BeginNews beginNews,
                 HostTools tools, Log& log);

  // The first watcher starts it. A watcher that comes later hears of what comes later.
  void addWatcher(std::shared_ptr<ContainerWatcher> watcher);
  // With the last one gone the enumerator is invalidated.
  void removeWatcher(const std::shared_ptr<ContainerWatcher>& watcher);

  // The container has news. Any thread, any lock held; signals that come before the first
  // is looked at are one.
  void signal();

 private:
  class RoundObserver;
  enum class State : std::uint8_t { Idle, Opening, Resuming, Rebuilding, Live, Waiting, Ended };
  struct Round {
    NSFileProviderItems updates;
    std::vector<NSFileProviderItemIdentifier> deletions;
    std::optional<NSFileProviderSyncAnchor> anchor;
    bool moreComing = false;
    NSErrorPtr error;
  };

  // A new step begins: older answers are dropped, and the new one has its deadline.
  std::uint64_t beginStep() SKEIN_REQUIRES(_queue);
  void endStep() SKEIN_REQUIRES(_queue);
  // Runs `work(self)` on _queue if `step` is still under way.
  void continueStep(std::uint64_t step, UniqueFunction<void(ContainerWatch&)> work);

  void open() SKEIN_REQUIRES(_queue);
  void didOpen(Opened opened, NSErrorPtr error) SKEIN_REQUIRES(_queue);
  void rebuild() SKEIN_REQUIRES(_queue);
  void list() SKEIN_REQUIRES(_queue);
  void pullPage() SKEIN_REQUIRES(_queue);
  void startRound() SKEIN_REQUIRES(_queue);
  void roundDidEnd(Round round) SKEIN_REQUIRES(_queue);
  void becomeLive() SKEIN_REQUIRES(_queue);
  void anchorDidExpire(const NSErrorPtr& error) SKEIN_REQUIRES(_queue);
  void didFail(const NSErrorPtr& error) SKEIN_REQUIRES(_queue);
  void openLater(unsigned tries, const NSErrorPtr& error) SKEIN_REQUIRES(_queue);
  void end(const NSErrorPtr& error) SKEIN_REQUIRES(_queue);
  void letGoOfEnumerator() SKEIN_REQUIRES(_queue);

  bool isOwnFolder(const NSFileProviderItemIdentifier& identifier) const SKEIN_REQUIRES(_queue);
  // What a round says of `known`; the changes, for the watchers.
  std::vector<HostChange> apply(const Round& round, KnownItems& known) SKEIN_REQUIRES(_queue);
  void tell(const std::vector<HostChange>& changes) SKEIN_REQUIRES(_queue);

  const NSFileProviderItemIdentifier _container;
  const Open _open;
  const BeginNews _beginNews;
  const HostTools _tools;
  Log& _log;
  SerialQueue _queue;
  std::atomic<bool> _signalled{false};

  State _state SKEIN_GUARDED_BY(_queue) = State::Idle;
  bool _hasNews SKEIN_GUARDED_BY(_queue) = false;
  bool _inRound SKEIN_GUARDED_BY(_queue) = false;
  bool _begun SKEIN_GUARDED_BY(_queue) = false;  // there is a first state to compare with
  std::uint64_t _step SKEIN_GUARDED_BY(_queue) = 0;
  Timers::Key _timer SKEIN_GUARDED_BY(_queue) = 0;
  unsigned _failures SKEIN_GUARDED_BY(_queue) = 0;
  unsigned _expiries SKEIN_GUARDED_BY(_queue) = 0;  // since the last round of a live watch
  std::shared_ptr<void> _newsOfOthers SKEIN_GUARDED_BY(_queue);
  std::vector<std::shared_ptr<ContainerWatcher>> _watchers SKEIN_GUARDED_BY(_queue);
  std::shared_ptr<NSFileProviderEnumerator> _enumerator SKEIN_GUARDED_BY(_queue);
  NSFileProviderItemIdentifier _folder SKEIN_GUARDED_BY(_queue);
  std::shared_ptr<Listing> _listing SKEIN_GUARDED_BY(_queue);
  // Of the state that is being listed, or of _known. nil: _known is to be listed anew.
  std::optional<NSFileProviderSyncAnchor> _anchor SKEIN_GUARDED_BY(_queue);
  KnownItems _known SKEIN_GUARDED_BY(_queue);
  // The state that is being listed; takes _known's place when it is complete.
  KnownItems _fresh SKEIN_GUARDED_BY(_queue);
  // Items of _fresh that the watchers have yet to hear of, with the item to tell.
  std::unordered_map<NSFileProviderItemIdentifier, NSFileProviderItemPtr> _news
      SKEIN_GUARDED_BY(_queue);
};

}  // namespace skein
