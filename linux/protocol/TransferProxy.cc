#include "linux/protocol/TransferProxy.h"

namespace skein {
namespace {

class ObserverObject final : public wire::TransferObserver::Server {
 public:
  explicit ObserverObject(std::shared_ptr<NSProgress> progress) : _progress(std::move(progress)) {}

  kj::Promise<void> progress(ProgressContext context) override {
    const auto params = context.getParams();
    _progress->setTotalUnitCount(params.getTotalBytes());
    _progress->setCompletedUnitCount(params.getCompletedBytes());
    return kj::READY_NOW;
  }

 private:
  const std::shared_ptr<NSProgress> _progress;
};

}  // namespace

std::shared_ptr<NSProgress> TransferProxy::makeProgress() {
  _progress = NSProgress::progressWithTotalUnitCount(0);
  // Weakly: the caller may keep the progress for ever.
  _progress->setCancellationHandler([loop = _loop, weak = weak_from_this()] {
    loop->post([weak] {
      if (const auto self = weak.lock()) self->cancel();
    });
  });
  return _progress;
}

wire::TransferObserver::Client TransferProxy::observer() {
  return kj::heap<ObserverObject>(_progress);
}

void TransferProxy::attach(wire::Transfer::Client transfer) {
  _transfer = kj::mv(transfer);
  // What was cancelled before it was sent is begun all the same: vald answers for it.
  if (_progress->isCancelled()) cancel();
}

kj::Promise<TransferOutcome> TransferProxy::awaitResult() {
  KJ_IF_MAYBE (transfer, _transfer) {
    return transfer->resultRequest().send().then([progress = _progress](auto&& result) {
      progress->setTotalUnitCount(result.getTotalBytes());
      progress->setCompletedUnitCount(result.getCompletedBytes());
      TransferOutcome outcome;
      if (result.hasUrl()) outcome.url = NSURL::fileURLWithPath(codec::text(result.getUrl()));
      outcome.error = codec::errorOf(result);
      return outcome;
    });
  }
  KJ_FAIL_REQUIRE("there is no transfer");
}

void TransferProxy::cancel() {
  KJ_IF_MAYBE (transfer, _transfer) {
    // Where this does not arrive, the transfer has ended or ends with its connection.
    transfer->cancelRequest().send().detach([](kj::Exception&&) {});
  }
}

}  // namespace skein
