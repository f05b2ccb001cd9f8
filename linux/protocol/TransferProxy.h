// The client's end of one transfer. Include this in few files: it costs seconds to compile.
#pragma once

#include <kj/async.h>

#include <memory>
#include <utility>

#include "linux/protocol/FilesCodec.h"
#include "linux/protocol/RpcLoop.h"

namespace skein {

struct TransferOutcome {
  NSURLPtr url;
  NSErrorPtr error;
};

// Joins a progress, which the caller has, to a transfer of vald's: its counts come from
// there, and cancelling it goes there. Its message holds it; once that is answered or has
// failed, cancelling does nothing.
class TransferProxy final : public std::enable_shared_from_this<TransferProxy> {
 public:
  explicit TransferProxy(std::shared_ptr<RpcLoop> loop) : _loop(std::move(loop)) {}

  // Any thread, once.
  std::shared_ptr<NSProgress> makeProgress();

  // --- On the loop's thread.

  wire::TransferObserver::Client observer();

  // The end of the transfer that `started`, the promise of its first answer, has begun.
  // Nothing waits for that answer: what follows is sent along with the question.
  template <class Started>
  kj::Promise<TransferOutcome> outcomeOf(Started started) {
    attach(started.getTransfer());
    auto ended = awaitResult();
    return started
        .then([ended = kj::mv(ended)](auto&& answer) mutable -> kj::Promise<TransferOutcome> {
          if (answer.hasError()) return TransferOutcome{nullptr, codec::errorOf(answer)};
          return kj::mv(ended);
        })
        .attach(kj::defer([self = shared_from_this()] { self->_transfer = nullptr; }));
  }

 private:
  void attach(wire::Transfer::Client transfer);
  kj::Promise<TransferOutcome> awaitResult();
  void cancel();

  const std::shared_ptr<RpcLoop> _loop;
  std::shared_ptr<NSProgress> _progress;
  kj::Maybe<wire::Transfer::Client> _transfer;  // on the loop's thread
};

}  // namespace skein
