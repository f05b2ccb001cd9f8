#include "thumbnails/ThumbnailBatch.h"

#include <utility>

#include "platform/fileprovider/NSFileProviderError.h"
#include "support/NSError+VLFPAdditions.h"
#include "thumbnails/ZoneFetch.h"
#include "vellum/VLDaemonSyncProxy.h"

namespace skein {
namespace {

using ThumbnailWithTypeHandler = NSFileProviderExtension::ThumbnailWithTypeHandler;
using ErrorCompletion = NSFileProviderExtension::ErrorCompletion;
using Operations = std::vector<std::shared_ptr<CKFetchRecordsOperation>>;

// Answers what needs no cloud, and gives back the documents that do.
std::vector<VLFileObjectID> answerLocally(
    const ThumbnailRequest& request, const std::vector<NSFileProviderItemIdentifier>& identifiers,
    NSSize requestedSize, const ThumbnailWithTypeHandler& handler) {
  Environment& environment = request.environment;
  std::vector<VLFileObjectID> documents;
  std::optional<VLContainersByID> knownContainers;
  for (const NSFileProviderItemIdentifier& identifier : identifiers) {
    const NSURLPtr url = request.lookup->URLForItemWithPersistentIdentifier(identifier);
    // Documents and Desktop are containers here, although their items are not made from the
    // table of containers: their folders have icons of their own.
    const auto containerID =
        url ? environment.documents.vl_containerIDIfIsDocumentsContainerURL(url) : std::nullopt;
    if (containerID) {
      const NSSize size = request.containers._properSizeForContainerThumbnail(requestedSize);
      if (!knownContainers) knownContainers = environment.containers.allContainersByContainerID();
      request.containers._fetchThumbnailForContainerID(*containerID, identifier, size,
                                                       *knownContainers, handler);
      continue;
    }
    const auto fileObjectID = VLFileObjectID::fileObjectIDWithString(identifier);
    if (!fileObjectID) {
      if (handler) {
        handler(identifier, std::nullopt, std::nullopt,
                fileProviderErrorForNonExistentItemWithIdentifier(identifier));
      }
    } else if (fileObjectID->isFolderOrAliasID()) {
      if (handler) handler(identifier, std::nullopt, std::nullopt, nullptr);
    } else {
      documents.push_back(*fileObjectID);
    }
  }
  return documents;
}

std::map<CKRecordZoneID, ZoneItems> byZone(const VLContentRecordIDs& recordIDs) {
  std::map<CKRecordZoneID, ZoneItems> zones;
  for (const auto& [fileObjectID, recordID] : recordIDs) {
    zones[recordID.zoneID].emplace(recordID, fileObjectID.asString());
  }
  return zones;
}

Operations startZones(const std::shared_ptr<ThumbnailFetch>& fetch,
                      const VLContentRecordIDs& recordIDs) {
  const auto operationGroup = vl_downloadThumbnailsUserInitiated();
  const auto container =
      fetch->environment.cloud.containerWithIdentifier(VLUbiquitousCloudKitContainerIdentifier);
  Operations operations;
  for (auto& [zoneID, items] : byZone(recordIDs)) {
    operations.push_back(startZoneFetch(fetch, zoneID, items, *container, operationGroup));
  }
  return operations;
}

// On the extension's queue, once every zone has ended.
void batchDidEnd(ThumbnailFetch& fetch, ErrorCompletion& completionHandler) {
  VL_DEBUG(fetch.environment.log, "[DEBUG] ┳%llx completed fetching thumbnail batch",
           fetch.section);
  NSErrorPtr error;
  {
    MutexLock lock(fetch.errorMutex);
    error = fetch.error;
  }
  completionHandler(vl_fileProviderError(error));
  vlc_closeLogSection(fetch.environment.log, fetch.section);
}

}  // namespace

std::shared_ptr<NSProgress> fetchThumbnailsForItemIdentifiersWithType(
    const ThumbnailRequest& request, const std::vector<NSFileProviderItemIdentifier>& identifiers,
    NSSize requestedSize, ThumbnailWithTypeHandler perThumbnailCompletionHandlerWithType,
    ErrorCompletion completionHandler) {
  Environment& environment = request.environment;
  Log& log = environment.log;
  auto progress = NSProgress::progressWithTotalUnitCount(0);
  const VLLogSection section(log, environment.logSections);
  VL_DEBUG(log, "[DEBUG] ┏%llx starting fetch thumbnail for %@", section.number(), identifiers);

  const auto documents =
      answerLocally(request, identifiers, requestedSize, perThumbnailCompletionHandlerWithType);
  if (documents.empty()) {
    VL_DEBUG(log, "[DEBUG] no thumbnail left to fetch");
    completionHandler(nullptr);
    return progress;
  }

  VLDaemonSyncProxy<VLContentRecordIDs> proxy(environment.daemonConnection, environment.executor);
  proxy->resolveFileObjectIDsToContentRecordIDs(
      documents,
      [answer = proxy.answer()](std::optional<VLContentRecordIDs> recordIDs, NSErrorPtr error) {
        answer->setObjResult(std::move(recordIDs), std::move(error));
      });
  const auto recordIDs = proxy.result();
  if (!recordIDs) {
    VL_ERROR(log, "[ERROR] can't get the record ids for %@: %@", documents, proxy.error());
    completionHandler(vl_fileProviderError(proxy.error()));
    return progress;
  }

  const std::uint64_t fetchSection = environment.logSections.create(VLLogSectionLevel::Debug);
  VL_DEBUG(log, "[DEBUG] ┣%llx fetching the thumbnails for: %@", fetchSection, *recordIDs);
  const auto fetch = std::make_shared<ThumbnailFetch>(
      request.lookup, environment, identifiers, std::move(perThumbnailCompletionHandlerWithType),
      fetchSection);
  const Operations operations = startZones(fetch, *recordIDs);
  fetch->group.notify(request.queue,
                      [fetch, completionHandler = std::move(completionHandler)]() mutable {
                        batchDidEnd(*fetch, completionHandler);
                      });
  progress->setCancellable(true);
  progress->setCancellationHandler([operations] {
    for (const auto& operation : operations) operation->cancel();
  });
  return progress;
}

std::shared_ptr<NSProgress> fetchThumbnailsForItemIdentifiers(
    const ThumbnailRequest& request, const std::vector<NSFileProviderItemIdentifier>& identifiers,
    NSSize requestedSize, NSFileProviderExtension::ThumbnailHandler perThumbnailCompletionHandler,
    ErrorCompletion completionHandler) {
  // The third value goes through as it comes: a type where the handler's caller looks for an
  // error. Browsers that ask this way know an app's icon by it.
  auto adapter = [handler = std::move(perThumbnailCompletionHandler)](
                     const NSFileProviderItemIdentifier& identifier, std::optional<NSData> data,
                     std::optional<std::string> type, const NSErrorPtr& /*error*/) {
    if (!handler) return;
    std::variant<std::monostate, NSErrorPtr, std::string> third;
    if (type) third = std::move(*type);
    handler(identifier, std::move(data), std::move(third));
  };
  return fetchThumbnailsForItemIdentifiersWithType(
      request, identifiers, requestedSize, std::move(adapter), std::move(completionHandler));
}

}  // namespace skein
