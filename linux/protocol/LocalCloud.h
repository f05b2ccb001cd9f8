// The local cloud as one may try it out, and what it is doing: the same interface on both
// sides of the socket, as LocalDaemon.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

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

struct LocalCloudStatus {
  enum class Uploads : std::uint8_t {
    Off,        // nothing is uploaded
    Bounded,    // until `uploadLimit` is reached, since copies take room on this disk
    Unlimited,  // wanted so, or uploads share the documents' blocks
    Unasked,    // nothing yet: nobody has agreed to it
  };
  Uploads uploads = Uploads::Bounded;
  std::uint64_t uploadLimit = 0;    // bytes in the cloud; with Bounded alone
  bool sharesBlocks = false;        // the file system keeps equal blocks once
  std::uint64_t usedBytes = 0;      // in the cloud
  std::uint64_t waiting = 0;        // documents whose upload is to come, or runs
  std::uint64_t failed = 0;         // documents whose upload failed; tried again when they change
  std::uint64_t leftOut = 0;        // documents that are not uploaded because of the limit
  std::string lastFailure;          // why the latest of them failed; empty when none did
  LocalCloudConditions conditions;  // in force

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
};

}  // namespace skein
