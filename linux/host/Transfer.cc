#include "linux/host/Transfer.h"

#include <chrono>
#include <utility>

namespace skein {
namespace {

constexpr std::chrono::milliseconds kBetweenPolls{100};

class TransferStream final : public HostTransfer {
 public:
  TransferStream(std::shared_ptr<Transfer> transfer, Task letGo)
      : _transfer(std::move(transfer)), _letGo(std::move(letGo)) {}
  ~TransferStream() override { _letGo(); }
  void next(Reply<HostTransferStep, NSErrorPtr> reply) override {
    _transfer->next(std::move(reply));
  }
  void cancel() override { _letGo(); }

 private:
  const std::shared_ptr<Transfer> _transfer;
  Task _letGo;
};

}  // namespace

Transfer::Transfer(const HostTools& tools)
    : _timers(tools.timers), _queue("transfer", tools.executor) {}

void Transfer::follow(std::shared_ptr<RequestProgress> progress) {
  _queue.async([self = shared_from_this(), progress = std::move(progress)]() mutable {
    self->_queue.assumeCurrent();
    self->_progress = std::move(progress);
  });
}

void Transfer::next(Reply<HostTransferStep, NSErrorPtr> reply) {
  _queue.async([self = shared_from_this(), reply = std::move(reply)]() mutable {
    self->_queue.assumeCurrent();
    self->_waiting.push_back(std::move(reply));
    if (self->_told.finished) {
      self->answer(self->_told, self->_error);
    } else {
      self->lookLater();
    }
  });
}

void Transfer::finish(HostItem item, NSErrorPtr error) {
  _queue.async(
      [self = shared_from_this(), item = std::move(item), error = std::move(error)]() mutable {
        self->_queue.assumeCurrent();
        if (self->_told.finished) return;
        self->_told = self->measured();
        self->_told.finished = true;
        self->_told.item = std::move(item);
        self->_error = std::move(error);
        while (!self->_waiting.empty()) self->answer(self->_told, self->_error);
      });
}

HostTransferStep Transfer::measured() const {
  HostTransferStep step;
  if (!_progress) return step;
  step.completedBytes = _progress->completed();
  step.totalBytes = _progress->total();
  return step;
}

void Transfer::lookLater() {
  if (std::exchange(_timed, true)) return;
  _timers->after(kBetweenPolls, [self = shared_from_this()] {
    self->_queue.async([self] {
      self->_queue.assumeCurrent();
      self->_timed = false;
      self->look();
    });
  });
}

void Transfer::look() {
  if (_waiting.empty()) return;
  HostTransferStep step = measured();
  if (step.completedBytes != _told.completedBytes || step.totalBytes != _told.totalBytes) {
    _told = step;
    answer(std::move(step), nullptr);
  }
  if (!_waiting.empty()) lookLater();
}

void Transfer::answer(HostTransferStep step, NSErrorPtr error) {
  auto reply = std::move(_waiting.front());
  _waiting.pop_front();
  reply(std::move(step), std::move(error));
}

std::shared_ptr<HostTransfer> streamOf(std::shared_ptr<Transfer> transfer, Task letGo) {
  return std::make_shared<TransferStream>(std::move(transfer), std::move(letGo));
}

}  // namespace skein
