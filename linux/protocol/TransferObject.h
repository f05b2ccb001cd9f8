// vald's end of one transfer. Include this in few files: it costs seconds to compile.
#pragma once

#include <kj/async.h>

#include <cstddef>
#include <cstdint>
#include <memory>

#include "linux/protocol/DaemonService.h"
#include "linux/protocol/FilesCodec.h"

namespace skein {

// A transfer under way: what its reply, from any thread, has in common with the object that
// the client holds. On the loop's thread.
class RunningTransfer {
 public:
  // `_service` and the answer stand until the reply was called or dropped.
  static std::shared_ptr<RunningTransfer> begin(const DaemonServicePtr& service,
                                                LocalFiles::URLReply& reply);
  RunningTransfer() : _end(nullptr) {}

  std::shared_ptr<NSProgress> progress;
  bool hasEnded = false;
  NSURLPtr url;
  NSErrorPtr error;

  // Fails when vald drops the reply.
  kj::Promise<void> whenEnded() { return _end.addBranch(); }

 private:
  kj::ForkedPromise<void> _end;
};

// The client's reference to it; with the last one the transfer is cancelled. Tells the
// observer how far it is, a few times a second and never faster than the observer answers.
class TransferObject : public wire::Transfer::Server {
 public:
  // `living`: counts the connection's transfers.
  TransferObject(DaemonServicePtr service, std::shared_ptr<RunningTransfer> transfer,
                 wire::TransferObserver::Client observer, std::shared_ptr<std::size_t> living);
  ~TransferObject();

  kj::Promise<void> result(ResultContext context) override;
  kj::Promise<void> cancel(CancelContext context) override;

 private:
  void cancelSoon();
  kj::Promise<void> tellWhenMoved();

  const DaemonServicePtr _service;
  const std::shared_ptr<RunningTransfer> _transfer;
  const std::shared_ptr<std::size_t> _living;
  wire::TransferObserver::Client _observer;
  std::int64_t _toldCompleted = 0;
  std::int64_t _toldTotal = 0;
  kj::Promise<void> _telling;  // goes first: it names the others
};

}  // namespace skein
