// Contents that come and go.
#include <cerrno>
#include <utility>

#include "linux/vald/Files.h"
#include "linux/vald/cloud/CloudErrors.h"
#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"

namespace skein::vald {

std::shared_ptr<NSProgress> Files::download(NSURLPtr url, bool, Reply<NSErrorPtr> reply) {
  // The newest revision is always one that was uploaded from here, so what is present is
  // it, and a marker stands for it.
  auto progress = NSProgress::progressWithTotalUnitCount(0);
  answer("url", url, std::move(reply), [=, this](Reply<NSErrorPtr>& answered) {
    startDownload(url, progress, std::move(answered));
  });
  return progress;
}

void Files::startDownload(const NSURLPtr& url, const std::shared_ptr<NSProgress>& progress,
                          Reply<NSErrorPtr> reply) {
  const Subject subject = subjectAt(url);
  if (subject.error) return reply(subject.error);
  const DocumentPlace& place = subject.place;
  if (!place.isEvicted()) {
    StorePlace there;
    NSErrorPtr error = _parts.operations.roots().locate(place.path, there);
    if (!error && !there.isRoot() && !there.folder.exists(there.name)) {
      error = fileError(ENOENT, "can't download", place.path);
    }
    reply(error);
    return;
  }
  progress->setTotalUnitCount(static_cast<std::int64_t>(place.marker->contents.size));
  Downloader::Request request;
  request.document = place.marker->document;
  request.path = place.path;
  request.isCopy = subject.item && subject.item->fileObjectID() != request.document;
  request.progress = [weak = std::weak_ptr<NSProgress>(progress)](std::uint64_t bytes,
                                                                  std::uint64_t) {
    const auto told = weak.lock();
    if (told) told->setCompletedUnitCount(static_cast<std::int64_t>(bytes));
  };
  // It may come on the thread of who cancels, which must not wait.
  request.completion = [this, file = place.path, progress,
                        reply = std::move(reply)](NSErrorPtr error) mutable {
    postAnswer(*_parts.executor, std::move(reply),
               [this, file, progress, error](Reply<NSErrorPtr>& answered) {
                 progress->setCancellationHandler([] {});
                 _parts.store.lookAtPaths({file});
                 if (!error) _parts.didDownload(file);
                 answered(error);
               });
  };
  const auto ticket = _parts.downloader.download(std::move(request));
  progress->setCancellationHandler([ticket] { ticket->cancel(); });
}

void Files::evict(NSURLPtr url, Reply<NSErrorPtr> reply) {
  answer("url", url, std::move(reply), [=, this](Reply<NSErrorPtr>& answered) {
    const Subject subject = subjectAt(url);
    if (subject.error) return answered(subject.error);
    Eviction::Request request;
    request.path = subject.place.path;
    if (subject.item) {
      request.document = subject.item->fileObjectID();
      request.type = subject.item->typeIdentifier();
    }
    NSErrorPtr error = _eviction.evict(request);
    // Also after a failure: the file may have been away for a moment.
    _parts.store.lookAtPaths({request.path});
    if (!error) _parts.didEvict(request.path, request.document);
    const bool isNotUploaded =
        error && error->domain() == SkeinEvictionErrorDomain &&
        error->code() == static_cast<std::int64_t>(EvictionRefusal::NotUploaded);
    const std::string why = isNotUploaded && _parts.whyNotUploaded
                                ? _parts.whyNotUploaded(request.document)
                                : std::string();
    if (!why.empty()) {
      error = NSError::errorWithDomain(
          error->domain(), error->code(),
          {{NSLocalizedDescriptionKey, error->localizedDescription() + ": " + why},
           {NSURLErrorKey, NSURL::fileURLWithPath(request.path)}});
    }
    answered(error);
  });
}

void Files::setPinned(NSURLPtr url, bool pinned, Reply<NSErrorPtr> reply) {
  answer("url", url, std::move(reply), [=, this](Reply<NSErrorPtr>& answered) {
    const Subject subject = subjectAt(url);
    if (subject.error) return answered(subject.error);
    if (!subject.item) return answered(fileError(ENOENT, "can't find", url->path()));
    if (subject.item->properties().kind != VLQueryItem::Kind::Document) {
      return answered(fileErrorWithWords(NSFileWriteNoPermissionError, EINVAL,
                                         "only a document can be pinned", url->path()));
    }
    NSErrorPtr error = _parts.places.records.setPinned(subject.item->fileObjectID(), pinned);
    // It is found again as this document when the index is lost.
    if (!error && pinned && writeHint(subject)) _parts.store.lookAtPaths({subject.place.path});
    answered(std::move(error));
  });
}

}  // namespace skein::vald
