#include "linux/host/WorkingSetWatch.h"

#include <utility>
#include <vector>

#include "base/Mutex.h"

namespace skein {
namespace {

using namespace std::chrono_literals;

constexpr auto kPause = 500ms;
// A folder with its whole subtree.
constexpr std::uint64_t kWatchSubtree = 23;

}  // namespace

class WorkingSetWatch::Link final : public VLItemNotificationReceiving,
                                    public std::enable_shared_from_this<Link> {
 public:
  Link(DaemonProxies daemon, std::shared_ptr<Timers> timers, std::function<void()> handler)
      : _daemon(std::move(daemon)), _timers(std::move(timers)), _handler(std::move(handler)) {}

  // Asks where the drive is, then watches all of it.
  void begin() {
    const auto fail = [self = shared_from_this()](const NSErrorPtr&) { self->beginLater(); };
    _daemon(fail)->status([self = shared_from_this(), fail](const LocalDaemonStatus& status,
                                                            const NSErrorPtr& error) {
      if (error) {
        self->beginLater();
        return;
      }
      self->_daemon(fail)->getItemUpdateSenderWithReceiver(
          self,
          [self, store = status.store](const std::shared_ptr<VLItemNotificationSender>& sender,
                                       const auto& /*dictionary*/, const NSErrorPtr& problem) {
            if (problem || !sender) {
              self->beginLater();
            } else {
              self->watch(sender, store);
            }
          });
    });
  }

  void end() SKEIN_EXCLUDES(_mutex) {
    std::shared_ptr<VLItemNotificationSending> sender;
    {
      MutexLock lock(_mutex);
      _ended = true;
      sender = std::exchange(_sender, nullptr);
    }
    if (sender) sender->invalidate();
  }

  void receiveUpdates(const VLQueryItems&, const std::vector<std::string>&,
                      const std::vector<std::string>&, Reply<> reply) override {
    _handler();
    if (reply) reply();
  }
  void receiveProgressUpdates(const VLQueryItems&, Reply<>) override {}

 private:
  void watch(const std::shared_ptr<VLItemNotificationSender>& sender, const std::string& store)
      SKEIN_EXCLUDES(_mutex) {
    auto proxy = sender->remoteObjectProxyWithErrorHandler([weak = weak_from_this()](NSErrorPtr) {
      if (const auto self = weak.lock()) self->beginLater();
    });
    bool ended = false;
    {
      MutexLock lock(_mutex);
      ended = _ended;
      if (!ended) _sender = proxy;
    }
    if (ended) {
      proxy->invalidate();
      return;
    }
    proxy->watchItemAtURL(NSURL::fileURLWithPath(store), kWatchSubtree,
                          [self = shared_from_this()](const NSErrorPtr& error) {
                            if (error) self->beginLater();
                          });
    // What changed while there was no link.
    _handler();
  }

  void beginLater() SKEIN_EXCLUDES(_mutex) {
    std::shared_ptr<VLItemNotificationSending> broken;
    {
      MutexLock lock(_mutex);
      if (_ended || _waiting) return;
      _waiting = true;
      broken = std::exchange(_sender, nullptr);
    }
    _timers->after(kPause, [self = shared_from_this()] {
      {
        MutexLock lock(self->_mutex);
        self->_waiting = false;
        if (self->_ended) return;
      }
      self->begin();
    });
  }

  const DaemonProxies _daemon;
  const std::shared_ptr<Timers> _timers;
  const std::function<void()> _handler;
  Mutex _mutex;
  std::shared_ptr<VLItemNotificationSending> _sender SKEIN_GUARDED_BY(_mutex);
  bool _ended SKEIN_GUARDED_BY(_mutex) = false;
  bool _waiting SKEIN_GUARDED_BY(_mutex) = false;
};

std::shared_ptr<void> WorkingSetWatch::begin(std::function<void()> handler) {
  const auto link = std::make_shared<Link>(_daemon, _timers, std::move(handler));
  link->begin();
  return {link.get(), [link](void*) { link->end(); }};
}

}  // namespace skein
