#pragma once

#include <chrono>
#include <cstdint>
#include <deque>
#include <memory>
#include <optional>

#include "base/Executor.h"
#include "base/Mutex.h"
#include "linux/host/Timers.h"
#include "linux/protocol/Deadlines.h"
#include "platform/fileprovider/NSFileProviderEnumerating.h"

namespace skein {

// What the host's parts run on.
struct HostTools {
  std::shared_ptr<Executor> executor;
  std::shared_ptr<Timers> timers;
  // How long an extension may keep an answer back before it counts as lost; and a page.
  std::chrono::milliseconds deadline{deadlines::kRequest};
  std::chrono::milliseconds pageDeadline{deadlines::kPage};
};

// The error of a request whose answer did not come by the deadline.
NSErrorPtr lostAnswerError(std::chrono::milliseconds deadline);

// One listing, from its first page to its last, taken out page by page. It asks for at
// most a few pages ahead of the consumer, so that its memory does not grow with the
// folder. Any thread.
class Listing final : public std::enable_shared_from_this<Listing> {
 public:
  // The items of one page; whether it was the last; or an error, which ends the listing.
  using PageReply = Reply<NSFileProviderItems, bool, NSErrorPtr>;

  // `invalidatesAtEnd`: the enumerator is the listing's own and ends with it.
  Listing(std::shared_ptr<NSFileProviderEnumerator> enumerator, NSFileProviderPage firstPage,
          bool invalidatesAtEnd, HostTools tools);

  // Asks for the first page, ahead of the consumer.
  void start() { askIfRoom(); }

  // A listing that goes away, finished or not, has invalidated its own enumerator.
  ~Listing();

  // Hands the next page out, on the executor, when it is there. Several may be asked for at
  // once; they are answered in order. After the last page: an empty last one, or the error.
  void next(PageReply reply) SKEIN_EXCLUDES(_mutex);

  // Nobody wants the rest: pages still asked for are answered with an error.
  void cancel() SKEIN_EXCLUDES(_mutex);

 private:
  class PageObserver;
  struct Answer {
    NSFileProviderItems items;
    bool last = false;
    NSErrorPtr error;
  };

  void askIfRoom() SKEIN_EXCLUDES(_mutex);
  void pageDidArrive(std::uint64_t request, Answer answer,
                     std::optional<NSFileProviderPage> nextPage) SKEIN_EXCLUDES(_mutex);
  void deadlineDidPass(std::uint64_t request) SKEIN_EXCLUDES(_mutex);
  void handOut() SKEIN_EXCLUDES(_mutex);

  const std::shared_ptr<NSFileProviderEnumerator> _enumerator;
  const bool _invalidatesAtEnd;
  const HostTools _tools;

  Mutex _mutex;
  NSFileProviderPage _nextPage SKEIN_GUARDED_BY(_mutex);
  std::uint64_t _request SKEIN_GUARDED_BY(_mutex) = 0;  // late answers carry an older number
  bool _asking SKEIN_GUARDED_BY(_mutex) = false;
  bool _ended SKEIN_GUARDED_BY(_mutex) = false;
  Timers::Key _timer SKEIN_GUARDED_BY(_mutex) = 0;
  std::deque<Answer> _ready SKEIN_GUARDED_BY(_mutex);
  std::deque<PageReply> _waiting SKEIN_GUARDED_BY(_mutex);
  NSErrorPtr _error SKEIN_GUARDED_BY(_mutex);  // what every later question is answered
  bool _handingOut SKEIN_GUARDED_BY(_mutex) = false;
};

}  // namespace skein
