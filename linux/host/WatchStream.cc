#include "linux/host/WatchStream.h"

#include <utility>

namespace skein {
namespace {

// A page's worth: what crosses the socket at once.
constexpr std::size_t kMostChangesAtOnce = 200;

}  // namespace

class WatchStream::Gatherer final : public ContainerWatcher,
                                    public std::enable_shared_from_this<Gatherer> {
 public:
  using BeginReply = Reply<std::shared_ptr<HostWatch>, NSErrorPtr>;
  using NextReply = Reply<std::vector<HostChange>, NSErrorPtr>;

  Gatherer(std::shared_ptr<Executor> executor, BeginReply reply)
      : _executor(std::move(executor)), _begin(std::move(reply)) {}

  void setSubscription(std::shared_ptr<FileProviderHost::Subscription> subscription)
      SKEIN_EXCLUDES(_mutex) {
    {
      MutexLock lock(_mutex);
      _subscription = std::move(subscription);
    }
    replyToBegin();
  }

  void watchDidBegin() override SKEIN_EXCLUDES(_mutex) {
    {
      MutexLock lock(_mutex);
      _begun = true;
    }
    replyToBegin();
  }

  void containerDidChange(const std::vector<HostChange>& changes) override SKEIN_EXCLUDES(_mutex) {
    {
      MutexLock lock(_mutex);
      for (const HostChange& change : changes) _events.add(change);
    }
    handOut();
  }

  void watchDidEnd(NSErrorPtr error) override SKEIN_EXCLUDES(_mutex) {
    {
      MutexLock lock(_mutex);
      _ended = true;
      _error = error ? std::move(error)
                     : NSError::errorWithDomain(NSCocoaErrorDomain, NSUserCancelledError);
    }
    replyToBegin();
    handOut();
  }

  void next(NextReply reply) SKEIN_EXCLUDES(_mutex) {
    {
      MutexLock lock(_mutex);
      _waiting.push_back(std::move(reply));
    }
    handOut();
  }

 private:
  // Replies when the watch stands (or failed) and this end knows its subscription.
  void replyToBegin() SKEIN_EXCLUDES(_mutex) {
    BeginReply reply;
    std::shared_ptr<FileProviderHost::Subscription> subscription;
    NSErrorPtr error;
    {
      MutexLock lock(_mutex);
      if (!_begin || !_subscription || (!_begun && !_ended)) return;
      reply = std::exchange(_begin, nullptr);
      subscription = std::exchange(_subscription, nullptr);
      if (!_begun) error = _error;
    }
    std::shared_ptr<HostWatch> stream;
    if (!error) {
      stream.reset(new WatchStream(shared_from_this(), std::exchange(subscription, nullptr)));
    }
    _executor->post([reply = std::move(reply), stream = std::move(stream), error = std::move(error),
                     subscription = std::move(subscription)]() mutable {
      reply(std::move(stream), std::move(error));
    });
  }

  void handOut() SKEIN_EXCLUDES(_mutex) {
    MutexLock lock(_mutex);
    while (!_waiting.empty() && (!_events.empty() || _ended)) {
      auto reply = std::move(_waiting.front());
      _waiting.pop_front();
      std::vector<HostChange> changes = _events.take(kMostChangesAtOnce);
      const bool over = changes.empty();
      _replies.push_back([reply = std::move(reply), changes = std::move(changes),
                          error = over ? _error : nullptr]() mutable {
        reply(std::move(changes), std::move(error));
      });
    }
    if (_replies.empty() || std::exchange(_replying, true)) return;
    lock.unlock();
    _executor->post([self = shared_from_this()] { self->runReplies(); });
  }

  // One thread at a time, so that answers come in order.
  void runReplies() SKEIN_EXCLUDES(_mutex) {
    for (;;) {
      Task reply;
      {
        MutexLock lock(_mutex);
        if (_replies.empty()) {
          _replying = false;
          return;
        }
        reply = std::move(_replies.front());
        _replies.pop_front();
      }
      reply();
    }
  }

  const std::shared_ptr<Executor> _executor;
  Mutex _mutex;
  BeginReply _begin SKEIN_GUARDED_BY(_mutex);
  std::shared_ptr<FileProviderHost::Subscription> _subscription SKEIN_GUARDED_BY(_mutex);
  bool _begun SKEIN_GUARDED_BY(_mutex) = false;
  bool _ended SKEIN_GUARDED_BY(_mutex) = false;
  NSErrorPtr _error SKEIN_GUARDED_BY(_mutex);
  WatchEvents _events SKEIN_GUARDED_BY(_mutex);
  std::deque<NextReply> _waiting SKEIN_GUARDED_BY(_mutex);
  std::deque<Task> _replies SKEIN_GUARDED_BY(_mutex);
  bool _replying SKEIN_GUARDED_BY(_mutex) = false;
};

WatchStream::WatchStream(std::shared_ptr<Gatherer> gatherer,
                         std::shared_ptr<FileProviderHost::Subscription> subscription)
    : _gatherer(std::move(gatherer)), _subscription(std::move(subscription)) {}

WatchStream::~WatchStream() = default;

void WatchStream::begin(FileProviderHost& host, const NSFileProviderItemIdentifier& container,
                        Reply<std::shared_ptr<HostWatch>, NSErrorPtr> reply) {
  auto gatherer = std::make_shared<Gatherer>(host.tools().executor, std::move(reply));
  auto subscription = host.watch(container, gatherer);
  gatherer->setSubscription(std::move(subscription));
}

void WatchStream::next(Reply<std::vector<HostChange>, NSErrorPtr> reply) {
  _gatherer->next(std::move(reply));
}

}  // namespace skein
