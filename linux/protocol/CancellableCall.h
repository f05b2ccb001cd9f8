// A message whose caller may give it up. Include this in few files: it costs seconds to
// compile.
#pragma once

#include <kj/async.h>

#include <memory>
#include <utility>

#include "linux/protocol/RpcLoop.h"
#include "platform/foundation/NSProgress.h"

namespace skein {

// Joins a progress, which the caller has, to a message that is under way: cancelling it ends
// the message, and letting go of the message ends what the peer does for it. The message
// holds this; once it is answered or has failed, cancelling does nothing.
class CancellableCall {
 public:
  // Any thread. The progress has one unit.
  static std::shared_ptr<CancellableCall> make(const std::shared_ptr<RpcLoop>& loop,
                                               std::shared_ptr<NSProgress>& progress) {
    std::shared_ptr<CancellableCall> call = loop->own(std::make_unique<CancellableCall>());
    progress = NSProgress::progressWithTotalUnitCount(1);
    // Weakly: the caller may keep the progress for ever.
    progress->setCancellationHandler([loop, weak = std::weak_ptr(call)] {
      loop->post([weak] {
        if (const auto self = weak.lock()) self->cancel();
      });
    });
    return call;
  }

  // `answered`, or `givenUp` when the call is cancelled first. On the loop's thread.
  template <class Value>
  kj::Promise<Value> unlessCancelled(kj::Promise<Value> answered, Value givenUp) {
    if (_cancelled) return kj::mv(givenUp);
    auto paf = kj::newPromiseAndFulfiller<void>();
    _fulfiller = kj::mv(paf.fulfiller);
    return answered.exclusiveJoin(
        paf.promise.then([givenUp = kj::mv(givenUp)]() mutable { return kj::mv(givenUp); }));
  }
  bool isCancelled() const { return _cancelled; }

 private:
  void cancel() {
    _cancelled = true;
    if (_fulfiller.get() != nullptr) _fulfiller->fulfill();
  }

  // On the loop's thread.
  bool _cancelled = false;
  kj::Own<kj::PromiseFulfiller<void>> _fulfiller;
};

}  // namespace skein
