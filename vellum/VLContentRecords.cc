#include "vellum/VLContentRecords.h"

namespace skein {

std::string description(const VLContentRecordIDs& recordIDs) {
  std::string text = "{";
  for (const auto& [fileObjectID, recordID] : recordIDs) {
    if (text.size() > 1) text += "; ";
    text += description(fileObjectID) + " = " + description(recordID);
  }
  return text + "}";
}

std::shared_ptr<CKOperationGroup> vl_downloadThumbnailsUserInitiated() {
  return std::make_shared<CKOperationGroup>("DownloadThumbnailsUserInitiated");
}

}  // namespace skein
