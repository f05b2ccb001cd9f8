#include "linux/vald/Cloud.h"

#include <fcntl.h>
#include <linux/fs.h>
#include <sys/ioctl.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <algorithm>
#include <utility>

#include "linux/vald/cloud/CloudErrors.h"
#include "linux/vald/cloud/CloudRecovery.h"
#include "linux/vald/cloud/MarkerCheck.h"
#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"
#include "vellum/VLErrors.h"

namespace skein::vald {
namespace {

// For how long markers are verified before it is said how far this came.
constexpr std::chrono::seconds kVerifyStep{1};

// Counts what is read.
class CountedRead final : public StreamObserver {
 public:
  explicit CountedRead(const Cancellation& cancellation) : _cancellation(cancellation) {}
  NSErrorPtr didPass(std::uint64_t bytes) override {
    if (bytes == 0) _before = _total;
    _total = _before + bytes;
    return _cancellation.isCancelled() ? cancelledError() : nullptr;
  }
  std::uint64_t total() const { return _total; }

 private:
  const Cancellation& _cancellation;
  std::uint64_t _before = 0;  // of earlier streams
  std::uint64_t _total = 0;
};

}  // namespace

Cloud::Cloud(Options options, FileOperations& operations, Log& log)
    : _options(std::move(options)),
      _operations(operations),
      _log(log),
      _uploadThreads(std::make_shared<ClosableExecutor>(_options.uploads.limit, "vald-upload")),
      _downloadThreads(std::make_shared<ClosableExecutor>(_options.downloads, "vald-download")),
      _answers(std::make_shared<ClosableExecutor>(1, "vald-cloud")),
      _checks(std::make_shared<ClosableExecutor>(1, "vald-check")) {}

std::unique_ptr<Cloud> Cloud::open(Options options, FileOperations& operations, Log& log,
                                   NSErrorOut error) {
  std::unique_ptr<Cloud> cloud(new Cloud(std::move(options), operations, log));
  auto contents =
      CloudContents::open(cloud->_options.folder, operations.layer(), cloud->_options.drives);
  if (!contents) {
    error.store(contents.error());
    return nullptr;
  }
  cloud->_contents = std::move(*contents);
  auto records = CloudRecords::open(joinPath(cloud->_options.folder, "records.db"));
  if (!records) {
    error.store(records.error());
    return nullptr;
  }
  cloud->_records = std::move(*records);
  if (NSErrorPtr failed = CloudCollector(cloud->places(), cloud->_clock).begin()) {
    error.store(failed);
    return nullptr;
  }
  // What stays as it is stays noted; the drive is no worse for it.
  if (const NSErrorPtr left = recoverUnfinishedWork(cloud->places())) {
    VL_ERROR(log, "[ERROR] not all that was cut off could be mended: %@",
             left->localizedDescription());
  }
  cloud->_downloader =
      std::make_unique<Downloader>(cloud->places(), cloud->_conditions, cloud->_clock,
                                   cloud->_downloadThreads, cloud->_options.downloads);
  cloud->_sharesBlocks = cloud->probeSharing();
  if (cloud->_sharesBlocks &&
      cloud->_options.policy.uploads == LocalCloudStatus::Uploads::Bounded) {
    cloud->_options.policy = {LocalCloudStatus::Uploads::Unlimited, 0};
  }
  return cloud;
}

Cloud::~Cloud() { stop(); }

CloudPlaces Cloud::places() {
  return {_operations.roots(),
          _operations.layer(),
          *_contents,
          *_records,
          [&operations = _operations](const std::string& path) -> Outcome<std::shared_ptr<void>> {
            std::shared_ptr<void> held;
            if (NSErrorPtr error = operations.coordinate(path, held)) return error;
            return held;
          },
          _options.trashes};
}

bool Cloud::probeSharing() {
  struct stat drive {};
  struct stat cloud {};
  if (stat(_options.drive.c_str(), &drive) != 0 || stat(_options.folder.c_str(), &cloud) != 0 ||
      drive.st_dev != cloud.st_dev) {
    return false;
  }
  const auto unnamed = [&] {
    return FileDescriptor(::open(_options.folder.c_str(), O_TMPFILE | O_RDWR | O_CLOEXEC, 0600));
  };
  const FileDescriptor from = unnamed();
  const FileDescriptor to = unnamed();
  return from && to && ::ftruncate(from.get(), 4096) == 0 &&
         ::ioctl(to.get(), FICLONE, from.get()) == 0;
}

void Cloud::startThumbnails(FolderStore& store) {
  if (_options.desktopThumbnails.empty()) return;
  auto started =
      ThumbnailService::start({*_contents, *_records, _operations.layer(), _clock, _log,
                               joinPath(_options.folder, "thumbnails"), _options.desktopThumbnails,
                               [&store](VLFileObjectID document) -> std::optional<std::string> {
                                 NSErrorPtr error;
                                 const VLQueryItemPtr item = store.itemWithID(document, &error);
                                 return item ? item->typeIdentifier() : std::nullopt;
                               },
                               ThumbnailRenderer::Options()});
  if (!started) {
    VL_ERROR(_log, "[ERROR] no thumbnails are made: %@", started.error()->localizedDescription());
    MutexLock lock(_mutex);
    _thumbnailProblem = started.error()->localizedDescription();
    return;
  }
  MutexLock lock(_mutex);
  _thumbnails = std::move(*started);
}

void Cloud::start(FolderStore& store) {
  startThumbnails(store);
  auto feed = std::make_shared<UploadFeed>(UploadFeed::Parts{
      store, *_records, _options.policy, _options.mayUpload, _log, [this](VLFileObjectID document) {
        if (const auto told = thumbnails()) told->documentWasUploaded(document);
        if (const auto told = rounds()) told->contentsDidChange();
      }});
  _uploader = std::make_unique<Uploader>(UploadServices{_operations.roots(), _operations.layer(),
                                                        *_contents, *_records, _conditions, _clock},
                                         *feed, _uploadThreads, _options.uploads);
  feed->start(*_uploader);
  auto rounds = std::make_shared<CollectionRounds>(CollectionRounds::Parts{
      places(), _clock, _log, [this] { return collectionRule(); },
      [&store] {
        LocalDaemonStatus status;
        store.status(status);
        return status.scan == LocalDaemonStatus::Scan::Idle;
      },
      [this] {
        const auto asked = thumbnails();
        if (!asked) return;
        const auto collected = asked->collectGarbage();
        if (collected) return;
        VL_ERROR(_log, "[ERROR] old pictures stay: %@", collected.error()->localizedDescription());
      }});
  MutexLock lock(_mutex);
  _feed = std::move(feed);
  _rounds = std::move(rounds);
}

void Cloud::stop() {
  std::shared_ptr<UploadFeed> feed;
  std::shared_ptr<ThumbnailService> thumbnails;
  std::shared_ptr<CollectionRounds> rounds;
  {
    MutexLock lock(_mutex);
    feed.swap(_feed);
    thumbnails.swap(_thumbnails);
    rounds.swap(_rounds);
  }
  if (rounds) rounds->stop();
  if (feed) feed->stop();
  _checksCancellation.cancel();
  _checks->close();
  _answers->close();
  // While the executors run: both wait for what they have begun.
  _uploader.reset();
  _downloader.reset();
  _uploadThreads->close();
  _downloadThreads->close();
}

std::shared_ptr<UploadFeed> Cloud::feed() {
  MutexLock lock(_mutex);
  return _feed;
}

std::shared_ptr<ThumbnailService> Cloud::thumbnails() {
  MutexLock lock(_mutex);
  return _thumbnails;
}

std::shared_ptr<CollectionRounds> Cloud::rounds() {
  MutexLock lock(_mutex);
  return _rounds;
}

Outcome<CollectionRounds::Rule> Cloud::collectionRule() {
  const auto keeping = _records->keeping();
  if (!keeping) return keeping.error();
  const auto kept = _records->kept();
  if (!kept) return kept.error();
  struct statvfs disk {};
  if (statvfs(_options.folder.c_str(), &disk) != 0) {
    return fileError(errno, "can't measure the disk of", _options.folder);
  }
  CollectionRounds::Rule rule;
  rule.time = std::chrono::hours(24) * keeping->days;
  rule.bytes = disk.f_blocks / 100 * keeping->percent * disk.f_frsize;
  // Where copies take room the bound is of all that is there; what is kept makes room first.
  if (_options.policy.uploads == LocalCloudStatus::Uploads::Bounded) {
    const std::uint64_t used = _records->usedBytes();
    const std::uint64_t limit = _options.policy.limit;
    rule.bytes = std::min(rule.bytes, limit - std::min(used, limit));
  }
  rule.taken = kept->bytes - kept->givenUpBytes;
  return rule;
}

void Cloud::documentWasEvicted(const std::string& path, VLFileObjectID document) {
  const auto told = thumbnails();
  if (!told) return;
  const auto record = _records->record(document);
  if (record && *record) told->documentWasEvicted(path, **record);
}

void Cloud::documentWasDownloaded(const std::string& path) {
  if (const auto told = thumbnails()) told->documentCameBack(path);
}

void Cloud::storeDidChange(const std::vector<StoreChange>& changes) {
  if (const auto told = feed()) told->storeDidChange(changes);
}

void Cloud::storeDidOverflow() {
  if (const auto told = feed()) told->storeDidOverflow();
}

std::string Cloud::thumbnailProblem() {
  {
    MutexLock lock(_mutex);
    if (!_thumbnailProblem.empty()) return _thumbnailProblem;
  }
  const auto service = thumbnails();
  return service ? service->startProblem() : std::string();
}

std::string Cloud::whyNotUploaded(VLFileObjectID document) {
  const auto asked = feed();
  return asked ? asked->whyNot(document) : std::string();
}

void Cloud::setConditions(LocalCloudConditions conditions, Reply<NSErrorPtr> reply) {
  _answers->post([this, conditions, reply = std::move(reply)]() mutable {
    if (!_options.allowsConditions) {
      return reply(NSError::errorWithDomain(
          NSCocoaErrorDomain, NSFeatureUnsupportedError,
          {{NSLocalizedDescriptionKey,
            std::string("vald was started without SKEIN_ALLOW_FAULTS=1; stop the drive "
                        "(skein stop) and start it with that variable set.")}}));
    }
    _conditions.change([&](CloudConditions::Settings& settings) {
      settings = {};
      settings.offline = conditions.offline;
      settings.corrupt = conditions.corrupt;
      settings.quota = conditions.quota;
      settings.delay = std::chrono::milliseconds(conditions.delayMilliseconds);
      settings.bytesPerSecond = conditions.bytesPerSecond;
      settings.failures = conditions.failures;
    });
    if (const auto told = feed(); told && !conditions.offline) _uploader->retry();
    reply(nullptr);
  });
}

void Cloud::cloudStatus(Reply<LocalCloudStatus, NSErrorPtr> reply) {
  _answers->post([this, reply = std::move(reply)]() mutable {
    LocalCloudStatus status;
    status.uploads = _options.policy.uploads;
    if (status.uploads != LocalCloudStatus::Uploads::Off && _options.mayUpload &&
        !_options.mayUpload()) {
      status.uploads = LocalCloudStatus::Uploads::Unasked;
    }
    status.uploadLimit = _options.policy.limit;
    status.sharesBlocks = _sharesBlocks;
    status.usedBytes = _records->usedBytes();
    if (const auto asked = feed()) {
      status.waiting = _uploader->pending();
      status.failed = _uploader->failures().size();
      status.leftOut = asked->leftOut();
      status.lastFailure = asked->lastFailure();
    }
    const auto keeping = _records->keeping();
    const auto kept = _records->kept();
    const auto rule = collectionRule();
    if (!keeping || !kept || !rule) {
      return reply({}, !keeping ? keeping.error() : !kept ? kept.error() : rule.error());
    }
    status.keeping = {keeping->days, keeping->percent};
    status.keptLimit = rule->bytes;
    status.keptFiles = kept->files;
    status.keptBytes = kept->bytes;
    status.onlyCopiesBytes = kept->givenUpBytes;
    const CloudConditions::Settings settings = _conditions.settings();
    status.conditions = {
        settings.offline,        settings.corrupt,
        settings.quota,          static_cast<std::uint32_t>(settings.delay.count()),
        settings.bytesPerSecond, settings.failures};
    reply(std::move(status), nullptr);
  });
}

void Cloud::setKeeping(LocalCloudKeeping keeping, Reply<NSErrorPtr> reply) {
  _answers->post([this, keeping, reply = std::move(reply)]() mutable {
    if (keeping.days > LocalCloudKeeping::kMostDays) {
      return reply(vlc_errorInvalidParameter("days", std::to_string(keeping.days)));
    }
    if (keeping.percent > 100) {
      return reply(vlc_errorInvalidParameter("percent", std::to_string(keeping.percent)));
    }
    reply(_records->setKeeping({keeping.days, keeping.percent}));
  });
}

void Cloud::collect(Reply<LocalCloudCollection, NSErrorPtr> reply) {
  Reply<CloudCollector::Result, NSErrorPtr> collected =
      [reply = std::move(reply)](CloudCollector::Result result, NSErrorPtr error) mutable {
        reply({result.freed.files, result.freed.bytes, result.kept.files, result.kept.bytes},
              std::move(error));
      };
  if (const auto asked = rounds(); asked && asked->collect(collected)) return;
  _answers->post([collected = std::move(collected)]() mutable { collected({}, cancelledError()); });
}

void Cloud::verify(std::vector<std::string> markers, bool quick,
                   Reply<LocalCloudVerification, NSErrorPtr> reply) {
  _checks->post([this, markers = std::move(markers), quick, reply = std::move(reply)]() mutable {
    LocalCloudVerification verification;
    CountedRead read(_checksCancellation);
    const auto end = std::chrono::steady_clock::now() + kVerifyStep;
    for (const std::string& marker : markers) {
      if (auto lost = checkMarker(places(), marker, quick, read)) {
        verification.faults.push_back({std::move(lost->path), std::move(lost->why)});
      }
      ++verification.done;
      if (std::chrono::steady_clock::now() >= end) break;
    }
    verification.bytes = read.total();
    if (_checksCancellation.isCancelled()) return reply({}, cancelledError());
    reply(std::move(verification), nullptr);
  });
}

}  // namespace skein::vald
