// The cloud's records of documents' contents.
#pragma once

#include <map>
#include <memory>
#include <string>

#include "platform/cloudkit/CloudKit.h"
#include "vellum/VLFileObjectID.h"

namespace skein {

// The cloud container that has them.
inline constexpr char VLUbiquitousCloudKitContainerIdentifier[] = "com.tessel.skein.documents";

// The keys of a contents record: an asset with a picture of at most 1024 x 1024, and the
// file's size in bytes.
inline constexpr char kVLRecordKeyThumbnail1024x1024[] = "thumbnail1024x1024";
inline constexpr char kVLRecordKeySize[] = "size";

// The record of each of some documents.
using VLContentRecordIDs = std::map<VLFileObjectID, CKRecordID>;
std::string description(const VLContentRecordIDs& recordIDs);

// vl_downloadThumbnailsUserInitiated: the group of the thumbnails that somebody looks at.
// A new one for each batch.
std::shared_ptr<CKOperationGroup> vl_downloadThumbnailsUserInitiated();

}  // namespace skein
