#include "linux/vald/cloud/CloudRecovery.h"

#include <cerrno>

#include "linux/vald/cloud/EvictionMarker.h"
#include "linux/vald/cloud/UploadStamp.h"
#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileNames.h"

namespace skein::vald {
namespace {

class WithoutInterruption final : public StreamObserver {
 public:
  NSErrorPtr didPass(std::uint64_t) override { return nullptr; }
};

class PlaceRecovery {
 public:
  PlaceRecovery(const CloudPlaces& places, const StorePlace& place)
      : _places(places), _place(place), _names(place.name) {}

  NSErrorPtr run() {
    if (NSErrorPtr error = remove(_names.part)) return error;
    if (NSErrorPtr error = remove(_names.fresh)) return error;
    auto marker = openMarker(_place.folder, _names.marker, _place.path());
    if (marker) _marker = marker->marker;
    // Without a marker there may still be a file to put back.
    if (_place.folder.exists(_names.aside)) {
      if (NSErrorPtr error = putBack()) return error;
    } else if (_marker && _place.folder.exists(_place.name)) {
      const auto same = isWhatTheMarkerStandsFor(_place.name);
      if (!same) return same.error();
      if (*same) {
        if (NSErrorPtr error = remove(_names.marker)) return error;
      }
    }
    const int code = _changed ? _places.files.sync(_place.folder.get()) : 0;
    return code == 0 ? nullptr : failed(code);
  }

 private:
  NSErrorPtr failed(int code) const { return fileError(code, "can't recover", _place.path()); }

  NSErrorPtr remove(const std::string& name) {
    if (!_place.folder.exists(name)) return nullptr;
    _changed = true;
    const int code = _places.files.unlink(_place.folder.get(), name);
    return code == 0 || code == ENOENT ? nullptr : failed(code);
  }

  int rename(const std::string& from, const std::string& to) {
    _changed = true;
    const int folder = _place.folder.get();
    return _places.files.renameWithoutReplacing(folder, from, folder, to);
  }

  Outcome<bool> isWhatTheMarkerStandsFor(const std::string& name) const {
    if (!_marker) return false;
    struct stat status {};
    if (const int code = _place.folder.status(name, status)) return failed(code);
    const auto stamp = UploadStamp::of(status);
    if (!S_ISREG(status.st_mode) || stamp.size != _marker->contents.size ||
        stamp.modified != _marker->modified) {
      return false;
    }
    FileDescriptor file;
    if (const int code = _place.folder.openFile(name, file)) return failed(code);
    WithoutInterruption observer;
    const auto contents = hashContents(file.get(), _place.path(), observer);
    if (!contents) return contents.error();
    return contents->hash == _marker->contents.hash;
  }

  NSErrorPtr putBack() {
    const auto same = isWhatTheMarkerStandsFor(_names.aside);
    if (!same) return same.error();
    if (_place.folder.exists(_place.name)) {
      // Somebody made another file of this name. The marker is enough for the same contents.
      return *same ? remove(_names.aside) : putBackUnderAnotherName();
    }
    // Each step leaves something that the next recovery understands: the same contents may
    // stand beside their marker, other ones may not.
    if (_marker && !*same) {
      if (NSErrorPtr error = remove(_names.marker)) return error;
    }
    if (const int code = rename(_names.aside, _place.name)) return failed(code);
    return _marker && *same ? remove(_names.marker) : nullptr;
  }

  NSErrorPtr putBackUnderAnotherName() {
    if (_marker) {
      if (NSErrorPtr error = remove(_names.marker)) return error;
    }
    constexpr unsigned kMostTries = 1000;
    int code = EEXIST;
    for (unsigned number = 2; code == EEXIST && number < kMostTries; ++number) {
      code = rename(_names.aside, numberedName(_place.name, number, ' '));
    }
    return code == 0 ? nullptr : failed(code);
  }

  const CloudPlaces& _places;
  const StorePlace& _place;
  const MarkerNames _names;
  std::optional<EvictionMarker> _marker;
  bool _changed = false;
};

}  // namespace

NSErrorPtr recoverPlace(const CloudPlaces& places, const StorePlace& place) {
  return PlaceRecovery(places, place).run();
}

NSErrorPtr recoverUnfinishedWork(const CloudPlaces& places) {
  const auto works = places.records.unfinishedWork();
  if (!works) return works.error();
  NSErrorPtr first;
  for (const CloudRecords::Work& work : *works) {
    StorePlace place;
    NSErrorPtr error = places.roots.locate(work.path, place);
    if (error != nullptr && error->code() == NSFileNoSuchFileError) {
      error = nullptr;
    } else if (error == nullptr) {
      const auto lock = places.coordinate(work.path);
      error = lock ? recoverPlace(places, place) : lock.error();
    }
    if (error == nullptr) error = places.endWork(work);
    if (first == nullptr) first = error;
  }
  return first;
}

}  // namespace skein::vald
