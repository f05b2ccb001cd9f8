#include "linux/host/TrashPages.h"

#include <cstdint>
#include <deque>
#include <utility>

#include "base/SerialQueue.h"

namespace skein {
namespace {

constexpr std::uint64_t kPageSize = 200;

}  // namespace

// One page at a time; later questions wait for their turn.
class TrashPages::Work final : public std::enable_shared_from_this<Work> {
 public:
  using PageReply = Reply<std::vector<HostTrashedItem>, bool, NSErrorPtr>;

  explicit Work(std::shared_ptr<DriveRequests> drive)
      : _drive(std::move(drive)), _queue("trash-pages", _drive->tools().executor) {}

  void next(PageReply reply) {
    _queue.async([self = shared_from_this(), reply = std::move(reply)]() mutable {
      self->_queue.assumeCurrent();
      self->_waiting.push_back(std::move(reply));
      if (self->_waiting.size() == 1) self->ask();
    });
  }

 private:
  void ask() SKEIN_REQUIRES(_queue) {
    if (_ended) {
      answer({}, true, nullptr);
      return;
    }
    auto timed = TimedReply<std::vector<TrashedItem>, std::uint64_t>::begin(
        _drive->tools(), [self = shared_from_this()](std::vector<TrashedItem> items,
                                                     std::uint64_t offset, NSErrorPtr error) {
          self->_queue.async([self, items = std::move(items), offset, error = std::move(error)] {
            self->_queue.assumeCurrent();
            self->pageDidArrive(items, offset, error);
          });
        });
    _drive->daemon()(failing(timed))
        ->files()
        .trashedItems(
            _offset, kPageSize,
            [timed](std::vector<TrashedItem> items, std::uint64_t offset, NSErrorPtr error) {
              (*timed)(std::move(items), offset, std::move(error));
            });
  }

  void pageDidArrive(const std::vector<TrashedItem>& items, std::uint64_t offset,
                     const NSErrorPtr& error) SKEIN_REQUIRES(_queue) {
    std::vector<HostTrashedItem> placed;
    for (const TrashedItem& item : items) {
      HostTrashedItem answer;
      answer.item.item = item.item;
      if (item.url) answer.item.url = item.url->absoluteString();
      answer.item.path = _drive->paths().pathForURL(item.url).value_or("");
      answer.putBackPath = _drive->paths().pathForURL(item.putBackURL).value_or("");
      answer.trashed = item.trashed;
      placed.push_back(std::move(answer));
    }
    _offset = offset;
    _ended = offset == 0;
    answer(std::move(placed), _ended, error);
  }

  void answer(std::vector<HostTrashedItem> items, bool last, NSErrorPtr error)
      SKEIN_REQUIRES(_queue) {
    auto reply = std::move(_waiting.front());
    _waiting.pop_front();
    reply(std::move(items), last, std::move(error));
    if (!_waiting.empty()) ask();
  }

  const std::shared_ptr<DriveRequests> _drive;
  SerialQueue _queue;
  std::deque<PageReply> _waiting SKEIN_GUARDED_BY(_queue);
  std::uint64_t _offset SKEIN_GUARDED_BY(_queue) = 0;
  bool _ended SKEIN_GUARDED_BY(_queue) = false;
};

TrashPages::TrashPages(std::shared_ptr<DriveRequests> drive)
    : _work(std::make_shared<Work>(std::move(drive))) {}

void TrashPages::next(Reply<std::vector<HostTrashedItem>, bool, NSErrorPtr> reply) {
  _work->next(std::move(reply));
}

}  // namespace skein
