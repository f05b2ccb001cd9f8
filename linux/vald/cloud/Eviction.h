#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "linux/vald/cloud/CloudPlaces.h"
#include "linux/vald/cloud/EvictionMarker.h"

namespace skein::vald {

// Why a document is not evicted: the codes of SkeinEvictionErrorDomain.
inline constexpr char SkeinEvictionErrorDomain[] = "SkeinEvictionErrorDomain";
enum class EvictionRefusal : std::int64_t {
  NotUploaded = 1,         // or the cloud has lost its contents
  ChangedSinceUpload = 2,  // its contents or their date; or large, and anything about it
  Pinned = 3,
  OpenForWriting = 4,
  AlreadyEvicted = 5,
  NotADocument = 6,     // a folder, a link, a device
  SeveralNames = 7,     // hard links: evicting one would free nothing
  MarkerNameTaken = 8,  // something else stands where the marker would
  CannotBeWatched = 9,  // the file system cannot tell whether somebody writes to the file
};

// Replaces files by their markers (see EvictionMarker.h). Any thread; calls block
// while the cloud's contents are read, which are verified (and repaired from the file) before
// the file is given up; others are kept waiting for some milliseconds only. A file that changed in
// its tags, its mode or its name alone is read once more, and when it is too large for that it has
// to be uploaded again.
//
// The steps, so that a crash leaves the file or its marker and never neither:
//   1. the marker is written beside the file under another name, and made durable;
//   2. it gets its name: both are there;
//   3. the file is set aside: who opens it by name finds nothing any more;
//   4. when nobody has come to write to it meanwhile, it is removed.
// A crash or a failure before the end of 4 puts the file back and removes the marker
// (CloudRecovery); whoever came to write in time keeps the file, too.
class Eviction {
 public:
  explicit Eviction(CloudPlaces places) : _places(std::move(places)) {}

  struct Request {
    VLFileObjectID document = VLFileObjectID::documentWithRawID(0);
    std::string path;                 // absolute, the document's own
    std::optional<std::string> type;  // for the marker
  };
  // Null when the marker stands and the file is gone. Otherwise the file is as it was, with
  // a refusal's reason in SkeinEvictionErrorDomain or the error of a step that failed.
  NSErrorPtr evict(const Request& request);

 private:
  struct Subject;

  NSErrorPtr secureContents(Subject& subject);
  NSErrorPtr check(Subject& subject);
  NSErrorPtr checkFile(Subject& subject);
  NSErrorPtr checkUpload(Subject& subject);
  NSErrorPtr checkContents(Subject& subject, const HashedContents& uploaded);
  NSErrorPtr perform(Subject& subject);
  NSErrorPtr writeMarker(Subject& subject);
  NSErrorPtr setAside(Subject& subject);
  // False when it is still there.
  bool takeMarkerBack(const Subject& subject);

  const CloudPlaces _places;
};

}  // namespace skein::vald
