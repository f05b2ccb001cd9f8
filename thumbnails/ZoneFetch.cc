#include "thumbnails/ZoneFetch.h"

#include <utility>

#include "platform/dispatch/DispatchSemaphore.h"
#include "support/NSError+VLFPAdditions.h"

namespace skein {
namespace {

NSURLPtr thumbnailURL(const CKRecord* record) {
  const auto* value =
      record != nullptr ? record->objectForKey(kVLRecordKeyThumbnail1024x1024) : nullptr;
  const auto* asset =
      value != nullptr ? std::get_if<std::shared_ptr<const CKAsset>>(value) : nullptr;
  return asset != nullptr && *asset ? (*asset)->fileURL : nullptr;
}

// 0 without one.
std::int64_t sizeOf(const CKRecord* record) {
  const auto* value = record != nullptr ? record->objectForKey(kVLRecordKeySize) : nullptr;
  const auto* size = value != nullptr ? std::get_if<std::int64_t>(value) : nullptr;
  return size != nullptr ? *size : 0;
}

// Has the file downloaded when the system can draw its thumbnail from that. Blocks until the
// download is under way. `recordError` is the record's.
void downloadIfRenderable(ThumbnailFetch& fetch, const NSFileProviderItemIdentifier& identifier,
                          const NSErrorPtr& recordError) {
  Log& log = fetch.environment.log;
  const NSFileProviderItemPtr item = fetch.lookup->itemForIdentifier(identifier, nullptr);
  if (!fetch.environment.systemThumbnails.canMostRecentClientsGenerateThumbnailsForUTI(
          item ? item->typeIdentifier() : std::nullopt)) {
    return;
  }
  const NSURLPtr url = fetch.lookup->URLForItemWithPersistentIdentifier(identifier);
  VL_DEBUG(log, "[DEBUG] downloading file at %@ because quicklook can generate its thumbnail", url);
  if (!url) return;

  const auto started = std::make_shared<DispatchSemaphore>();
  fetch.environment.downloads.VLStartDownloadForItemsWithOptions(
      {url}, VLStartDownloadForThumbnail,
      [&log, url, recordError, started](const NSErrorPtr& startError) {
        // The record's error decides, and there is none where a download is started: a start
        // that fails passes in silence. The browser asks again, so nobody misses the line.
        if (recordError) {
          VL_ERROR(log, "[ERROR] can't start downloading %@: %@", url, startError);
        }
        started->signal();
      });
  started->wait(*fetch.environment.executor);
}

void recordDidArrive(ThumbnailFetch& fetch, const ZoneItems& items, const CKRecord* record,
                     const CKRecordID& recordID, const NSErrorPtr& error) {
  Log& log = fetch.environment.log;
  std::optional<NSData> data = NSData::dataWithContentsOfURL(thumbnailURL(record));
  const std::int64_t size = sizeOf(record);

  // nil for a record that was not asked for, which is told of like any other.
  std::optional<NSFileProviderItemIdentifier> identifier;
  if (const auto found = items.find(recordID); found != items.end()) identifier = found->second;
  VL_DEBUG(log, "[DEBUG] ┳%llx received a thumbnail callback for %@", fetch.section, recordID);
  if (data) {
    VL_DEBUG(log, "[DEBUG] received a thumbnail of %lu bytes for %@", data->length(), identifier);
  } else if (error) {
    VL_ERROR(log, "[ERROR] error when fetching thumbnail for %@: %@", identifier, error);
  } else if (size == 0) {
    VL_DEBUG(log, "[DEBUG] empty record for %@", identifier);
  } else {
    VL_DEBUG(log, "[DEBUG] no thumbnail found for a non-empty file");
    if (size <= fetch.environment.remoteDefaults.minFileSizeForThumbnailTransfer()) {
      downloadIfRenderable(fetch, identifier.value_or(""), error);
    }
  }
  // Also a file that is being downloaded has no data here: whoever asked draws it himself.
  if (fetch.perThumbnailCompletionHandler) {
    fetch.perThumbnailCompletionHandler(identifier.value_or(""), std::move(data), std::nullopt,
                                        vl_fileProviderError(error));
  }
  vlc_closeLogSection(log, fetch.section);
}

void zoneDidEnd(ThumbnailFetch& fetch, const CKRecordZoneID& zoneID, const NSErrorPtr& error) {
  Log& log = fetch.environment.log;
  VL_DEBUG(log, "[DEBUG] ┳%llx completed fetching thumbnail batch for %@", fetch.section, zoneID);
  if (error) {
    // Names what was asked for, the whole of it, and not the zone: that is in the line above.
    VL_ERROR(log, "[ERROR] error while fetching thumbnail batch for %@: %@", fetch.identifiers,
             error);
    MutexLock lock(fetch.errorMutex);
    fetch.error = error;
  }
  fetch.group.leave();
  vlc_closeLogSection(log, fetch.section);
}

}  // namespace

std::shared_ptr<CKFetchRecordsOperation> startZoneFetch(
    const std::shared_ptr<ThumbnailFetch>& fetch, const CKRecordZoneID& zoneID, ZoneItems items,
    CKContainer& container, const std::shared_ptr<CKOperationGroup>& operationGroup) {
  const bool isOwn = zoneID.ownerName == CKCurrentUserDefaultName;
  CKDatabase& database = isOwn ? container.privateCloudDatabase() : container.sharedCloudDatabase();

  auto operation = database.fetchRecordsOperation();
  for (const auto& [recordID, identifier] : items) operation->recordIDs.push_back(recordID);
  operation->desiredKeys = {kVLRecordKeyThumbnail1024x1024, kVLRecordKeySize};
  operation->qualityOfService = NSQualityOfServiceUtility;
  operation->configuration.discretionaryNetworkBehavior =
      CKDiscretionaryNetworkBehaviorNonDiscretionary;
  operation->configuration.automaticallyRetryNetworkFailures = false;
  operation->perRecordCompletionBlock = [fetch, items = std::move(items)](
                                            const std::shared_ptr<const CKRecord>& record,
                                            const CKRecordID& recordID, const NSErrorPtr& error) {
    recordDidArrive(*fetch, items, record.get(), recordID, error);
  };
  operation->fetchRecordsCompletionBlock = [fetch, zoneID](const NSErrorPtr& error) {
    zoneDidEnd(*fetch, zoneID, error);
  };
  fetch->group.enter();
  operation->group = operationGroup;
  VL_DEBUG(fetch->environment.log, "[DEBUG] scheduling operation %@ for zone: %@", operation,
           zoneID);
  database.addOperation(operation);
  return operation;
}

}  // namespace skein
