#include "linux/vald/cloud/DownloadTransfer.h"

#include <sys/stat.h>

#include <cerrno>
#include <utility>

#include "linux/vald/cloud/CloudErrors.h"
#include "linux/vald/cloud/CloudRecovery.h"
#include "linux/vald/cloud/FileAttributes.h"
#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"

namespace skein::vald {

// The transfer's bytes, with the progress told once they have arrived.
class DownloadTransfer::Stream final : public CloudTransfer {
 public:
  explicit Stream(DownloadTransfer& owner)
      : CloudTransfer(owner._conditions, owner._clock, owner._cancellation, Direction::Down),
        _owner(owner) {}

  NSErrorPtr didPass(std::uint64_t bytes) override {
    if (NSErrorPtr error = CloudTransfer::didPass(bytes)) return error;
    if (_owner._progress) _owner._progress(bytes, _owner._marker->marker.contents.size);
    return nullptr;
  }

 private:
  DownloadTransfer& _owner;
};

DownloadTransfer::DownloadTransfer(CloudPlaces places, CloudConditions& conditions,
                                   CloudClock& clock, VLFileObjectID document, std::string path,
                                   bool isCopy, Progress progress)
    : _places(std::move(places)),
      _conditions(conditions),
      _clock(clock),
      _document(document),
      _path(std::move(path)),
      _isCopy(isCopy),
      _progress(std::move(progress)) {}

NSErrorPtr DownloadTransfer::run() {
  if (_cancellation.isCancelled()) return cancelledError();
  if (NSErrorPtr error = begin()) return error;
  if (!_marker) return nullptr;
  const auto work = _places.beginWork(_place, _marker->marker.contents.hash);
  if (!work) return work.error();
  FileDescriptor part;
  NSErrorPtr error;
  if (const int code = createPart(part)) {
    error = code == ECANCELED ? cancelledError() : fileError(code, "can't download", _path);
  } else {
    error = transfer(part);
    if (error != nullptr) dropPart();
  }
  // What is left there stays noted, for the next start.
  if (!leftSomething()) _places.endWork(*work);
  return error;
}

NSErrorPtr DownloadTransfer::begin() {
  if (NSErrorPtr error = _places.roots.locate(_path, _place)) return error;
  _names.emplace(_place.name);
  auto marker = openMarker(_place.folder, _names->marker, _path);
  if (!marker) {
    const bool missing = marker.error()->code() == NSFileNoSuchFileError;
    return missing && _place.folder.exists(_place.name) ? nullptr : marker.error();
  }
  if (marker->marker.document != _document) {
    return fileErrorWithWords(NSFileNoSuchFileError, 0,
                              "\"" + printable(_path) + "\" is another document by now", _path);
  }
  if (NSErrorPtr error = _places.refusalOf(marker->marker, _path)) return error;
  if (NSErrorPtr error = mendWhatWasLeft()) return error;
  for (const std::string* name : {&_names->part, &_names->fresh, &_names->aside}) {
    if (_place.folder.exists(*name)) {
      const std::string taken = joinPath(_place.folderPath(), *name);
      return fileErrorWithWords(
          NSFileWriteFileExistsError, EEXIST,
          "\"" + printable(taken) + "\" is in the way of a download; rename it and try again",
          taken);
    }
  }
  // From here on these names are this system's: recovery may remove what it finds there.
  if (_place.folder.exists(_place.name)) return resolveBoth();
  _marker.emplace(std::move(*marker));
  return nullptr;
}

NSErrorPtr DownloadTransfer::mendWhatWasLeft() {
  if (!_place.folder.exists(_names->part) && !_place.folder.exists(_names->fresh) &&
      !_place.folder.exists(_names->aside)) {
    return nullptr;
  }
  const auto lock = _places.coordinate(_path);
  return lock ? recoverNoted(_places, _place) : lock.error();
}

NSErrorPtr DownloadTransfer::resolveBoth() {
  // Another transfer is just finishing, or one could not remove its marker, or somebody
  // made a file of this name.
  const auto lock = _places.coordinate(_path);
  if (!lock) return lock.error();
  if (_place.folder.exists(_names->marker)) {
    if (NSErrorPtr error = recoverPlace(_places, _place)) return error;
  }
  return _place.folder.exists(_names->marker) ? fileError(EEXIST, "can't download", _path)
                                              : nullptr;
}

NSErrorPtr DownloadTransfer::transfer(const FileDescriptor& part) {
  if (NSErrorPtr error = fetch(part)) return error;
  return finish(part);
}

NSErrorPtr DownloadTransfer::fetch(const FileDescriptor& part) {
  const HashedContents& wanted = _marker->marker.contents;
  // Nothing is held when they are not there; that shows at once.
  const auto hold = _places.contents.hold(wanted);
  const auto source = _places.contents.read(wanted.hash);
  if (!source) return source.error();
  struct stat status {};
  if (fstat(source->get(), &status) != 0) return fileError(errno, "can't download", _path);
  if (static_cast<std::uint64_t>(status.st_size) != wanted.size) {
    return corruptError("\"" + printable(_path) + "\"");
  }
  // As many blocks as the contents have: what is sparse stays so.
  constexpr std::uint64_t kBlock = 512;
  if (static_cast<std::uint64_t>(status.st_blocks) * kBlock >= wanted.size) {
    if (const int code = reserveSpace(_places.files, part.get(), wanted.size)) {
      return fileError(code, "can't download", _path);
    }
  }
  Stream stream(*this);
  // Where the blocks can be shared they only have to be read; a cloud that spoils contents
  // has to write them.
  const bool cloned = !_conditions.settings().corrupt &&
                      _places.files.cloneContents(source->get(), part.get()) == 0;
  const auto got = cloned ? hashContents(part.get(), _path, stream)
                          : copyContents(_places.files, source->get(), part.get(), _path, stream);
  if (!got) return got.error();
  const bool right = got->hash == wanted.hash && got->size == wanted.size;
  return right ? nullptr : corruptError("\"" + printable(_path) + "\"");
}

NSErrorPtr DownloadTransfer::finish(const FileDescriptor& part) {
  // The contents are on the disk before the lock is taken: that may take long.
  if (const int code = _places.files.sync(part.get())) {
    return fileError(code, "can't download", _path);
  }
  const auto lock = _places.coordinate(_path);
  if (!lock) return lock.error();
  if (NSErrorPtr error = dressPart(part)) return error;
  if (const int code = namePart()) {
    return code == ECANCELED ? cancelledError() : fileError(code, "can't download", _path);
  }
  // The file is there: nothing after this makes the download fail.
  removeMarker(part);
  return nullptr;
}

NSErrorPtr DownloadTransfer::dressPart(const FileDescriptor& part) {
  // The marker may have been moved, or got other tags, while the contents came.
  struct stat before {};
  struct stat now {};
  if (fstat(_marker->file.get(), &before) != 0 || _place.folder.status(_names->marker, now) != 0 ||
      before.st_ino != now.st_ino || before.st_dev != now.st_dev) {
    return fileErrorWithWords(
        NSFileNoSuchFileError, ENOENT,
        "\"" + printable(_path) + "\" was moved or removed while it was downloaded; try again",
        _path);
  }
  const EvictionMarker& marker = _marker->marker;
  if (NSErrorPtr error =
          copyFileAttributes(_places.files, _marker->file.get(), part.get(), marker.mode, _path)) {
    return error;
  }
  // The marker's own time may be one that no date can tell.
  const bool isSame = UploadStamp::dateOf(now.st_mtim) == marker.modified;
  const timespec times[2] = {now.st_atim,
                             isSame ? now.st_mtim : UploadStamp::timeOf(marker.modified)};
  int code = _places.files.setTimes(part.get(), "", times);
  if (code == 0) code = _places.files.sync(part.get());
  return code == 0 ? nullptr : fileError(code, "can't download", _path);
}

void DownloadTransfer::removeMarker(const FileDescriptor& part) {
  // Should one of these fail, file and marker stand side by side for the same contents: the
  // next start, eviction or download finds that and finishes.
  const int folder = _place.folder.get();
  int code = _places.files.sync(folder);
  if (code == 0) code = _places.files.unlink(folder, _names->marker);
  // Before the note ends: a marker that a power cut brings back is noted still.
  if (code == 0) code = _places.files.sync(folder);
  if (code != 0) {
    MutexLock lock(_partMutex);
    _leftSomething = true;
    return;
  }
  struct stat status {};
  if (_isCopy || fstat(part.get(), &status) != 0) return;
  // A document whose marker another drive made is none of this cloud's yet.
  const auto record = _places.records.record(_document);
  if (!record || !*record) return;
  // Without a stamp the document is looked at again, and found to be uploaded.
  _places.records.setStamp(_document, UploadStamp::of(status));
}

bool DownloadTransfer::leftSomething() {
  MutexLock lock(_partMutex);
  return _leftSomething;
}

int DownloadTransfer::createPart(FileDescriptor& part) {
  MutexLock lock(_partMutex);
  if (_part == Part::Abandoned) return ECANCELED;
  const int code = _places.files.createFile(_place.folder.get(), _names->part, 0600, part);
  if (code == 0) _part = Part::There;
  return code;
}

int DownloadTransfer::namePart() {
  MutexLock lock(_partMutex);
  if (_part == Part::Abandoned) return ECANCELED;
  const int folder = _place.folder.get();
  const int code = _places.files.renameWithoutReplacing(folder, _names->part, folder, _place.name);
  if (code == 0) _part = Part::Named;
  return code;
}

void DownloadTransfer::dropPart() {
  MutexLock lock(_partMutex);
  if (_part == Part::There) removePart();
}

void DownloadTransfer::removePart() {
  _part = Part::Abandoned;
  if (_places.files.unlink(_place.folder.get(), _names->part) != 0) _leftSomething = true;
}

bool DownloadTransfer::abandon() {
  {
    MutexLock lock(_partMutex);
    if (_part == Part::Named) return false;
    if (_part == Part::There) removePart();
    _part = Part::Abandoned;
  }
  _cancellation.cancel();
  return true;
}

}  // namespace skein::vald
