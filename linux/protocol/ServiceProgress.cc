#include "linux/protocol/ServiceProgress.h"

#include <utility>

#include "base/SerialQueue.h"

namespace skein {
namespace {

// A service's progress, as its client holds it.
class ProgressObject final : public wire::Progress::Server {
 public:
  ProgressObject(std::shared_ptr<Executor> executor, std::shared_ptr<NSProgress> progress)
      : _executor(std::move(executor)), _progress(std::move(progress)) {}
  ~ProgressObject() {
    _executor->post([progress = std::move(_progress)] {});
  }

  kj::Promise<void> cancel(CancelContext) override {
    _executor->post([progress = _progress] { progress->cancel(); });
    return kj::READY_NOW;
  }

 private:
  const std::shared_ptr<Executor> _executor;
  std::shared_ptr<NSProgress> _progress;
};

}  // namespace

// --- skein-host's end.

std::shared_ptr<ProgressTable::Request> ProgressTable::begin(
    kj::Maybe<wire::ProgressObserver::Client> observer) {
  std::shared_ptr<Request::Observer> own;
  KJ_IF_MAYBE (client, observer) {
    own = _loop->own(std::make_unique<Request::Observer>(kj::mv(*client)));
  }
  return std::make_shared<Request>(shared_from_this(), std::move(own));
}

void ProgressTable::end() {
  _ended = true;
  for (const ProgressPtr& progress : std::exchange(_underWay, {})) cancelSoon(progress);
}

void ProgressTable::cancelSoon(ProgressPtr progress) {
  _executor->post([progress = std::move(progress)] { progress->cancel(); });
}

void ProgressTable::Request::didReturn(ProgressPtr progress) {
  if (!progress) return;
  _table->_loop->post([self = shared_from_this(), progress = std::move(progress)] {
    if (self->_table->_ended) {
      if (!self->_replied) self->_table->cancelSoon(progress);
      return;
    }
    if (!self->_replied) {
      self->_progress = progress;
      self->_table->_underWay.insert(progress);
    }
    if (self->_observer) self->tell(progress);
  });
}

void ProgressTable::Request::didReply() {
  _table->_loop->post([self = shared_from_this()] {
    self->_replied = true;
    self->_table->_underWay.erase(std::exchange(self->_progress, nullptr));
  });
}

void ProgressTable::Request::tell(const ProgressPtr& progress) {
  progress->setCountHandler([self = shared_from_this()](std::int64_t count) {
    self->_table->_loop->post([self, count] { self->advance(count); });
  });
  _count = _told = progress->completedUnitCount();
  auto request = _observer->beganRequest();
  request.setProgress(kj::heap<ProgressObject>(_table->_executor, progress));
  request.setTotalUnitCount(progress->totalUnitCount());
  request.setCompletedUnitCount(_told);
  _table->_tasks.add(request.send().ignoreResult());
}

void ProgressTable::Request::advance(std::int64_t count) {
  _count = count;
  if (!_telling && !_table->_ended) sendCount();
}

void ProgressTable::Request::sendCount() {
  if (_count == _told) return;
  _telling = true;
  _told = _count;
  auto request = _observer->advancedRequest();
  request.setCompletedUnitCount(_told);
  _table->_tasks.add(request.send().ignoreResult().then([self = shared_from_this()] {
    self->_telling = false;
    self->sendCount();
  }));
}

// --- The client's end.

namespace {

void sendCancel(wire::Progress::Client& progress) {
  // Whether it arrives does not matter: without the connection the request ends as well.
  progress.cancelRequest().send().ignoreResult().detach([](kj::Exception&&) {});
}

// The service's progress, once it is known. The handler of the caller's progress holds it:
// while nobody can cancel any more, nothing keeps the service's progress.
class Cancellation final : public std::enable_shared_from_this<Cancellation> {
 public:
  // Whether it was cancelled; outlives the handler, which goes when it has run. On the
  // loop's thread.
  struct Wish {
    bool isCancelled = false;
  };

  explicit Cancellation(std::shared_ptr<RpcLoop> loop) : _loop(std::move(loop)) {}

  const std::shared_ptr<Wish>& wish() const { return _wish; }

  // Any thread.
  void cancel() {
    _loop->post([self = shared_from_this()] {
      self->_wish->isCancelled = true;
      if (self->_remote) sendCancel(*self->_remote);
    });
  }
  // On the loop's thread.
  void attach(wire::Progress::Client progress) {
    _remote = _loop->own(std::make_unique<wire::Progress::Client>(kj::mv(progress)));
  }

 private:
  const std::shared_ptr<RpcLoop> _loop;
  const std::shared_ptr<Wish> _wish = std::make_shared<Wish>();
  std::shared_ptr<wire::Progress::Client> _remote;  // on the loop's thread
};

class ObserverObject final : public wire::ProgressObserver::Server {
 public:
  ObserverObject(const std::shared_ptr<Executor>& executor, std::weak_ptr<NSProgress> progress,
                 std::weak_ptr<Cancellation> cancellation, std::shared_ptr<Cancellation::Wish> wish)
      : _queue("progress", executor),
        _progress(std::move(progress)),
        _cancellation(std::move(cancellation)),
        _wish(std::move(wish)) {}

  kj::Promise<void> began(BeganContext context) override {
    const auto params = context.getParams();
    auto remote = params.getProgress();
    if (_wish->isCancelled) {
      sendCancel(remote);
    } else if (const auto cancellation = _cancellation.lock()) {
      cancellation->attach(kj::mv(remote));
    }
    _queue.async([weak = _progress, total = params.getTotalUnitCount(),
                  completed = params.getCompletedUnitCount()] {
      const auto progress = weak.lock();
      if (!progress) return;
      progress->setTotalUnitCount(total);
      if (completed != 0) progress->setCompletedUnitCount(completed);
    });
    return kj::READY_NOW;
  }
  kj::Promise<void> advanced(AdvancedContext context) override {
    _queue.async([weak = _progress, count = context.getParams().getCompletedUnitCount()] {
      if (const auto progress = weak.lock()) progress->setCompletedUnitCount(count);
    });
    return kj::READY_NOW;
  }

 private:
  SerialQueue _queue;
  const std::weak_ptr<NSProgress> _progress;
  const std::weak_ptr<Cancellation> _cancellation;
  const std::shared_ptr<Cancellation::Wish> _wish;
};

}  // namespace

RemoteProgress makeRemoteProgress(std::shared_ptr<RpcLoop> loop,
                                  std::shared_ptr<Executor> executor) {
  auto progress = NSProgress::progressWithTotalUnitCount(0);
  const auto cancellation = std::make_shared<Cancellation>(std::move(loop));
  progress->setCancellationHandler([cancellation] { cancellation->cancel(); });
  return {progress,
          [executor = std::move(executor), weak = std::weak_ptr(progress),
           weakCancellation = std::weak_ptr(cancellation),
           wish = cancellation->wish()]() -> wire::ProgressObserver::Client {
            return kj::heap<ObserverObject>(executor, weak, weakCancellation, wish);
          }};
}

}  // namespace skein
