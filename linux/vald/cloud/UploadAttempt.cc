#include "linux/vald/cloud/UploadAttempt.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <utility>

#include "linux/vald/cloud/CloudErrors.h"
#include "linux/vald/files/FileErrors.h"

namespace skein::vald {
namespace {

// Reading here, without the cloud's conditions.
class CancellableRead final : public StreamObserver {
 public:
  explicit CancellableRead(Cancellation& cancellation) : _cancellation(cancellation) {}
  NSErrorPtr didPass(std::uint64_t) override {
    return _cancellation.isCancelled() ? cancelledError() : nullptr;
  }

 private:
  Cancellation& _cancellation;
};

class Attempt {
 public:
  Attempt(const UploadServices& services, VLFileObjectID document, const std::string& path,
          CloudClock::Duration settle, Cancellation& cancellation)
      : _services(services),
        _document(document),
        _path(path),
        _settle(settle),
        _cancellation(cancellation) {}

  UploadResult run() {
    if (NSErrorPtr error = open()) return error;
    if (const auto early = settling()) return UploadTooEarly{*early};
    auto record = _services.records.record(_document);
    if (!record) return record.error();
    const auto stamp = _services.records.stamp(_document);
    if (!stamp) return stamp.error();
    if (*record && *stamp == _before && _services.contents.hold((*record)->contents)) {
      return UploadDone{_before};
    }
    if (_services.conditions.settings().offline) return offlineError();
    auto added = addContents(*record);
    if (!added) return added.error();
    if (!isUnchanged()) return UploadTooEarly{_settle};

    CloudRecord next;
    next.document = _document;
    next.contents = added->contents;
    next.modified = _before.modified;
    next.created = created();
    next.uploaded = _services.clock.date();
    const auto put = _services.records.put(std::move(next), _before, added->hold);
    return put ? UploadResult(UploadDone{_before}) : UploadResult(put.error());
  }

 private:
  NSErrorPtr open() {
    if (NSErrorPtr error = _services.roots.locate(_path, _place)) return error;
    if (const int code = _place.folder.openFile(_place.name, _file)) return failed(code);
    struct stat status {};
    if (fstat(_file.get(), &status) != 0) return failed(errno);
    if (!S_ISREG(status.st_mode)) return failed(EISDIR);
    // Afterwards a write through a mapping changes the file's times again: before, one to a
    // page that is dirty already would not.
    if (const int code = _services.files.sync(_file.get())) return failed(code);
    if (fstat(_file.get(), &status) != 0) return failed(errno);
    _before = UploadStamp::of(status);
    return nullptr;
  }

  NSErrorPtr failed(int code) const { return fileError(code, "can't upload", _path); }

  // How long to wait still. A change within the clock's grain of the last one would leave no
  // trace: so nothing is uploaded that changed just now, by the file's own times. A time that
  // lies far ahead comes from a clock that was put back, and counts as long ago.
  std::optional<CloudClock::Duration> settling() const {
    const auto age = _services.clock.date() - _before.changed;
    if (age >= _settle || age <= -_settle) return std::nullopt;
    return _settle - age;
  }

  Outcome<CloudContents::Added> addContents(const std::optional<CloudRecord>& record) {
    if (record && record->contents.size == _before.size) {
      CancellableRead observer(_cancellation);
      const auto here = hashContents(_file.get(), _path, observer);
      if (!here) return here.error();
      if (here->hash == record->contents.hash) {
        // What is damaged there is replaced below.
        auto hold = _services.contents.hold(record->contents);
        if (hold && _services.contents.verify(here->hash, observer) == nullptr) {
          return CloudContents::Added{*here, std::move(*hold)};
        }
      }
    }
    if (NSErrorPtr error = checkQuota(record)) return error;
    CloudTransfer transfer(_services.conditions, _services.clock, _cancellation,
                           CloudTransfer::Direction::Up);
    return _services.contents.add(_file.get(), _path, transfer);
  }

  NSErrorPtr checkQuota(const std::optional<CloudRecord>& record) const {
    const auto quota = _services.conditions.settings().quota;
    if (!quota) return nullptr;
    const std::uint64_t used = _services.records.usedBytes() - (record ? record->contents.size : 0);
    const std::uint64_t left = used < *quota ? *quota - used : 0;
    return _before.size > left ? quotaError(_before.size, left) : nullptr;
  }

  // Neither the file that was read nor what has its name now.
  bool isUnchanged() const {
    struct stat read {};
    struct stat named {};
    return fstat(_file.get(), &read) == 0 && UploadStamp::of(read) == _before &&
           _place.folder.status(_place.name, named) == 0 && UploadStamp::of(named) == _before;
  }

  std::optional<NSDate> created() const {
    struct statx status {};
    if (statx(_file.get(), "", AT_EMPTY_PATH, STATX_BTIME, &status) != 0 ||
        (status.stx_mask & STATX_BTIME) == 0) {
      return std::nullopt;
    }
    return UploadStamp::dateOf({status.stx_btime.tv_sec, status.stx_btime.tv_nsec});
  }

  const UploadServices& _services;
  const VLFileObjectID _document;
  const std::string& _path;
  const CloudClock::Duration _settle;
  Cancellation& _cancellation;
  StorePlace _place;
  FileDescriptor _file;
  UploadStamp _before;
};

}  // namespace

UploadResult attemptUpload(const UploadServices& services, VLFileObjectID document,
                           const std::string& path, CloudClock::Duration settle,
                           Cancellation& cancellation) {
  return Attempt(services, document, path, settle, cancellation).run();
}

}  // namespace skein::vald
