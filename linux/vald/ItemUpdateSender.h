#pragma once

#include <cstddef>
#include <functional>
#include <memory>
#include <optional>
#include <vector>

#include "base/Executor.h"
#include "base/Mutex.h"
#include "linux/protocol/LinkBreaking.h"
#include "linux/vald/PendingItems.h"
#include "linux/vald/Store.h"
#include "vellum/VLDaemonConnection.h"

namespace skein::vald {

// The options of a watch: a folder's own children, or its whole subtree.
inline constexpr std::uint64_t kWatchChildren = 19;
inline constexpr std::uint64_t kWatchSubtree = 23;

struct SenderLimits {
  std::size_t batch = 200;       // items in a push
  std::size_t pending = 10'000;  // items, and undecided changes, that may wait
};

// vald's end of one watch: pushes the watched folder's items to one receiver as they
// change, one push at a time. While a push is unanswered the changes gather, the latest
// state of each item; when too many wait, the link breaks. The memory that a receiver who
// stopped can cost is thereby bounded. A push whose reply goes uncalled was lost, and breaks
// the link as well: the receiver would never hear of these changes otherwise.
//
// Any thread. Pushes, replies and handlers come from the executor, under no lock. It ends
// with invalidate(), a broken link, or its last reference: then it lets go of the receiver
// and nothing more is pushed but a push that was under way. The store outlives it.
class ItemUpdateSender final : public VLItemNotificationSender,
                               public LinkBreaking,
                               public std::enable_shared_from_this<ItemUpdateSender> {
 public:
  ItemUpdateSender(std::shared_ptr<VLItemNotificationReceiving> receiver,
                   std::shared_ptr<Executor> executor, Store& store, SenderLimits limits);
  ~ItemUpdateSender() override;

  void boostPriority(Reply<> reply) override SKEIN_EXCLUDES(_mutex);

  // What changes from this very call on is pushed, so that a client may list the folder
  // without waiting for the reply. One watch in a sender's life; after a failed one it may
  // try again. A URL that says whose place it is watches that item, wherever it is now. A
  // watch that cannot begin answers VLVellumErrorChangesLost, whatever kept it from it: the
  // client has listed by then, and only an error of that domain makes it ask again. The drive
  // with its subtree has the app containers with it. An item that leaves the folder is pushed as
  // dead. A folder that is moved into or out of a watched subtree is pushed as one item, without
  // what it holds.
  void watchItemAtURL(const NSURLPtr& url, std::uint64_t options,
                      Reply<NSErrorPtr> gatherReply) override SKEIN_EXCLUDES(_mutex);
  void invalidate() override SKEIN_EXCLUDES(_mutex);

  // For a client in this process: forwards, and hears of the broken link.
  std::shared_ptr<VLItemNotificationSending> remoteObjectProxyWithErrorHandler(
      std::function<void(NSErrorPtr)> errorHandler) override SKEIN_EXCLUDES(_mutex);
  void setLinkBrokenHandler(std::function<void(NSErrorPtr)> handler) override
      SKEIN_EXCLUDES(_mutex);

  // What the store tells, in order, on its writer thread: asks the store nothing.
  void storeDidChange(const std::vector<StoreChange>& changes) SKEIN_EXCLUDES(_mutex);
  // Changes below `folder` went untold: breaks the link when the watch covers some of it.
  // On a thread that may ask the store.
  void storeDidOverflow(const VLFileObjectID& folder) SKEIN_EXCLUDES(_mutex);
  // Ends the sender; every error handler gets `error`.
  void breakLink(NSErrorPtr error) SKEIN_EXCLUDES(_mutex);

  bool isBoosted() const SKEIN_EXCLUDES(_mutex);
  bool hasEnded() const SKEIN_EXCLUDES(_mutex);

 private:
  enum class State : std::uint8_t { Idle, Gathering, Watching, Ended };
  class Proxy;
  class PushReply;
  using Handlers = std::vector<std::function<void(NSErrorPtr)>>;

  void gather(const NSURLPtr& url, Reply<NSErrorPtr> gatherReply) SKEIN_EXCLUDES(_mutex);
  void run() SKEIN_EXCLUDES(_mutex);
  // False when there is nothing left to decide; the caller may push then.
  bool decideSome() SKEIN_EXCLUDES(_mutex);
  void push() SKEIN_EXCLUDES(_mutex);
  void pushWasAnswered() SKEIN_EXCLUDES(_mutex);
  void schedule() SKEIN_REQUIRES(_mutex);
  // What a watch sees of a change that need not ask the store; null: nothing.
  VLQueryItemPtr seenWithoutAsking(const StoreChange& change) const SKEIN_REQUIRES(_mutex);
  bool hasTooMuch() const SKEIN_REQUIRES(_mutex);
  // Ends with `reason`, once, and gives out the handlers that hear of a broken link.
  Handlers end(NSErrorPtr reason, bool linkBroke) SKEIN_EXCLUDES(_mutex);

  const std::shared_ptr<Executor> _executor;
  Store& _store;
  const SenderLimits _limits;

  mutable Mutex _mutex;
  State _state SKEIN_GUARDED_BY(_mutex) = State::Idle;
  bool _boosted SKEIN_GUARDED_BY(_mutex) = false;
  bool _subtree SKEIN_GUARDED_BY(_mutex) = false;
  bool _everything SKEIN_GUARDED_BY(_mutex) = false;  // the drive with its subtree
  bool _scheduled SKEIN_GUARDED_BY(_mutex) = false;
  bool _pushUnderWay SKEIN_GUARDED_BY(_mutex) = false;
  bool _retainsFolderWatch SKEIN_GUARDED_BY(_mutex) = false;
  // Set while Watching.
  std::optional<VLFileObjectID> _folder SKEIN_GUARDED_BY(_mutex);
  // Changes of which it is not known yet whether they lie in the watch: all while
  // gathering, and those that a subtree's watch must ask the store about.
  std::vector<StoreChange> _undecided SKEIN_GUARDED_BY(_mutex);
  PendingItems _pending SKEIN_GUARDED_BY(_mutex);
  std::shared_ptr<VLItemNotificationReceiving> _receiver SKEIN_GUARDED_BY(_mutex);
  std::function<void(NSErrorPtr)> _linkBrokenHandler SKEIN_GUARDED_BY(_mutex);
  Handlers _proxyHandlers SKEIN_GUARDED_BY(_mutex);
  NSErrorPtr _endReason SKEIN_GUARDED_BY(_mutex);
  bool _linkBroke SKEIN_GUARDED_BY(_mutex) = false;
};

}  // namespace skein::vald
