#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>

#include "base/Mutex.h"
#include "linux/vald/cloud/Cancellation.h"
#include "linux/vald/cloud/CloudConditions.h"
#include "linux/vald/cloud/CloudPlaces.h"
#include "linux/vald/cloud/EvictionMarker.h"

namespace skein::vald {

// Brings one document's contents back. Runs once, on a thread of the caller's, which it
// blocks; abandon() may come from any other at any moment.
//
// The steps, so that a crash leaves the marker or the file and never neither:
//   1. the contents are streamed to a part beside the marker, and hashed on their way;
//   2. the part gets the marker's attributes, the document's mode and times, and is made
//      durable;
//   3. it gets the document's name, if nobody took that meanwhile: both are there;
//   4. the marker is removed.
// A crash or a failure before 3 leaves the marker alone, one after it the file
// (CloudRecovery).
class DownloadTransfer {
 public:
  // `isCopy`: `document` is what the marker names, and another item is at `path`: a marker
  // was copied. The file is then not what the document was uploaded as.
  //
  // Bytes that have arrived, of how many; on the transfer's thread, without a lock.
  using Progress = std::function<void(std::uint64_t bytes, std::uint64_t total)>;

  DownloadTransfer(CloudPlaces places, CloudConditions& conditions, CloudClock& clock,
                   VLFileObjectID document, std::string path, bool isCopy, Progress progress);

  // Null when the file is there, also when it was before. Otherwise its place is as it was.
  NSErrorPtr run() SKEIN_EXCLUDES(_partMutex);

  // True: the file will not appear, its part is gone, and run() ends soon with
  // NSUserCancelledError. False: the file has its name already, or the transfer has ended.
  bool abandon() SKEIN_EXCLUDES(_partMutex);

 private:
  class Stream;

  NSErrorPtr begin();
  // What earlier work left at the place and could not mend then.
  NSErrorPtr mendWhatWasLeft();
  // The file and its marker are both there.
  NSErrorPtr resolveBoth();
  NSErrorPtr transfer(const FileDescriptor& part);
  NSErrorPtr fetch(const FileDescriptor& part);
  NSErrorPtr finish(const FileDescriptor& part);
  NSErrorPtr dressPart(const FileDescriptor& part);
  void removeMarker(const FileDescriptor& part) SKEIN_EXCLUDES(_partMutex);

  // 0 or an errno; ECANCELED when it was abandoned before.
  int createPart(FileDescriptor& part) SKEIN_EXCLUDES(_partMutex);
  int namePart() SKEIN_EXCLUDES(_partMutex);
  void dropPart() SKEIN_EXCLUDES(_partMutex);
  void removePart() SKEIN_REQUIRES(_partMutex);
  bool leftSomething() SKEIN_EXCLUDES(_partMutex);

  const CloudPlaces _places;
  CloudConditions& _conditions;
  CloudClock& _clock;
  const VLFileObjectID _document;
  const std::string _path;
  const bool _isCopy;
  const Progress _progress;

  // Set by run() before there is a part.
  StorePlace _place;
  std::optional<MarkerNames> _names;
  std::optional<OpenMarker> _marker;
  Cancellation _cancellation;

  // Held over the single calls that make, name and remove the part, so that whoever
  // abandons the transfer knows whether there is one.
  enum class Part : std::uint8_t { None, There, Named, Abandoned };
  Mutex _partMutex;
  Part _part SKEIN_GUARDED_BY(_partMutex) = Part::None;
  // A part or a marker that could not be removed.
  bool _leftSomething SKEIN_GUARDED_BY(_partMutex) = false;
};

}  // namespace skein::vald
