#include "linux/protocol/TransferObject.h"

#include <utility>

namespace skein {
namespace {

constexpr auto kBetweenSteps = 100 * kj::MILLISECONDS;

// What a transfer's reply holds: the way to its end. Counts among vald's unanswered calls.
struct Ending {
  Ending(DaemonServicePtr servedBy, kj::Own<kj::PromiseFulfiller<void>> own)
      : service(std::move(servedBy)), fulfiller(kj::mv(own)) {
    ++service->unanswered;
  }
  ~Ending() { --service->unanswered; }
  Ending(const Ending&) = delete;
  Ending& operator=(const Ending&) = delete;

  const DaemonServicePtr service;
  kj::Own<kj::PromiseFulfiller<void>> fulfiller;
};

}  // namespace

std::shared_ptr<RunningTransfer> RunningTransfer::begin(const DaemonServicePtr& service,
                                                        LocalFiles::URLReply& reply) {
  auto paf = kj::newPromiseAndFulfiller<void>();
  auto transfer = service->loop->own(std::make_unique<RunningTransfer>());
  transfer->_end = paf.promise.fork();
  auto ending = service->loop->own(std::make_unique<Ending>(service, kj::mv(paf.fulfiller)));
  reply = [transfer, ending = std::move(ending), loop = service->loop](NSURLPtr url,
                                                                       NSErrorPtr error) mutable {
    loop->post([transfer = std::move(transfer), ending = std::move(ending), url = std::move(url),
                error = std::move(error)]() mutable {
      transfer->hasEnded = true;
      transfer->url = std::move(url);
      transfer->error = std::move(error);
      ending->fulfiller->fulfill();
    });
  };
  return transfer;
}

TransferObject::TransferObject(DaemonServicePtr service, std::shared_ptr<RunningTransfer> transfer,
                               wire::TransferObserver::Client observer,
                               std::shared_ptr<std::size_t> living)
    : _service(std::move(service)),
      _transfer(std::move(transfer)),
      _living(std::move(living)),
      _observer(kj::mv(observer)),
      _telling(tellWhenMoved().exclusiveJoin(_transfer->whenEnded()).eagerlyEvaluate([](auto&&) {
        // The observer is gone, or the reply was dropped: nobody is told any more.
      })) {
  ++*_living;
}

TransferObject::~TransferObject() {
  --*_living;
  cancelSoon();
}

void TransferObject::cancelSoon() {
  if (_transfer->hasEnded) return;
  // What the cancellation runs is vald's, and may wait.
  _service->executor->post([progress = _transfer->progress] { progress->cancel(); });
}

kj::Promise<void> TransferObject::cancel(CancelContext) {
  cancelSoon();
  return kj::READY_NOW;
}

kj::Promise<void> TransferObject::result(ResultContext context) {
  // Otherwise this call would keep the transfer of a client that is gone.
  context.allowCancellation();
  return _transfer->whenEnded().then([context, transfer = _transfer]() mutable {
    auto results = context.getResults();
    if (transfer->url) results.setUrl(codec::bytes(transfer->url->path()));
    codec::setError(results, transfer->error);
    results.setCompletedBytes(transfer->progress->completedUnitCount());
    results.setTotalBytes(transfer->progress->totalUnitCount());
  });
}

kj::Promise<void> TransferObject::tellWhenMoved() {
  return _service->loop->io().timer.afterDelay(kBetweenSteps).then([this]() -> kj::Promise<void> {
    const std::int64_t completed = _transfer->progress->completedUnitCount();
    const std::int64_t total = _transfer->progress->totalUnitCount();
    if (completed == _toldCompleted && total == _toldTotal) return tellWhenMoved();
    _toldCompleted = completed;
    _toldTotal = total;
    auto request = _observer.progressRequest();
    request.setCompletedBytes(completed);
    request.setTotalBytes(total);
    return request.send().ignoreResult().then([this] { return tellWhenMoved(); });
  });
}

}  // namespace skein
