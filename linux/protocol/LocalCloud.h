// The local cloud as one may try it out, and what it is doing: the same interface on both
// sides of the socket, as LocalDaemon.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "base/UniqueFunction.h"
#include "platform/foundation/NSError.h"

namespace skein {

// How the cloud behaves: without fault and without end, unless set otherwise. Replaces all
// that was set before.
struct LocalCloudConditions {
  bool offline = false;
  bool corrupt = false;                 // contents arrive with other bytes
  std::optional<std::uint64_t> quota;   // bytes; nil: no end
  std::uint32_t delayMilliseconds = 0;  // before a transfer's first byte
  std::uint64_t bytesPerSecond = 0;     // of each transfer; 0: no limit
  std::uint32_t failures = 0;           // this many transfers fail at their start, as offline

  friend bool operator==(const LocalCloudConditions&, const LocalCloudConditions&) = default;
};

// How long old revisions and removed documents are kept, whichever ends first. What may be the
// only copy of a document is kept for the whole time.
struct LocalCloudKeeping {
  static constexpr std::uint32_t kMostDays = 36500;

  std::uint32_t days = 30;
  std::uint32_t percent = 10;  // of the disk

  friend bool operator==(const LocalCloudKeeping&, const LocalCloudKeeping&) = default;
};

// What a collection removed, and what is kept still.
struct LocalCloudCollection {
  std::uint64_t freedFiles = 0;
  std::uint64_t freedBytes = 0;
  std::uint64_t keptFiles = 0;
  std::uint64_t keptBytes = 0;

  friend bool operator==(const LocalCloudCollection&, const LocalCloudCollection&) = default;
};

// A document that cannot come back as it was, and why.
struct LocalCloudFault {
  std::string path;  // absolute, the document's own
  std::string why;

  friend bool operator==(const LocalCloudFault&, const LocalCloudFault&) = default;
};

// How far a verification came.
struct LocalCloudVerification {
  std::vector<LocalCloudFault> faults;
  std::uint64_t done = 0;   // of the markers that were named, in their order
  std::uint64_t bytes = 0;  // that were read

  friend bool operator==(const LocalCloudVerification&, const LocalCloudVerification&) = default;
};

struct LocalCloudStatus {
  enum class Uploads : std::uint8_t {
    Off,        // nothing is uploaded
    Bounded,    // until `uploadLimit` is reached, since copies take room on this disk
    Unlimited,  // wanted so, or uploads share the documents' blocks
    Unasked,    // nothing yet: nobody has agreed to it
  };
  Uploads uploads = Uploads::Bounded;
  std::uint64_t uploadLimit = 0;  // bytes in the cloud; with Bounded alone
  bool sharesBlocks = false;      // the file system keeps equal blocks once
  std::uint64_t usedBytes = 0;    // in the cloud, of documents as they are
  std::uint64_t waiting = 0;      // documents whose upload is to come, or runs
  std::uint64_t failed = 0;       // documents whose upload failed; tried again when they change
  std::uint64_t leftOut = 0;      // documents that are not uploaded because of the limit
  std::string lastFailure;        // why the latest of them failed; empty when none did
  LocalCloudKeeping keeping;
  std::uint64_t keptLimit = 0;        // bytes that old revisions and removed documents may take
  std::uint64_t keptFiles = 0;        // of them
  std::uint64_t keptBytes = 0;        //
  std::uint64_t onlyCopiesBytes = 0;  // of those, in what may be the only copy of a document
  LocalCloudConditions conditions;    // in force

  friend bool operator==(const LocalCloudStatus&, const LocalCloudStatus&) = default;
};

// Threads, replies and errors as LocalDaemon says.
class LocalCloud {
 public:
  virtual ~LocalCloud() = default;

  // For tests and trials, as LocalDaemon::injectFault: only in a vald that was started with
  // fault injection allowed; else NSFeatureUnsupportedError.
  virtual void setConditions(LocalCloudConditions conditions, Reply<NSErrorPtr> reply) = 0;
  virtual void cloudStatus(Reply<LocalCloudStatus, NSErrorPtr> reply) = 0;
  virtual void setKeeping(LocalCloudKeeping keeping, Reply<NSErrorPtr> reply) = 0;
  // Looks whether evicted documents can come back: `markers` are the absolute paths of files
  // that have a marker's name. Reads their contents and compares the hash, or, when it is to be
  // quick, only looks whether contents of their size are there. Ends after some seconds, when at
  // least one was looked at: then whoever asked asks for the rest. What is no marker, or went
  // meanwhile, is no fault.
  virtual void verify(std::vector<std::string> markers, bool quick,
                      Reply<LocalCloudVerification, NSErrorPtr> reply) = 0;
  // Removes what is not kept any longer. Takes as long as it takes: it looks at all of the
  // drive. An error: nothing more was removed.
  virtual void collect(Reply<LocalCloudCollection, NSErrorPtr> reply) = 0;
};

}  // namespace skein
