#pragma once

#include <optional>
#include <string>
#include <variant>

#include "linux/vald/cloud/CloudConditions.h"
#include "linux/vald/cloud/CloudContents.h"
#include "linux/vald/cloud/CloudRecords.h"
#include "linux/vald/cloud/UploadStamp.h"
#include "linux/vald/files/StoreRoots.h"

namespace skein::vald {

// What uploading needs. References: all of it outlives whoever is given this.
struct UploadServices {
  StoreRoots& roots;
  FileLayer& files;
  CloudContents& contents;
  CloudRecords& records;
  CloudConditions& conditions;
  CloudClock& clock;
};

// What came of one attempt.
struct UploadDone {
  UploadStamp stamp;  // the file that the cloud has the contents of
};
struct UploadTooEarly {
  CloudClock::Duration wait;  // the file changed a moment ago, or meanwhile
};
using UploadResult = std::variant<UploadDone, UploadTooEarly, NSErrorPtr>;

// Uploads the file once, if it has not changed for `settle` and does not change meanwhile.
// What the cloud has already is not sent again; a file that only looks different (it was
// renamed, or got a tag) is read here and not sent. Blocks; any thread.
UploadResult attemptUpload(const UploadServices& services, VLFileObjectID document,
                           const std::string& path, CloudClock::Duration settle,
                           Cancellation& cancellation);

}  // namespace skein::vald
