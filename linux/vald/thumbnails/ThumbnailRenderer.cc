#include "linux/vald/thumbnails/ThumbnailRenderer.h"

#include <algorithm>
#include <deque>
#include <utility>
#include <vector>

#include "base/Mutex.h"
#include "linux/vald/cloud/CloudErrors.h"
#include "linux/vald/thumbnails/RenderErrors.h"

namespace skein::vald {

struct ThumbnailRenderer::Core : std::enable_shared_from_this<Core> {
  using WorkerPtr = std::shared_ptr<RenderWorker>;
  struct Pending {
    Request request;
    Cancellation cancellation;
  };
  using PendingPtr = std::shared_ptr<Pending>;
  struct Idle {
    WorkerPtr worker;
    CloudClock::Duration since{};
  };

  Core(Options chosen, CloudClock& when, Log& where)
      : options(std::move(chosen)), clock(when), log(where) {}

  // Draws the oldest of what waits, if anything does still.
  void runNext() SKEIN_EXCLUDES(mutex) {
    PendingPtr pending;
    {
      MutexLock lock(mutex);
      if (waiting.empty()) return;
      pending = std::move(waiting.front());
      waiting.pop_front();
      running.push_back(pending);
    }
    Outcome<RenderedPicture> picture = draw(*pending);
    {
      MutexLock lock(mutex);
      std::erase(running, pending);
    }
    pending->request.document.reset();
    pending->request.completion(std::move(picture));
  }

  Outcome<RenderedPicture> draw(Pending& pending) SKEIN_EXCLUDES(mutex) {
    if (pending.cancellation.isCancelled()) return cancelledError();
    auto worker = takeWorker();
    if (!worker) return worker.error();
    const Request& request = pending.request;
    auto picture = (*worker)->render(
        {request.kind, request.format, request.side, request.document.get()}, pending.cancellation);
    if (!picture && isAboutDocument(picture.error())) {
      VL_INFO(log, "[INFO] a document has no thumbnail: %@",
              picture.error()->localizedDescription());
    }
    putBack(std::move(*worker));
    return picture;
  }

  Outcome<WorkerPtr> takeWorker() SKEIN_EXCLUDES(mutex) {
    WorkerPtr unusable;  // goes without the lock
    for (;;) {
      {
        MutexLock lock(mutex);
        if (idle.empty()) break;
        unusable = std::move(idle.back().worker);
        idle.pop_back();
      }
      if (unusable->isUsable()) return unusable;
      forget(unusable);
    }
    auto worker = RenderWorker::start(options.worker);
    if (!worker) {
      VL_ERROR(log, "[ERROR] %@", worker.error()->localizedDescription());
      MutexLock lock(mutex);
      startProblem = worker.error()->localizedDescription();
      return worker;
    }
    MutexLock lock(mutex);
    startProblem.clear();
    ++alive;
    const Greeting& greeting = (*worker)->greeting();
    const bool tells = !toldOfGaps && greeting.hasFonts == 0;
    if (tells) toldOfGaps = true;
    lock.unlock();
    if (tells) {
      VL_NOTICE(log,
                "[NOTICE] documents are drawn without fonts: the kernel cannot confine files "
                "(Landlock), or there are no fonts");
    }
    return worker;
  }

  void forget(WorkerPtr& worker) SKEIN_EXCLUDES(mutex) {
    worker = nullptr;
    MutexLock lock(mutex);
    --alive;
  }

  void putBack(WorkerPtr worker) SKEIN_EXCLUDES(mutex) {
    const bool usable = worker->isUsable();
    {
      MutexLock lock(mutex);
      if (usable && !stopped) {
        idle.push_back({std::move(worker), clock.now()});
        armTimer();
        return;
      }
    }
    forget(worker);
  }

  // Setting a timer under the lock runs nothing.
  void armTimer() SKEIN_REQUIRES(mutex) {
    if (armed || idle.empty()) return;
    armed = true;
    const auto due = idle.front().since + options.idle;
    clock.callAfter(std::max(due - clock.now(), CloudClock::Duration(0)),
                    [weak = weak_from_this()] {
                      if (const auto core = weak.lock()) core->endIdle();
                    });
  }

  // The last one used is taken first, so the ones in front were idle the longest.
  void endIdle() SKEIN_EXCLUDES(mutex) {
    std::vector<Idle> ended;
    {
      MutexLock lock(mutex);
      armed = false;
      const auto now = clock.now();
      const auto awake = std::find_if(idle.begin(), idle.end(), [&](const Idle& one) {
        return now - one.since < options.idle;
      });
      std::move(idle.begin(), awake, std::back_inserter(ended));
      idle.erase(idle.begin(), awake);
      armTimer();
    }
    for (Idle& one : ended) forget(one.worker);
  }

  void cancel(const PendingPtr& pending) SKEIN_EXCLUDES(mutex) {
    bool waited = false;
    {
      MutexLock lock(mutex);
      waited = std::erase(waiting, pending) != 0;
    }
    if (waited) {
      pending->request.completion(cancelledError());
    } else {
      pending->cancellation.cancel();
    }
  }

  void stop() SKEIN_EXCLUDES(mutex) {
    std::deque<PendingPtr> dropped;
    std::vector<PendingPtr> begun;
    std::vector<Idle> ended;
    {
      MutexLock lock(mutex);
      stopped = true;
      ended.swap(idle);
      dropped.swap(waiting);
      begun = running;
    }
    for (const PendingPtr& pending : begun) pending->cancellation.cancel();
    for (const PendingPtr& pending : dropped) pending->request.completion(cancelledError());
    for (Idle& one : ended) forget(one.worker);
  }

  const Options options;
  CloudClock& clock;
  Log& log;
  Mutex mutex;
  std::deque<PendingPtr> waiting SKEIN_GUARDED_BY(mutex);
  std::vector<PendingPtr> running SKEIN_GUARDED_BY(mutex);
  std::vector<Idle> idle SKEIN_GUARDED_BY(mutex);
  std::size_t alive SKEIN_GUARDED_BY(mutex) = 0;
  bool stopped SKEIN_GUARDED_BY(mutex) = false;
  bool armed SKEIN_GUARDED_BY(mutex) = false;
  bool toldOfGaps SKEIN_GUARDED_BY(mutex) = false;
  std::string startProblem SKEIN_GUARDED_BY(mutex);
};

class ThumbnailRenderer::RequestTicket final : public Ticket {
 public:
  RequestTicket(std::shared_ptr<Core> core, Core::PendingPtr pending)
      : _core(std::move(core)), _pending(std::move(pending)) {}

  void cancel() override { _core->cancel(_pending); }

 private:
  const std::shared_ptr<Core> _core;
  const Core::PendingPtr _pending;
};

ThumbnailRenderer::ThumbnailRenderer(Options options, std::shared_ptr<Executor> executor,
                                     CloudClock& clock, Log& log)
    : _core(std::make_shared<Core>(options, clock, log)),
      _runner(std::move(executor), options.limit) {}

ThumbnailRenderer::~ThumbnailRenderer() { _core->stop(); }

std::shared_ptr<ThumbnailRenderer::Ticket> ThumbnailRenderer::render(Request request) {
  const auto pending = std::make_shared<Core::Pending>();
  pending->request = std::move(request);
  {
    MutexLock lock(_core->mutex);
    _core->waiting.push_back(pending);
  }
  _runner.post([core = _core] { core->runNext(); });
  return std::make_shared<RequestTicket>(_core, pending);
}

std::string ThumbnailRenderer::startProblem() const {
  MutexLock lock(_core->mutex);
  return _core->startProblem;
}

std::size_t ThumbnailRenderer::workers() const {
  MutexLock lock(_core->mutex);
  return _core->alive;
}

}  // namespace skein::vald
