#include "linux/vald/cloud/Eviction.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <utility>

#include "linux/vald/cloud/CloudErrors.h"
#include "linux/vald/cloud/CloudRecovery.h"
#include "linux/vald/cloud/FileAttributes.h"
#include "linux/vald/files/FileErrors.h"
#include "linux/vald/files/FileLease.h"

namespace skein::vald {
namespace {

NSErrorPtr refusal(EvictionRefusal reason, const std::string& path, const std::string& why,
                   NSErrorPtr underlying = nullptr) {
  NSErrorUserInfo info{
      {NSLocalizedDescriptionKey, "\"" + printable(path) + "\" was not evicted: " + why},
      {NSURLErrorKey, NSURL::fileURLWithPath(path)}};
  if (underlying != nullptr) info[NSUnderlyingErrorKey] = std::move(underlying);
  return NSError::errorWithDomain(SkeinEvictionErrorDomain, static_cast<std::int64_t>(reason),
                                  std::move(info));
}

// Read in a second or two, from a slow disk too: whoever evicts waits for that long.
constexpr std::uint64_t kMostCompared = std::uint64_t{128} << 20;

NSErrorPtr changedSinceUpload(const std::string& path) {
  return refusal(EvictionRefusal::ChangedSinceUpload, path,
                 "it changed since it was uploaded; wait until it is uploaded again");
}

NSErrorPtr openForWriting(const std::string& path) {
  return refusal(EvictionRefusal::OpenForWriting, path,
                 "a program has it open for writing; close it there and try again");
}

NSErrorPtr nameTaken(const std::string& path, const std::string& name) {
  return refusal(EvictionRefusal::MarkerNameTaken, path,
                 "\"" + printable(name) + "\" is in the way; rename it");
}

}  // namespace

struct Eviction::Subject {
  explicit Subject(const Request& asked) : request(asked) {}

  const Request& request;
  StorePlace place;
  std::optional<MarkerNames> names;
  FileDescriptor file;
  FileLease lease;  // after the file, so that it is given up first
  UploadStamp uploadedAs;
  CloudRecord record;
  std::optional<CloudContents::Hold> contents;
  ino_t marker = 0;       // of the marker that was written; 0: none
  bool isDurable = true;  // that the file is gone
};

NSErrorPtr Eviction::evict(const Request& request) {
  Subject subject(request);
  if (NSErrorPtr error = _places.roots.locate(request.path, subject.place)) return error;
  if (subject.place.isRoot()) {
    return refusal(EvictionRefusal::NotADocument, request.path, "it is a folder");
  }
  subject.names.emplace(subject.place.name);
  // Before anybody has to wait: this reads as much as the document is large.
  if (NSErrorPtr error = secureContents(subject)) return error;
  const auto lock = _places.coordinate(request.path);
  if (!lock) return lock.error();
  if (NSErrorPtr error = check(subject)) return error;

  const auto work = _places.beginWork(subject.place, subject.record.contents.hash);
  if (!work) return work.error();
  NSErrorPtr error = perform(subject);
  if (error != nullptr) {
    subject.lease.giveUp();
    // What is not undone now stays noted and is undone at the next start.
    if (recoverPlace(_places, subject.place, work->contents) != nullptr ||
        !takeMarkerBack(subject)) {
      return error;
    }
  } else {
    // A stamp that is left fits no file any more: nothing depends on this.
    _places.records.setStamp(request.document, std::nullopt);
  }
  if (subject.isDurable) _places.endWork(*work);
  return error;
}

// What the cloud has becomes the only copy: it is read and held before the file goes. What is
// lost or damaged there is taken in again from the file, which is still here.
NSErrorPtr Eviction::secureContents(Subject& subject) {
  const std::string& path = subject.request.path;
  const auto record = _places.records.record(subject.request.document);
  if (!record) return record.error();
  if (!*record) return nullptr;  // refused below, with the reason
  const HashedContents& wanted = (*record)->contents;
  LocalRead observer;
  auto held = _places.contents.hold(wanted);
  if (!held || _places.contents.verify(wanted.hash, observer) != nullptr) {
    FileDescriptor file;
    if (const int code = subject.place.folder.openFile(subject.place.name, file)) {
      return code == ENOENT ? nullptr : fileError(code, "can't evict", path);
    }
    struct stat status {};
    if (fstat(file.get(), &status) != 0) return fileError(errno, "can't evict", path);
    if (!S_ISREG(status.st_mode)) return nullptr;
    auto added = _places.contents.add(file.get(), path, observer);
    if (!added) return added.error();
    if (added->contents.hash != wanted.hash) {
      return refusal(EvictionRefusal::NotUploaded, path,
                     "the cloud has lost its contents, and the file is no longer the same; "
                     "change it or upload it again");
    }
    held = std::move(added->hold);
  }
  subject.record = **record;
  subject.contents = std::move(*held);
  return nullptr;
}

NSErrorPtr Eviction::check(Subject& subject) {
  if (subject.place.folder.exists(subject.names->aside) ||
      subject.place.folder.exists(subject.names->fresh)) {
    if (NSErrorPtr error = recoverNoted(_places, subject.place)) return error;
  }
  // From here on these names are this system's: recovery may remove what it finds there.
  for (const std::string* name :
       {&subject.names->fresh, &subject.names->aside, &subject.names->part}) {
    if (subject.place.folder.exists(*name)) return nameTaken(subject.request.path, *name);
  }
  // A marker beside the file is what a crash left, or somebody else's file.
  if (subject.place.folder.exists(subject.names->marker) &&
      subject.place.folder.exists(subject.place.name)) {
    if (NSErrorPtr error = recoverPlace(_places, subject.place)) return error;
    if (NSErrorPtr error = removeStaleMarker(_places, subject.place, subject.request.document)) {
      return error;
    }
    if (subject.place.folder.exists(subject.names->marker)) {
      return nameTaken(subject.request.path, subject.names->marker);
    }
  }
  if (NSErrorPtr error = checkFile(subject)) return error;
  return checkUpload(subject);
}

NSErrorPtr Eviction::checkFile(Subject& subject) {
  const std::string& path = subject.request.path;
  struct stat status {};
  if (const int code = subject.place.folder.status(subject.place.name, status)) {
    if (code == ENOENT && subject.place.folder.exists(subject.names->marker)) {
      return refusal(EvictionRefusal::AlreadyEvicted, path, "its contents are in the cloud alone");
    }
    return fileError(code, "can't evict", path);
  }
  if (!S_ISREG(status.st_mode)) {
    return refusal(EvictionRefusal::NotADocument, path, "it is no plain file");
  }
  if (status.st_uid != geteuid()) {
    return fileError(EACCES, "can't evict a file of another user,", path);
  }
  if ((status.st_mode & (S_ISUID | S_ISGID | S_ISVTX)) != 0) {
    return refusal(EvictionRefusal::NotADocument, path,
                   "it runs with special rights, which no marker gives back");
  }
  if (status.st_nlink != 1) {
    return refusal(EvictionRefusal::SeveralNames, path,
                   "it has " + std::to_string(status.st_nlink) +
                       " names (hard links), and the others would keep its contents here");
  }
  if (const int code = subject.place.folder.openFile(subject.place.name, subject.file)) {
    return fileError(code, "can't evict", path);
  }
  const int code = subject.lease.take(subject.file.get());
  if (code == EAGAIN) return openForWriting(path);
  if (code == EACCES) return fileError(code, "can't evict a file of another user,", path);
  if (code != 0) {
    return refusal(EvictionRefusal::CannotBeWatched, path,
                   "its file system cannot tell whether a program is writing to it",
                   fileError(code, "can't take a lease on", path));
  }
  return nullptr;
}

NSErrorPtr Eviction::checkUpload(Subject& subject) {
  const std::string& path = subject.request.path;
  const auto pinned = _places.records.isPinned(subject.request.document);
  if (!pinned) return pinned.error();
  if (*pinned) {
    return refusal(EvictionRefusal::Pinned, path, "it is pinned to this machine; unpin it first");
  }
  auto record = _places.records.record(subject.request.document);
  if (!record) return record.error();
  const auto stamp = _places.records.stamp(subject.request.document);
  if (!stamp) return stamp.error();
  if (!*record || !*stamp) {
    return refusal(EvictionRefusal::NotUploaded, path, "it is not uploaded yet");
  }
  // Uploaded again meanwhile: those contents were not looked at.
  if (!subject.contents || (*record)->contents.hash != subject.record.contents.hash) {
    return changedSinceUpload(path);
  }
  struct stat status {};
  if (fstat(subject.file.get(), &status) != 0) return fileError(errno, "can't evict", path);
  const UploadStamp now = UploadStamp::of(status);
  if (now != **stamp) {
    if (!now.sameButForChanged(**stamp)) return changedSinceUpload(path);
    if (NSErrorPtr error = checkContents(subject, (*record)->contents)) return error;
  }
  subject.record = std::move(**record);
  subject.uploadedAs = now;
  return nullptr;
}

// A tag leaves the date alone, and so does a program that wrote and put the date back. The
// lease keeps writers out from before this reads to the end, and whatever else changes about
// the file meanwhile shows in its stamp.
NSErrorPtr Eviction::checkContents(Subject& subject, const HashedContents& uploaded) {
  if (uploaded.size > kMostCompared) return changedSinceUpload(subject.request.path);
  LocalRead observer;
  const auto here = hashContents(subject.file.get(), subject.request.path, observer);
  if (!here) return here.error();
  return here->hash == uploaded.hash ? nullptr : changedSinceUpload(subject.request.path);
}

NSErrorPtr Eviction::perform(Subject& subject) {
  if (NSErrorPtr error = writeMarker(subject)) return error;
  if (NSErrorPtr error = setAside(subject)) return error;
  const int folder = subject.place.folder.get();
  const int code = _places.files.unlink(folder, subject.names->aside);
  // Before the note ends: a file that a power cut brings back is noted still. It is gone even
  // when this fails; then the note stays.
  if (code == 0) subject.isDurable = _places.files.sync(folder) == 0;
  return code == 0 ? nullptr : fileError(code, "can't evict", subject.request.path);
}

// The document was renamed while its marker was written: it is not evicted, and the marker would
// show it a second time. A file that has no name any more has only the marker left.
bool Eviction::takeMarkerBack(const Subject& subject) {
  struct stat file {};
  struct stat marker {};
  const DirectoryHandle& folder = subject.place.folder;
  if (subject.marker == 0 || folder.status(subject.names->marker, marker) != 0 ||
      marker.st_ino != subject.marker || fstat(subject.file.get(), &file) != 0 ||
      file.st_nlink == 0) {
    return true;
  }
  return _places.files.unlink(folder.get(), subject.names->marker) == 0 &&
         _places.files.sync(folder.get()) == 0;
}

NSErrorPtr Eviction::writeMarker(Subject& subject) {
  const std::string& path = subject.request.path;
  struct stat status {};
  if (fstat(subject.file.get(), &status) != 0) return fileError(errno, "can't evict", path);
  EvictionMarker marker;
  marker.document = subject.request.document;
  marker.contents = subject.record.contents;
  marker.modified = subject.uploadedAs.modified;
  marker.created = subject.record.created;
  marker.mode = status.st_mode & 0777;
  marker.type = subject.request.type;
  if (subject.names->shortened) marker.name = subject.place.name;

  const int folder = subject.place.folder.get();
  FileDescriptor fresh;
  int code = _places.files.createFile(folder, subject.names->fresh, 0600, fresh);
  if (code == 0) {
    const auto seal = [this](std::string_view text) { return _places.contents.seal(text); };
    code = _places.files.write(fresh.get(), marker.asText(seal));
  }
  if (code != 0) return fileError(code, "can't write the marker of", path);
  // The owner can always read it, even where the document's mode would not let him.
  const mode_t mode = marker.mode | S_IRUSR;
  if (NSErrorPtr error =
          copyFileAttributes(_places.files, subject.file.get(), fresh.get(), mode, path)) {
    return error;
  }
  code = _places.files.sync(fresh.get());
  if (code == 0 && fstat(fresh.get(), &status) != 0) code = errno;
  if (code == 0) {
    subject.marker = status.st_ino;
    code = _places.files.renameWithoutReplacing(folder, subject.names->fresh, folder,
                                                subject.names->marker);
  }
  // The marker must be on the disk before the file goes.
  if (code == 0) code = _places.files.sync(folder);
  return code == 0 ? nullptr : fileError(code, "can't write the marker of", path);
}

NSErrorPtr Eviction::setAside(Subject& subject) {
  const std::string& path = subject.request.path;
  const int folder = subject.place.folder.get();
  const auto stampNow = [&] {
    struct stat status {};
    return fstat(subject.file.get(), &status) == 0 ? UploadStamp::of(status) : UploadStamp();
  };
  // A tag or a mode that was set while the marker was written is not on the marker.
  if (stampNow() != subject.uploadedAs) return changedSinceUpload(path);
  const int code = _places.files.renameWithoutReplacing(folder, subject.place.name, folder,
                                                        subject.names->aside);
  if (code != 0) return fileError(code, "can't evict", path);
  // Is it the file that was looked at, and not one that took its name meanwhile?
  struct stat aside {};
  if (subject.place.folder.status(subject.names->aside, aside) != 0 ||
      !UploadStamp::of(aside).sameButForChanged(subject.uploadedAs)) {
    return changedSinceUpload(path);
  }
  // Gives whoever had found the file by its name just before the time to show.
  if (const int synced = _places.files.sync(folder)) return fileError(synced, "can't evict", path);
  if (!subject.lease.isUndisturbed()) return openForWriting(path);
  return stampNow().sameButForChanged(subject.uploadedAs) ? nullptr : changedSinceUpload(path);
}

}  // namespace skein::vald
