#include "linux/vald/cloud/CloudPlaces.h"

#include "linux/vald/files/FileErrors.h"

namespace skein::vald {

Outcome<CloudRecords::Work> CloudPlaces::beginWork(const std::string& path) const {
  if (const int code = files.step(FileStep::JournalBegin, path)) {
    return fileError(code, "can't note the work on", path);
  }
  return records.beginWork(path);
}

NSErrorPtr CloudPlaces::endWork(const CloudRecords::Work& work) const {
  if (const int code = files.step(FileStep::JournalEnd, work.path)) {
    return fileError(code, "can't note the end of the work on", work.path);
  }
  return records.endWork(work);
}

}  // namespace skein::vald
