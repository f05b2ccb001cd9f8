#include "linux/vald/Cloud.h"

#include <fcntl.h>
#include <linux/fs.h>
#include <sys/ioctl.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <algorithm>
#include <utility>

#include "linux/vald/cloud/CloudRecovery.h"
#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"

namespace skein::vald {

Cloud::Cloud(Options options, FileOperations& operations, Log& log)
    : _options(std::move(options)),
      _operations(operations),
      _log(log),
      _uploadThreads(std::make_shared<ClosableExecutor>(_options.uploads.limit, "vald-upload")),
      _downloadThreads(std::make_shared<ClosableExecutor>(_options.downloads, "vald-download")),
      _answers(std::make_shared<ClosableExecutor>(1, "vald-cloud")) {}

std::unique_ptr<Cloud> Cloud::open(Options options, FileOperations& operations, Log& log,
                                   NSErrorOut error) {
  std::unique_ptr<Cloud> cloud(new Cloud(std::move(options), operations, log));
  auto contents = CloudContents::open(cloud->_options.folder, operations.layer());
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
  return {_operations.roots(), _operations.layer(), *_contents, *_records,
          [&operations = _operations](const std::string& path) -> Outcome<std::shared_ptr<void>> {
            std::shared_ptr<void> held;
            if (NSErrorPtr error = operations.coordinate(path, held)) return error;
            return held;
          }};
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
    const CloudConditions::Settings settings = _conditions.settings();
    status.conditions = {
        settings.offline,        settings.corrupt,
        settings.quota,          static_cast<std::uint32_t>(settings.delay.count()),
        settings.bytesPerSecond, settings.failures};
    reply(std::move(status), nullptr);
  });
}

}  // namespace skein::vald
