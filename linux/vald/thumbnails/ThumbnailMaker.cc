#include "linux/vald/thumbnails/ThumbnailMaker.h"

#include <deque>
#include <set>
#include <utility>
#include <vector>

#include "base/Mutex.h"
#include "linux/vald/thumbnails/RenderErrors.h"

namespace skein::vald {
namespace {

// Of the records without a thumbnail, at a time.
constexpr std::size_t kPage = 100;

}  // namespace

struct ThumbnailMaker::Core : std::enable_shared_from_this<Core> {
  // What is known of a document while its thumbnail is made.
  struct Work {
    VLFileObjectID document = VLFileObjectID::documentWithRawID(0);
    ContentHash contents;
    PictureKind kind = PictureKind::Jpeg;
    CloudContents::Hold hold;
    std::shared_ptr<ThumbnailRenderer::Ticket> ticket;
  };
  using WorkPtr = std::shared_ptr<Work>;

  Core(ThumbnailServices given, std::shared_ptr<Executor> runs, std::size_t most)
      : services(std::move(given)), executor(std::move(runs)), limit(most > 0 ? most : 1) {}

  void add(VLFileObjectID document) SKEIN_EXCLUDES(mutex) {
    {
      MutexLock lock(mutex);
      if (stopped || !known.insert(document).second) return;
      waiting.push_back(document);
    }
    startWhatMay();
  }

  // Posting under the lock: nothing runs.
  void startWhatMay() SKEIN_EXCLUDES(mutex) {
    MutexLock lock(mutex);
    while (!stopped && running < limit) {
      if (!waiting.empty()) {
        const VLFileObjectID document = waiting.front();
        waiting.pop_front();
        known.erase(document);
        ++running;
        executor->post([self = shared_from_this(), document] { self->begin(document); });
      } else if (looksForMissing && !looking) {
        looking = true;
        ++running;
        executor->post([self = shared_from_this()] { self->lookForMissing(); });
      } else {
        break;
      }
    }
    if (running == 0) idle.notifyAll();
  }

  void finishOne() SKEIN_EXCLUDES(mutex) {
    {
      MutexLock lock(mutex);
      --running;
    }
    startWhatMay();
  }

  // Answers from what is there already, or sees to it that the document is drawn.
  void begin(VLFileObjectID document) SKEIN_EXCLUDES(mutex) {
    auto work = prepare(document);
    if (!work) tellOfFailure(document, work.error());
    if (!work || *work == nullptr) {
      finishOne();
      return;
    }
    auto file = services.contents.read((*work)->contents);
    if (!file) {
      tellOfFailure(document, file.error());
      finishOne();
      return;
    }
    draw(*work, std::move(*file));
  }

  // Null when nothing has to be drawn.
  Outcome<WorkPtr> prepare(VLFileObjectID document) {
    const auto record = services.records.record(document);
    if (!record) return record.error();
    if (!*record || (*record)->thumbnail) return WorkPtr();
    const auto type = services.contentType(document);
    const auto kind = type ? pictureKindForContentType(*type) : std::nullopt;
    if (!kind) return WorkPtr();
    const ContentHash& contents = (*record)->contents.hash;
    if (const auto path = services.assets.find(contents, *kind)) {
      if (NSErrorPtr error = services.records.setThumbnail(document, contents, *path)) return error;
      return WorkPtr();
    }
    if (services.assets.isHopeless(contents, *kind)) return WorkPtr();
    auto hold = services.contents.hold((*record)->contents);
    if (!hold) return WorkPtr();  // another revision came, and its turn comes too
    return std::make_shared<Work>(Work{document, contents, *kind, std::move(*hold), nullptr});
  }

  void draw(const WorkPtr& work, FileDescriptor file) SKEIN_EXCLUDES(mutex) {
    {
      MutexLock lock(mutex);
      drawing.insert(work);
    }
    ThumbnailRenderer::Request request;
    request.kind = work->kind;
    request.document = std::move(file);
    request.completion = [self = shared_from_this(), work](Outcome<RenderedPicture> picture) {
      // What follows waits for the disk, and the next document should not.
      self->executor->post([self, work, picture = std::move(picture)] {
        self->keep(*work, picture);
        self->leave(work);
      });
    };
    auto ticket = services.renderer.render(std::move(request));
    bool late = false;
    {
      MutexLock lock(mutex);
      work->ticket = ticket;
      late = stopped;
    }
    if (late) ticket->cancel();
  }

  void keep(const Work& work, const Outcome<RenderedPicture>& picture) {
    NSErrorPtr error = picture.error();
    if (error == nullptr) {
      const auto path = services.assets.add(work.contents, work.kind, *picture);
      error =
          path ? services.records.setThumbnail(work.document, work.contents, *path) : path.error();
    } else if (isAboutDocument(error)) {
      error = services.assets.setHopeless(work.contents, work.kind);
    }
    if (error != nullptr) tellOfFailure(work.document, error);
  }

  void leave(const WorkPtr& work) SKEIN_EXCLUDES(mutex) {
    {
      MutexLock lock(mutex);
      drawing.erase(work);
    }
    finishOne();
  }

  // It has no thumbnail, then, until it is looked for at the next start.
  void tellOfFailure(VLFileObjectID document, const NSErrorPtr& error) {
    if (error->code() == NSUserCancelledError && error->domain() == NSCocoaErrorDomain) return;
    VL_ERROR(services.log, "[ERROR] no thumbnail was made for %@: %@", document.asString(),
             error->localizedDescription());
  }

  void lookForMissing() SKEIN_EXCLUDES(mutex) {
    std::optional<VLFileObjectID> last;
    {
      MutexLock lock(mutex);
      last = lastLookedAt;
    }
    const auto page = services.records.documentsWithoutThumbnail(last, kPage);
    if (!page) tellOfFailure(last.value_or(VLFileObjectID::documentWithRawID(0)), page.error());
    {
      MutexLock lock(mutex);
      looking = false;
      looksForMissing = page && page->size() == kPage;
      if (page && !page->empty()) {
        lastLookedAt = page->back();
        for (const VLFileObjectID document : *page) {
          if (known.insert(document).second) waiting.push_back(document);
        }
      }
    }
    finishOne();
  }

  void stop() SKEIN_EXCLUDES(mutex) {
    std::vector<std::shared_ptr<ThumbnailRenderer::Ticket>> tickets;
    {
      MutexLock lock(mutex);
      stopped = true;
      for (const WorkPtr& work : drawing) {
        if (work->ticket != nullptr) tickets.push_back(work->ticket);
      }
    }
    for (const auto& ticket : tickets) ticket->cancel();
    MutexLock lock(mutex);
    while (running > 0) idle.wait(mutex);
  }

  const ThumbnailServices services;
  const std::shared_ptr<Executor> executor;
  const std::size_t limit;
  Mutex mutex;
  CondVar idle;
  std::deque<VLFileObjectID> waiting SKEIN_GUARDED_BY(mutex);
  std::set<VLFileObjectID> known SKEIN_GUARDED_BY(mutex);  // those that wait
  std::set<WorkPtr> drawing SKEIN_GUARDED_BY(mutex);       // and their tickets
  std::size_t running SKEIN_GUARDED_BY(mutex) = 0;
  bool looksForMissing SKEIN_GUARDED_BY(mutex) = false;
  bool looking SKEIN_GUARDED_BY(mutex) = false;
  std::optional<VLFileObjectID> lastLookedAt SKEIN_GUARDED_BY(mutex);
  bool stopped SKEIN_GUARDED_BY(mutex) = false;
};

ThumbnailMaker::ThumbnailMaker(ThumbnailServices services, std::shared_ptr<Executor> executor,
                               std::size_t limit)
    : _core(std::make_shared<Core>(std::move(services), std::move(executor), limit)) {}

ThumbnailMaker::~ThumbnailMaker() { _core->stop(); }

void ThumbnailMaker::documentWasUploaded(VLFileObjectID document) { _core->add(document); }

void ThumbnailMaker::makeMissing() {
  {
    MutexLock lock(_core->mutex);
    _core->looksForMissing = true;
    _core->lastLookedAt = std::nullopt;
  }
  _core->startWhatMay();
}

bool ThumbnailMaker::waitUntilIdle(std::chrono::steady_clock::time_point deadline) {
  MutexLock lock(_core->mutex);
  while (_core->running > 0 || !_core->waiting.empty()) {
    if (!_core->idle.waitUntil(_core->mutex, deadline)) return false;
  }
  return true;
}

}  // namespace skein::vald
