#include "linux/vald/cloud/CloudRecovery.h"

#include <sys/stat.h>

#include <cerrno>

#include "linux/vald/cloud/CloudErrors.h"
#include "linux/vald/cloud/EvictionMarker.h"
#include "linux/vald/cloud/MarkerWalk.h"
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
  PlaceRecovery(const CloudPlaces& places, const StorePlace& place,
                const std::optional<ContentHash>& noted)
      : _places(places), _place(place), _noted(noted), _names(place.name) {}

  NSErrorPtr run() {
    if (NSErrorPtr error = remove(_names.part)) return error;
    if (NSErrorPtr error = remove(_names.fresh)) return error;
    findMarker();
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
    // Also what a recovery before this one changed: the note of it ends next.
    return sync();
  }

  // The file set aside that no note tells of.
  NSErrorPtr bringOut() {
    findMarker();
    const auto same = isWhatTheMarkerStandsFor(_names.aside);
    if (!same) return same.error();
    NSErrorPtr error;
    if (*same && !_place.folder.exists(_place.name)) {
      error = putBack();
    } else if (const int code = renameAside()) {
      error = failed(code);
    }
    return error != nullptr ? error : sync();
  }

 private:
  void findMarker() {
    auto marker = openMarker(_place.folder, _names.marker, _place.path());
    if (marker && _places.refusalOf(marker->marker, _place.path()) == nullptr) {
      _marker = marker->marker;
    }
  }

  NSErrorPtr sync() const {
    const int code = _places.files.sync(_place.folder.get());
    return code == 0 ? nullptr : failed(code);
  }

  NSErrorPtr failed(int code) const { return fileError(code, "can't recover", _place.path()); }

  NSErrorPtr remove(const std::string& name) {
    if (!_place.folder.exists(name)) return nullptr;
    const int code = _places.files.unlink(_place.folder.get(), name);
    return code == 0 || code == ENOENT ? nullptr : failed(code);
  }

  int rename(const std::string& from, const std::string& to) {
    const int folder = _place.folder.get();
    return _places.files.renameWithoutReplacing(folder, from, folder, to);
  }

  Outcome<bool> isWhatTheMarkerStandsFor(const std::string& name) const {
    return _marker ? hasContents(name, _marker->contents.hash, _marker->contents.size)
                   : Outcome<bool>(false);
  }

  // Of its contents, and never of its date: who writes can put that back.
  Outcome<bool> hasContents(const std::string& name, const ContentHash& hash,
                            std::optional<std::uint64_t> size) const {
    struct stat status {};
    if (const int code = _place.folder.status(name, status)) return failed(code);
    if (!S_ISREG(status.st_mode)) return false;
    if (size && static_cast<std::uint64_t>(status.st_size) != *size) return false;
    FileDescriptor file;
    if (const int code = _place.folder.openFile(name, file)) return failed(code);
    WithoutInterruption observer;
    const auto contents = hashContents(file.get(), _place.path(), observer);
    if (!contents) return contents.error();
    return contents->hash == hash;
  }

  NSErrorPtr putBack() {
    const auto same = isWhatTheMarkerStandsFor(_names.aside);
    if (!same) return same.error();
    // One that is there and not believed says nothing: then the file stays.
    if (!_place.folder.exists(_names.marker) && _noted) {
      // The marker was on the disk before the file was set aside: it was moved, or removed,
      // by whoever found the document evicted. Only somebody's late words are put back.
      const auto isKept = isSafeInTheCloud();
      if (!isKept) return isKept.error();
      if (*isKept) return remove(_names.aside);
    }
    // Somebody made another file of this name.
    if (_place.folder.exists(_place.name)) return putBackUnderAnotherName();
    // Each step leaves something that the next recovery understands: the same contents may
    // stand beside their marker, other ones may not.
    if (_marker && !*same) {
      if (NSErrorPtr error = remove(_names.marker)) return error;
    }
    if (const int code = rename(_names.aside, _place.name)) return failed(code);
    return _marker && *same ? remove(_names.marker) : nullptr;
  }

  Outcome<bool> isSafeInTheCloud() const {
    const auto same = hasContents(_names.aside, *_noted, std::nullopt);
    if (!same || !*same) return same;
    WithoutInterruption observer;
    return _places.contents.verify(*_noted, observer) == nullptr;
  }

  // To the next name that is free. 0 or an errno.
  int renameAside() {
    constexpr unsigned kMostTries = 1000;
    int code = EEXIST;
    for (unsigned number = 2; code == EEXIST && number < kMostTries; ++number) {
      code = rename(_names.aside, numberedName(_place.name, number, ' '));
    }
    return code;
  }

  NSErrorPtr putBackUnderAnotherName() {
    if (const int code = renameAside()) return failed(code);
    return _marker ? remove(_names.marker) : nullptr;
  }

  const CloudPlaces& _places;
  const StorePlace& _place;
  const std::optional<ContentHash> _noted;
  const MarkerNames _names;
  std::optional<EvictionMarker> _marker;
};

// Whether the folder is the one that the note was made of.
bool isFolderOf(const StorePlace& place, const CloudRecords::Work& work) {
  struct stat status {};
  return work.folder == 0 || (place.folder.status(status) == 0 && status.st_ino == work.folder);
}

// The place of noted work: its path, or, when the folder was moved or renamed since, the
// folder itself wherever it is. Nil when it is in no root any more.
Outcome<std::optional<StorePlace>> placeOf(const CloudPlaces& places,
                                           const CloudRecords::Work& work) {
  StorePlace place;
  NSErrorPtr error = places.roots.locate(work.path, place);
  if (error == nullptr && isFolderOf(place, work)) return std::optional(std::move(place));
  if (error != nullptr && error->code() != NSFileNoSuchFileError) return error;
  std::optional<StorePlace> found;
  NSErrorPtr stopped = walkEntries(
      places.roots, Unreadable::IsSkipped, Cancellation(),
      [&](const std::string& folderPath, const DirectoryHandle&, const std::string& name,
          const struct stat& status) -> NSErrorPtr {
        if (!S_ISDIR(status.st_mode) || status.st_ino != work.folder) return nullptr;
        StorePlace moved;
        const std::string path = joinPath(joinPath(folderPath, name), nameOfPath(work.path));
        if (places.roots.locate(path, moved) == nullptr && isFolderOf(moved, work)) {
          found = std::move(moved);
        }
        return found ? cancelledError() : nullptr;  // that is all
      });
  if (found) return found;
  if (stopped != nullptr) return stopped;
  return error == nullptr ? std::optional(std::move(place)) : std::nullopt;
}

NSErrorPtr recoverWork(const CloudPlaces& places, const CloudRecords::Work& work) {
  const auto place = placeOf(places, work);
  if (!place) return place.error();
  if (*place) {
    const auto lock = places.coordinate((*place)->path());
    if (!lock) return lock.error();
    if (NSErrorPtr error = recoverPlace(places, **place, work.contents)) return error;
  }
  return places.endWork(work);
}

}  // namespace

NSErrorPtr recoverPlace(const CloudPlaces& places, const StorePlace& place,
                        const std::optional<ContentHash>& noted) {
  return PlaceRecovery(places, place, noted).run();
}

NSErrorPtr recoverNoted(const CloudPlaces& places, const StorePlace& place) {
  const auto works = places.records.unfinishedWork();
  if (!works) return works.error();
  for (const CloudRecords::Work& work : *works) {
    // The folder may have been moved since the note was made.
    if (nameOfPath(work.path) != place.name || !isFolderOf(place, work)) continue;
    if (NSErrorPtr error = recoverPlace(places, place, work.contents)) return error;
    if (NSErrorPtr error = places.endWork(work)) return error;
  }
  if (!place.folder.exists(MarkerNames(place.name).aside)) return nullptr;
  return PlaceRecovery(places, place, std::nullopt).bringOut();
}

NSErrorPtr removeStaleMarker(const CloudPlaces& places, const StorePlace& place,
                             VLFileObjectID document) {
  const MarkerNames names(place.name);
  if (!place.folder.exists(place.name) || !place.folder.exists(names.marker)) return nullptr;
  const auto stamp = places.records.stamp(document);
  if (!stamp) return stamp.error();
  struct stat status {};
  if (const int code = place.folder.status(place.name, status)) {
    return fileError(code, "can't look at", place.path());
  }
  // The file counts as the document, and the cloud has what it holds.
  if (!*stamp || !UploadStamp::of(status).sameButForChanged(**stamp)) return nullptr;
  const auto marker = openMarker(place.folder, names.marker, place.path());
  if (!marker || marker->marker.document != document) return nullptr;
  int code = places.files.unlink(place.folder.get(), names.marker);
  if (code == 0) code = places.files.sync(place.folder.get());
  return code == 0 ? nullptr : fileError(code, "can't remove the old marker of", place.path());
}

NSErrorPtr nameOlderVersionApart(const CloudPlaces& places, const std::string& path,
                                 VLFileObjectID document) {
  StorePlace place;
  if (places.roots.locate(path, place) != nullptr || place.isRoot()) return nullptr;
  const MarkerNames names(place.name);
  if (!place.folder.exists(names.marker)) return nullptr;
  const auto lock = places.coordinate(path);
  if (!lock) return lock.error();
  const auto marker = openMarker(place.folder, names.marker, path);
  if (!marker || marker->marker.document != document || !place.folder.exists(place.name)) {
    return nullptr;
  }
  constexpr unsigned kMostTries = 1000;
  int code = EEXIST;
  for (unsigned number = 2; code == EEXIST && number < kMostTries; ++number) {
    const std::string name = numberedName(place.name, number, ' ');
    if (place.folder.exists(name)) continue;
    code = places.files.renameWithoutReplacing(place.folder.get(), names.marker, place.folder.get(),
                                               MarkerNames(name).marker);
  }
  if (code == 0) code = places.files.sync(place.folder.get());
  return code == 0 ? nullptr : fileError(code, "can't rename the old marker of", path);
}

NSErrorPtr recoverUnfinishedWork(const CloudPlaces& places) {
  const auto works = places.records.unfinishedWork();
  if (!works) return works.error();
  NSErrorPtr first;
  for (const CloudRecords::Work& work : *works) {
    NSErrorPtr error = recoverWork(places, work);
    if (first == nullptr) first = error;
  }
  return first;
}

}  // namespace skein::vald
