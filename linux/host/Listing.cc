#include "linux/host/Listing.h"

#include <utility>

#include "vellum/VLErrors.h"

namespace skein {
namespace {

// Enough to have the next page on its way while one is being printed.
constexpr std::size_t kPagesAhead = 3;

}  // namespace

NSErrorPtr lostAnswerError(std::chrono::milliseconds deadline) {
  return vl_errorDaemonUnreachable("vald did not answer within " +
                                   std::to_string(deadline.count()) +
                                   " ms; it is stopped or too busy.");
}

// Hears one page. It may be called with the enumerator's lock held, so it only queues.
class Listing::PageObserver final : public NSFileProviderEnumerationObserver {
 public:
  PageObserver(std::shared_ptr<Listing> listing, std::uint64_t request)
      : _listing(std::move(listing)), _request(request) {}

  void didEnumerateItems(const NSFileProviderItems& items) override {
    _items.insert(_items.end(), items.begin(), items.end());
  }
  void finishEnumeratingUpToPage(std::optional<NSFileProviderPage> nextPage) override {
    const bool last = !nextPage;
    finish({std::move(_items), last, nullptr}, std::move(nextPage));
  }
  void finishEnumeratingWithError(NSErrorPtr error) override {
    finish({{}, true, std::move(error)}, std::nullopt);
  }

 private:
  void finish(Answer answer, std::optional<NSFileProviderPage> nextPage) {
    // A second answer is the extension's fault; the listing has gone on from the first.
    auto listing = std::move(_listing);
    if (!listing) return;
    Executor& executor = *listing->_tools.executor;
    executor.post([listing = std::move(listing), request = _request, answer = std::move(answer),
                   nextPage = std::move(nextPage)]() mutable {
      listing->pageDidArrive(request, std::move(answer), std::move(nextPage));
    });
  }

  std::shared_ptr<Listing> _listing;
  const std::uint64_t _request;
  NSFileProviderItems _items;
};

Listing::Listing(std::shared_ptr<NSFileProviderEnumerator> enumerator, NSFileProviderPage firstPage,
                 bool invalidatesAtEnd, HostTools tools)
    : _enumerator(std::move(enumerator)),
      _invalidatesAtEnd(invalidatesAtEnd),
      _tools(std::move(tools)),
      _nextPage(std::move(firstPage)) {}

// The last reference may go where the enumerator's lock is held.
Listing::~Listing() {
  _tools.timers->cancel(_timer);
  if (_ended || !_invalidatesAtEnd) return;
  _tools.executor->post([enumerator = _enumerator] { enumerator->invalidate(); });
}

void Listing::next(PageReply reply) {
  {
    MutexLock lock(_mutex);
    _waiting.push_back(std::move(reply));
  }
  handOut();
  askIfRoom();
}

void Listing::cancel() {
  {
    MutexLock lock(_mutex);
    if (!_error) {
      _error = NSError::errorWithDomain(NSCocoaErrorDomain, NSUserCancelledError);
    }
    _ready.clear();
    if (_ended) return;
    _ended = true;
    ++_request;
    _asking = false;
    _tools.timers->cancel(_timer);
  }
  if (_invalidatesAtEnd) _enumerator->invalidate();
  handOut();
}

void Listing::askIfRoom() {
  std::uint64_t request = 0;
  NSFileProviderPage page;
  {
    MutexLock lock(_mutex);
    if (_asking || _ended || _ready.size() >= kPagesAhead) return;
    _asking = true;
    request = ++_request;
    page = _nextPage;
    _timer = _tools.timers->after(_tools.pageDeadline, [weak = weak_from_this(), request] {
      if (const auto self = weak.lock()) self->deadlineDidPass(request);
    });
  }
  _enumerator->enumerateItemsForObserver(
      std::make_shared<PageObserver>(shared_from_this(), request), std::move(page));
}

void Listing::pageDidArrive(std::uint64_t request, Answer answer,
                            std::optional<NSFileProviderPage> nextPage) {
  const bool last = answer.last;
  {
    MutexLock lock(_mutex);
    if (request != _request || !_asking) return;
    _asking = false;
    _tools.timers->cancel(_timer);
    if (nextPage) _nextPage = std::move(*nextPage);
    if (answer.error) _error = answer.error;
    _ended = last;
    _ready.push_back(std::move(answer));
  }
  if (last && _invalidatesAtEnd) _enumerator->invalidate();
  askIfRoom();
  handOut();
}

void Listing::deadlineDidPass(std::uint64_t request) {
  pageDidArrive(request, {{}, true, lostAnswerError(_tools.pageDeadline)}, std::nullopt);
}

// One thread at a time, so that pages go out in order.
void Listing::handOut() {
  {
    MutexLock lock(_mutex);
    if (_handingOut || _waiting.empty() || (_ready.empty() && !_ended)) return;
    _handingOut = true;
  }
  _tools.executor->post([self = shared_from_this()] {
    for (;;) {
      PageReply reply;
      Answer answer;
      {
        MutexLock inner(self->_mutex);
        if (self->_waiting.empty() || (self->_ready.empty() && !self->_ended)) {
          self->_handingOut = false;
          return;
        }
        reply = std::move(self->_waiting.front());
        self->_waiting.pop_front();
        if (self->_ready.empty()) {
          answer = {{}, true, self->_error};
        } else {
          answer = std::move(self->_ready.front());
          self->_ready.pop_front();
        }
      }
      self->askIfRoom();
      reply(std::move(answer.items), answer.last, std::move(answer.error));
    }
  });
}

}  // namespace skein
