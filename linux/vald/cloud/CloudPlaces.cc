#include "linux/vald/cloud/CloudPlaces.h"

#include <sys/stat.h>

#include "linux/vald/cloud/CloudErrors.h"
#include "linux/vald/files/FileErrors.h"

namespace skein::vald {

Outcome<CloudRecords::Work> CloudPlaces::beginWork(const StorePlace& place,
                                                   const ContentHash& contents) const {
  const std::string path = place.path();
  struct stat folder {};
  if (const int code = place.folder.status(folder)) {
    return fileError(code, "can't look at the folder of", path);
  }
  if (const int code = files.step(FileStep::JournalBegin, path)) {
    return fileError(code, "can't note the work on", path);
  }
  return records.beginWork({0, path, folder.st_ino, contents});
}

NSErrorPtr CloudPlaces::endWork(const CloudRecords::Work& work) const {
  if (const int code = files.step(FileStep::JournalEnd, work.path)) {
    return fileError(code, "can't note the end of the work on", work.path);
  }
  return records.endWork(work);
}

NSErrorPtr CloudPlaces::refusalOf(const EvictionMarker& marker, const std::string& path) const {
  if (marker.seal && contents.isSeal(*marker.seal, marker.sealed)) return nullptr;
  const auto record = records.record(marker.document);
  if (!record) return record.error();
  // Also one whose seal was made with a key that is lost: refused, the only way to its contents
  // would go with the key.
  if (*record && (*record)->contents.hash == marker.contents.hash) return nullptr;
  return fileErrorWithWords(NSFileReadCorruptFileError, 0,
                            "the marker of \"" + printable(path) +
                                "\" was not made by this drive's cloud, or was changed since; "
                                "keep it: the drive that made it can bring the document back",
                            path);
}

}  // namespace skein::vald
